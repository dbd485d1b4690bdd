// Releases a trash lock on a clean-up path: whether or not it is held, and leaves the
// caller's descriptor at -1 so that a second call does nothing.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpTrashCleanUnlock(int32_t *fd) {
    if (fd == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (*fd < 0) return ORLO_OK;
    int32_t handle = *fd;
    *fd = -1;  // the descriptor is closed whatever the release says
    if (OLIBCFileUnlockByFile(handle) != 0) {
        ORLO_LOG_ERR("OLIBCFileUnlockByFile(%d) failed", handle);
        return ORLO_ERR_UNLOCK_FILE;
    }
    return ORLO_OK;
}
