// Takes a portal group out of the kernel, in the order configfs allows: no new logins
// first, then the children that hold links, then the directories themselves.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/iscsi_lio_unload_util.h"

namespace orlo {
namespace target {

uint32_t ORLOiSCSIConfigfsTargetPortalGroupACLsRemove(const std::string &tpg) {
    std::string acls;
    uint32_t ret = JoinConfigfsPath(tpg, "acls", &acls);
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> names;
    if ((ret = ListConfigfsDir(acls, &names)) != ORLO_OK) return ret;
    for (const std::string &name : names) {
        std::string acl;
        if ((ret = JoinConfigfsPath(acls, name, &acl)) != ORLO_OK) return ret;
        ret = ORLOiSCSITargetPortalGroupNodeAclRemove(acl.c_str());
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetPortalGroupNodeAclRemove(\"%s\") failed, err=%s", acl.c_str(),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

uint32_t ORLOiSCSIConfigfsTargetPortalGroupLUNRemove(const std::string &tpg) {
    std::string luns;
    uint32_t ret = JoinConfigfsPath(tpg, "lun", &luns);
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> names;
    if ((ret = ListConfigfsDir(luns, &names)) != ORLO_OK) return ret;
    for (const std::string &name : names) {
        std::string lun;
        if ((ret = JoinConfigfsPath(luns, name, &lun)) != ORLO_OK) return ret;
        ret = ORLOiSCSITargetPortalGroupLunRemoveEntry(lun.c_str());
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetPortalGroupLunRemoveEntry(\"%s\") failed, err=%s", lun.c_str(),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

uint32_t ORLOiSCSIConfigfsTargetPortalGroupUnload(const std::string &tpg) {
    std::string enable;
    uint32_t ret = JoinConfigfsPath(tpg, "enable", &enable);
    if (ret != ORLO_OK) return ret;
    int enabled = 0;
    if ((ret = ORLOiSCSIConfigfsGetInteger(enable.c_str(), &enabled)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetInteger(\"%s\", %p) failed, err=%s", enable.c_str(),
                     static_cast<void *>(&enabled), ORLOiSCSIErrStr(ret));
        return ret;
    }
    // Switched off first, so that no initiator logs in while the group is dismantled.
    if (enabled != 0 && (ret = ORLOiSCSIConfigfsPutInteger(enable.c_str(), 0)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", 0) failed, err=%s", enable.c_str(), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = ORLOiSCSITargetPortalGroupNpUnload(tpg.c_str())) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetPortalGroupNpUnload(\"%s\") failed, err=%s", tpg.c_str(), ORLOiSCSIErrStr(ret));
        return ret;
    }
    // Access-list LUN entries link to the group's LUN entries, so they go first.
    if ((ret = ORLOiSCSIConfigfsTargetPortalGroupACLsRemove(tpg)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsTargetPortalGroupACLsRemove(\"%s\") failed, err=%s", tpg.c_str(),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = ORLOiSCSIConfigfsTargetPortalGroupLUNRemove(tpg)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsTargetPortalGroupLUNRemove(\"%s\") failed, err=%s", tpg.c_str(),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    return RemoveConfigfsDir(tpg);
}

}  // namespace target
}  // namespace orlo
