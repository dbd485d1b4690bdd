// Starts the iSCSI service under the service lock.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIStartAll(void) {
    ORLOiSCSIServiceLockGuard guard;
    if (!guard.held()) return ORLO_ERR_LOCK_FILE;
    uint32_t ret = ORLOiSCSIStartAllWithoutLock();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIStartAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
