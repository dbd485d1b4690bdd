// Pieces shared by the functions that take a target node out of the kernel's iSCSI
// fabric.  They work from what configfs holds, bottom-up, because configfs refuses to
// remove a directory that still has user-made children.
#ifndef ORLO_TARGET_ISCSI_LIO_UNLOAD_UTIL_H
#define ORLO_TARGET_ISCSI_LIO_UNLOAD_UTIL_H

#include <stddef.h>
#include <stdint.h>

#include <string>
#include <vector>

namespace orlo {
namespace target {

// Size of configfs path buffers.
constexpr size_t kConfigfsPathSize = 320;
// The iSCSI fabric's root directory: each entry is a target node.
constexpr const char kIscsiFabricDir[] = "/config/target/iscsi";

// "<dir>/<name>" into a configfs-sized buffer; 18990050 (logged) when it does not fit.
uint32_t JoinConfigfsPath(const std::string &dir, const std::string &name, std::string *out);

// The entries of a directory without "." and "..", sorted so that a dismantling runs
// in the same order every time.  A directory that does not exist has no entries.
// 18990026 for a failed opendir, 18990024 for a failed closedir (both logged).
uint32_t ListConfigfsDir(const std::string &dir, std::vector<std::string> *names);

// rmdir; a directory already gone is success.  18990029 (logged).
uint32_t RemoveConfigfsDir(const std::string &dir);

// unlink; a link already gone is success.  18990037 (logged).
uint32_t RemoveConfigfsLink(const std::string &link);

// Takes one portal group of a node down: switched off, then portals, node access
// lists, LUN entries, and the group's directory.  Each step's failure is logged under
// the step's name and returned.
uint32_t ORLOiSCSIConfigfsTargetPortalGroupUnload(const std::string &tpg);
// Removes every node access list of a portal group.
uint32_t ORLOiSCSIConfigfsTargetPortalGroupACLsRemove(const std::string &tpg);
// Removes every LUN entry of a portal group.
uint32_t ORLOiSCSIConfigfsTargetPortalGroupLUNRemove(const std::string &tpg);

}  // namespace target
}  // namespace orlo

#endif
