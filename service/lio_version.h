/*
 * The target-core generation in use and what it decides: the module sets to insert and
 * remove, and the host directories of extent-pool and trash backstores.
 *
 * Chosen once, from /etc.defaults/orloinfo.conf, at the first use in the process; a
 * version switch replaces it.  Readers get an immutable snapshot, so they need no lock.
 */
#ifndef ORLO_SERVICE_LIO_VERSION_H
#define ORLO_SERVICE_LIO_VERSION_H

#include <memory>
#include <string>
#include <vector>

namespace orlo {

struct LioState {
    unsigned int version = 0;              // 0, 2 or 4
    std::vector<std::string> tcmModules;   // target core, in insertion order
    std::vector<std::string> iscsiModules; // iSCSI fabric
    std::vector<std::string> vhostModules;
    std::vector<std::string> loopbackModules;
    std::string hbaEpio;   // host directory of extent-pool backstores
    std::string hbaTrash;  // host directory of backstores being deleted
};

// The current state, chosen at first use.
std::shared_ptr<const LioState> Lio();
// Builds the state of a version; rdma adds the iSER module to version 4's iSCSI set.
std::shared_ptr<const LioState> LioBuild(unsigned int version, bool rdma);
// Makes a version current (the version switch), reading support_rdma from the defaults.
void LioSetVersion(unsigned int version);
// Forgets the choice: the next use reads the defaults file again (tests, new roots).
void LioReset();

const std::vector<std::string> &getTcmModuleSet();
const std::vector<std::string> &getiSCSIModuleSet();
const char *getTCMHBAEPIO();
const char *getTCMHBATrash();

}  // namespace orlo

#endif
