// Registers an application key on a snapshot: one line of its key file, which is its own
// lock file.  A key already registered is not added again.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_app_keys.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotLockByAppKey(const ORLOiSCSISnapshot *snap, const char *appKey) {
    if (snap == nullptr || appKey == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckAppKey(appKey);
    if (ret == ORLO_OK) ret = orlo::snap::CheckPathFields(snap, false);
    if (ret != ORLO_OK) return ret;
    char path[orlo::snap::kRuntimePathSize];
    ret = orlo::snap::AppKeyPath(snap, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    orlo::FileLockGuard lock(path, true, orlo::snap::kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    int line = OLIBCFileMatchLineNo(path, appKey);
    if (line < 0) {
        ORLO_LOG_ERR("Failed to check matched line of file: %s. [0x%04X %s:%d]", path, OLIBCErrGet(),
                     OLIBCErrorGetFile(), OLIBCErrorGetLine());
        return ORLO_ERR_READ_FILE;
    }
    if (line > 0) return ORLO_OK;
    if (OLIBCFileAddLine(path, appKey) < 0) {
        ORLO_LOG_ERR("Failed to add line to file: %s. [0x%04X %s:%d]", path, OLIBCErrGet(), OLIBCErrorGetFile(),
                     OLIBCErrorGetLine());
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}
