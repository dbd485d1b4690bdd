// Whether an operation holds a LUN's lock.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunIsLocked(const ORLOiSCSILun *lun, int *locked) {
    if (lun == nullptr || locked == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSILunProgress progress;
    uint32_t ret = ORLOiSCSILunProgressGet(lun, &progress);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunProgressGet(%p, %p) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(&progress), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *locked = progress.isLocked;
    return ORLO_OK;
}
