// Takes every LUN backstore out of the kernel under the service lock.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunServiceStopAll(void) {
    ORLOiSCSIServiceLockGuard guard;
    if (!guard.held()) return ORLO_ERR_LOCK_FILE;
    uint32_t ret = ORLOiSCSILunServiceStopAllWithoutLock();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunServiceStopAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
