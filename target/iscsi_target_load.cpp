// Brings a whole target into the kernel and announces it to iSNS.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetLoad(ORLOiSCSITarget *target) {
    namespace life = orlo::target::life;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    // iSNS is best effort: a target loads whether or not the server can be reached.
    if (!ORLOiSCSIiSNSIsConnected()) (void)ORLOiSCSIiSNSConnect();
    uint32_t ret = ORLOiSCSILioTargetLoad(target, false);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetLoad(%p, 0) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return life::kErrLoadTarget;
    }
    (void)ORLOiSCSITargetiSNSRegister(target);
    return ORLO_OK;
}
