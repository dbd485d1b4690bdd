// Takes one LUN entry away from one initiator: the "lio_lun" link, then the entry.
// What is already gone counts as removed.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetLunAclInitiatorRemove(const char *iqn, int tpgt,
                                                                        const char *initiator, int lun) {
    namespace acl = orlo::target::acl;
    uint32_t ret = acl::CheckArgs(iqn, tpgt, initiator, lun);
    if (ret != ORLO_OK) return ret;
    if (lun < 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char dir[acl::kPathSize], link[acl::kPathSize];
    if ((ret = acl::FormatPath(dir, acl::kAclLunFmt, iqn, tpgt, initiator, lun)) != ORLO_OK ||
        (ret = acl::FormatPath(link, acl::kAclLunLinkFmt, dir)) != ORLO_OK)
        return ret;
    if (orlo::os::Unlink(link) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", link);
        return ORLO_ERR_UNLINK_FILE;
    }
    if (orlo::os::Rmdir(dir) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}
