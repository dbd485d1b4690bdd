// Removes one LUN entry of a portal group: its link to the backstore goes first (the
// backstore itself stays loaded), then the entry's directory.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/iscsi_lio_unload_util.h"

namespace {

// What the kernel puts into a LUN entry; every other entry is the backstore link.
const char *const kLunDefaults[] = {"alua_tg_pt_gp", "alua_tg_pt_offline", "alua_tg_pt_status",
                                    "alua_tg_pt_write_md", "statistics"};

bool IsLunDefault(const std::string &name) {
    for (const char *d : kLunDefaults) {
        if (name == d) return true;
    }
    return false;
}

// Whether the linked backstore is a block device's (host type "iblock") rather than a
// file's or an extent pool's.
uint32_t isTCMLunPathBlockLun(const std::string &link, bool *block) {
    std::string hbaType;
    uint32_t ret = orlo::target::JoinConfigfsPath(link, "attrib/hba_type", &hbaType);
    if (ret != ORLO_OK) return ret;
    char type[ORLO_CONFIGFS_BUF_SIZE];
    if ((ret = ORLOiSCSIConfigfsGetString(hbaType.c_str(), type, sizeof(type))) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetString(\"%s\", %p, %zu) failed, err=%s", hbaType.c_str(),
                     static_cast<void *>(type), sizeof(type), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *block = strncmp(type, "iblock", strlen("iblock")) == 0 &&
             (type[strlen("iblock")] == '\n' || type[strlen("iblock")] == '\0');
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetPortalGroupLunRemoveEntry(const char *lun_path) {
    if (lun_path == nullptr || lun_path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<std::string> names;
    uint32_t ret = orlo::target::ListConfigfsDir(lun_path, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        if (IsLunDefault(name)) continue;
        std::string link;
        if ((ret = orlo::target::JoinConfigfsPath(lun_path, name, &link)) != ORLO_OK) return ret;
        bool block = false;
        if ((ret = isTCMLunPathBlockLun(link, &block)) != ORLO_OK) return ret;
        char backstore[ORLO_CONFIGFS_BUF_SIZE];
        ssize_t n = orlo::os::Readlink(link.c_str(), backstore, sizeof(backstore) - 1);
        if (n < 0) {
            ORLO_LOG_ERR("readlink(\"%s\") failed, err=%m", link.c_str());
            return ORLO_ERR_READ_FILE;
        }
        backstore[n] = '\0';
        // Unlinking is the same for every kind of backstore; which kind the entry served
        // is recorded so that a block device left without its target can be traced.
        ORLO_LOG(LOG_INFO, "isTCMLunPathBlockLun(\"%s\") = %s, unlinking %s -> %s", link.c_str(),
                 block ? "true" : "false", link.c_str(), backstore);
        if ((ret = orlo::target::RemoveConfigfsLink(link)) != ORLO_OK) return ret;
    }
    return orlo::target::RemoveConfigfsDir(lun_path);
}
