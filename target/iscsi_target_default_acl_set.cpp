// Stores the default entry of a target (what every initiator not listed may do) and,
// when the target's node is in the kernel, applies it to the portal group.  Under the
// older target core the default entry is also a node access list of its own with its LUN
// entries, which are brought into line too.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"
#include "orloiscsi_target.h"
#include "target/lio_acl_util.h"
#include "target/masking_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetDefaultAclSet(const ORLOiSCSITarget *target, int32_t authority) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    uint32_t ret = ORLOiSCSITargetConfAclAdd(target->tid, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, authority);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfAclAdd(%d, \"%s\", %d) failed, err=%s", target->tid,
                     ORLO_ISCSI_DEFAULT_ACL_INITIATOR, authority, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ORLOiSCSITargetStatusGet(target->tid, target) & ORLO_ISCSI_TARGET_STATUS_PRESENT) == 0) return ORLO_OK;
    if (orlo::target::acl::DefaultEntryIsNodeAcl()) {
        ret = orlo::target::masking::ApplyToKernel(*target, {ORLO_ISCSI_DEFAULT_ACL_INITIATOR});
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("Failed to apply the default ACL of tid:%d, err=%s", target->tid, ORLOiSCSIErrStr(ret));
        }
        return ret;
    }
    ret = ORLOiSCSITargetDefaultAclEnable(target, authority);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetDefaultAclEnable(%p, %d) failed, err=%s", static_cast<const void *>(target),
                     authority, ORLOiSCSIErrStr(ret));
    }
    return ret;
}
