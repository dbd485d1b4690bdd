// Choice of the target-core generation from the platform defaults file.
#include "service/lio_version.h"

#include <mutex>

#include "base/orlo_log.h"
#include "olibc.h"

namespace orlo {

namespace {

const char kDefaultsFile[] = "/etc.defaults/orloinfo.conf";

std::mutex gMu;
std::shared_ptr<const LioState> gState;
// Replaced states are kept: callers may still hold references into them.
std::vector<std::shared_ptr<const LioState>> gRetired;

bool DefaultIs(const char *key, const char *value) {
    return OLIBCFileCheckKeyValue(kDefaultsFile, key, value) == 1;
}

unsigned int ReadVersion() {
    if (!DefaultIs("support_iscsi_target", "yes")) return 0;
    if (DefaultIs("iscsi_target_type", "lio4x")) return 4;
    if (!DefaultIs("iscsi_target_type", "lio")) ORLO_LOG_ERR("suspicious lio version, default to lio40");
    return 2;
}

}  // namespace

std::shared_ptr<const LioState> LioBuild(unsigned int version, bool rdma) {
    auto s = std::make_shared<LioState>();
    s->version = version;
    if (version == 4) {
        s->tcmModules = {"rodsp_ep", "orlo_extent_pool", "target_core_mod", "target_core_iblock",
                         "target_core_file", "target_core_ep"};
        s->iscsiModules = {"iscsi_target_mod"};
        if (rdma) s->iscsiModules.push_back("ib_isert");
        s->hbaEpio = "/config/target/core/epio_0";
        s->hbaTrash = "/config/target/core/epio_1";
    } else {
        s->tcmModules = {"rodsp_ep_4_0", "target_core_mod_4_0", "iscsi_extent_pool"};
        s->iscsiModules = {"iscsi_target_mod_4_0"};
        s->hbaEpio = "/config/target/core/fileio_0";
        s->hbaTrash = "/config/target/core/fileio_1";
    }
    s->vhostModules = {"vhost_scsi"};
    s->loopbackModules = {"tcm_loop"};
    return s;
}

std::shared_ptr<const LioState> Lio() {
    std::lock_guard<std::mutex> lock(gMu);
    if (!gState) gState = LioBuild(ReadVersion(), DefaultIs("support_rdma", "yes"));
    return gState;
}

void LioSetVersion(unsigned int version) {
    auto fresh = LioBuild(version, DefaultIs("support_rdma", "yes"));
    std::lock_guard<std::mutex> lock(gMu);
    if (gState) gRetired.push_back(gState);
    gState = fresh;
}

void LioReset() {
    std::lock_guard<std::mutex> lock(gMu);
    if (gState) gRetired.push_back(gState);
    gState.reset();
}

// The references below stay valid while the state they come from is current: a
// version switch happens only between a full stop and a full start.
const std::vector<std::string> &getTcmModuleSet() { return Lio()->tcmModules; }
const std::vector<std::string> &getiSCSIModuleSet() { return Lio()->iscsiModules; }
const char *getTCMHBAEPIO() { return Lio()->hbaEpio.c_str(); }
const char *getTCMHBATrash() { return Lio()->hbaTrash.c_str(); }

}  // namespace orlo
