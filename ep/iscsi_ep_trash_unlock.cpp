// Releases a trash lock; a caller that holds none has made a mistake worth a log line.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpTrashUnlock(int32_t fd) {
    if (fd < 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (OLIBCFileUnlockByFile(fd) != 0) {
        ORLO_LOG_ERR("OLIBCFileUnlockByFile(%d) failed", fd);
        return ORLO_ERR_UNLOCK_FILE;
    }
    return ORLO_OK;
}
