// Removes one node access list of a portal group: each of its LUN entries loses its
// link to the group's LUN entry and goes, then the access list's directory.
#include <sys/stat.h>

#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/iscsi_lio_unload_util.h"

namespace {

// What the kernel puts into a node access list; every other entry is a LUN entry.
const char *const kAclDefaults[] = {"attrib", "auth", "cmdsn_depth", "fabric_statistics", "info", "param"};

bool IsAclDefault(const std::string &name) {
    for (const char *d : kAclDefaults) {
        if (name == d) return true;
    }
    return false;
}

// Unlinks the links of one access-list LUN entry.  The library names its link
// "lio_lun"; a link made under another name by hand is removed all the same, or the
// entry could never go.
uint32_t UnlinkMappedLun(const std::string &entry) {
    std::vector<std::string> names;
    uint32_t ret = orlo::target::ListConfigfsDir(entry, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        std::string path;
        if ((ret = orlo::target::JoinConfigfsPath(entry, name, &path)) != ORLO_OK) return ret;
        struct stat st;
        if (name != "lio_lun" && (orlo::os::Lstat(path.c_str(), &st) != 0 || !S_ISLNK(st.st_mode))) continue;
        if ((ret = orlo::target::RemoveConfigfsLink(path)) != ORLO_OK) return ret;
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetPortalGroupNodeAclRemove(const char *acl_path) {
    if (acl_path == nullptr || acl_path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<std::string> names;
    uint32_t ret = orlo::target::ListConfigfsDir(acl_path, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        if (IsAclDefault(name)) continue;
        std::string entry;
        if ((ret = orlo::target::JoinConfigfsPath(acl_path, name, &entry)) != ORLO_OK) return ret;
        if ((ret = UnlinkMappedLun(entry)) != ORLO_OK) return ret;
        if ((ret = orlo::target::RemoveConfigfsDir(entry)) != ORLO_OK) return ret;
    }
    return orlo::target::RemoveConfigfsDir(acl_path);
}
