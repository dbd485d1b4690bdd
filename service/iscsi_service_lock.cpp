// Takes the service lock that serialises kernel-wide operations among processes.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIServiceLock(int *fd) {
    if (fd == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *fd = -1;
    // Exclusive and without time limit: a start or stop may take minutes.
    if (!OLIBCFileLockTimeByFile(ORLO_ISCSI_SERVICE_LOCK_FILE, 1, -1, fd)) {
        ORLO_LOG_PLATFORM("OLIBCFileLockTimeByFile(\"%s\", ...)", ORLO_ISCSI_SERVICE_LOCK_FILE);
        *fd = -1;
        return ORLO_ERR_LOCK_FILE;
    }
    return ORLO_OK;
}
