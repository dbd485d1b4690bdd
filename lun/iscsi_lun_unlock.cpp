// Ends a LUN operation: removes the LUN's progress file and releases its lock.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "platform/os_seam.h"

namespace {

constexpr int kProgressLockTimeoutSec = 60;
constexpr size_t kPathSize = 4096;

void RemoveProgress(const ORLOiSCSILun *lun) {
    char path[kPathSize];
    if (!orlo::lun::ProgressFilePath(lun, path, sizeof(path))) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
        return;
    }
    orlo::FileLockGuard lock(path, true, kProgressLockTimeoutSec);
    if (!lock.held()) ORLO_LOG_LOCK_FAILED(path);
    // Removed even without its lock: a progress file outliving its operation would tell
    // readers of an operation that no longer runs.
    if (orlo::os::Unlink(path) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunUnlock(ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (lun->lockHandle <= 0) {
        ORLO_LOG_ERR("LUN is not locked. lid: %d, name: %.*s", lun->lid, static_cast<int>(sizeof(lun->name)),
                     lun->name);
        return ORLO_OK;
    }
    if (!(lun->stateFlags & ORLO_ISCSI_LUN_STATE_UNSYNC) && orlo::lun::IsUuidUsable(lun)) RemoveProgress(lun);
    uint32_t ret = ORLO_OK;
    if (OLIBCFileUnlockByFile(lun->lockHandle) != 0) {
        char lockPath[kPathSize];
        if (!orlo::lun::LockFilePath(lun, lockPath, sizeof(lockPath))) lockPath[0] = '\0';
        ORLO_LOG_ERR("Failed to unlock file: %s", lockPath);
        ret = ORLO_ERR_UNLOCK_FILE;
    }
    lun->lockHandle = -1;
    return ret;
}
