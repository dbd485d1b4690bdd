// Takes a target out of the kernel by its record: the portal group is switched off and
// the record stored first (so no new logins arrive), then the node is dismantled from
// what configfs holds.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetUnload(ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // A group that cannot be switched off (or is already gone) is dismantled all the same.
    uint32_t ret = ORLOiSCSILioTargetDisable(target);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILioTargetDisable(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
    if ((ret = ORLOiSCSITargetUnloadByIqn(target->iqn)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetUnloadByIqn(\"%s\") failed, err=%s", target->iqn, ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
