// Removes an application key from a snapshot (a key not registered is no error).
#include <unistd.h>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_app_keys.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnlockByAppKey(const ORLOiSCSISnapshot *snap, const char *appKey) {
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
    if (orlo::os::Access(path, F_OK) != 0) return ORLO_OK;  // no key was ever registered
    orlo::FileLockGuard lock(path, true, orlo::snap::kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    if (OLIBCFileRemoveLine(path, appKey) < 0) {
        ORLO_LOG_ERR("Failed to remove line: %s from file: %s. [0x%04X %s:%d]", appKey, path, OLIBCErrGet(),
                     OLIBCErrorGetFile(), OLIBCErrorGetLine());
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}
