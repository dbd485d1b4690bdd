// Switches a target's portal group off and stores its record.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetDisable(ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = ORLOiSCSILioTargetDisallow(target);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetDisallow(%p) failed, err=%s", static_cast<void *>(target),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = ORLOiSCSITargetConfUpdate(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfUpdate(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
