// Creates a target: a free tid, the section, and, when the record asks for it, the
// target in the kernel with its portal group switched on, so that an enabled target
// takes logins as soon as it exists (a new target has no mappings yet, so switching on
// is all that enabling adds to the load).  A failed kernel load does not take the
// section back: the target then exists as stored and comes up at the next service start.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"
#include "target/target_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetCreate(ORLOiSCSITarget *target) {
    namespace life = orlo::target::life;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    uint32_t ret = ORLOiSCSITargetUnusedTidFind(target);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetUnusedTidFind(%p) failed, err=%s", static_cast<void *>(target),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    // Under the target lock the tid, the name and the IQN stay free until the section
    // below takes them: two creations never share one.
    if ((ret = orlo::target::CheckIdentityFree(target)) != ORLO_OK) return ret;
    ORLO_LOG_WEBAPI_DEBUG("Target ID: %d", target->tid);
    if ((ret = ORLOiSCSITargetConfAdd(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfAdd(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return life::kErrAddTargetConfig;
    }
    if (target->enabled && (ret = ORLOiSCSITargetLoad(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetLoad(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return life::kErrLoadTarget;
    }
    if (target->enabled && (ret = ORLOiSCSILioTargetAllow(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetAllow(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return life::kErrLoadTarget;
    }
    return ORLO_OK;
}
