// Takes a target out of the kernel and withdraws it from iSNS.  The stored enabled flag
// is left as it is, so the next service start brings the target back.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetDisable(ORLOiSCSITarget *target) {
    namespace life = orlo::target::life;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    uint32_t ret = ORLOiSCSITargetUnload(target);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetUnload(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return life::kErrUnloadTarget;
    }
    (void)ORLOiSCSITargetiSNSDeregister(target);
    return ORLO_OK;
}
