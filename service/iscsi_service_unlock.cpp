// Releases the service lock.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIServiceUnlock(int *fd) {
    if (fd == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (*fd < 0) return ORLO_OK;
    int handle = *fd;
    *fd = -1;
    if (OLIBCFileUnlockByFile(handle) != 0) {
        ORLO_LOG_ERR("OLIBCFileUnlockByFile(%d) failed", handle);
        return ORLO_ERR_UNLOCK_FILE;
    }
    return ORLO_OK;
}
