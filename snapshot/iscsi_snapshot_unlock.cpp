// Ends an operation on a snapshot: removes its progress file and releases its lock.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"

namespace {

void RemoveProgress(const ORLOiSCSISnapshot *snap) {
    char path[orlo::snap::kRuntimePathSize];
    if (orlo::snap::ProgressPath(snap, path, sizeof(path)) != ORLO_OK) return;
    orlo::FileLockGuard lock(path, true, orlo::snap::kConfLockTimeoutSec);
    if (!lock.held()) ORLO_LOG_LOCK_FAILED(path);
    // Removed even without its lock: a progress file outliving its operation would tell of
    // an operation that no longer runs.
    if (orlo::os::Unlink(path) != 0 && errno != ENOENT) ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnlock(ORLOiSCSISnapshot *snap) {
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (snap->lock_fd < 1) {
        ORLO_LOG_ERR("Snapshot is not locked. sid: %d, name: %.*s, UUID: %.*s", snap->sid,
                     static_cast<int>(sizeof(snap->name)), snap->name, static_cast<int>(sizeof(snap->uuid)), snap->uuid);
        return ORLO_OK;
    }
    if (!(snap->conf_flags & ORLO_ISCSI_SNAPSHOT_CONF_UNSYNC) &&
        orlo::snap::IsUuidUsable(snap->uuid, sizeof(snap->uuid)))
        RemoveProgress(snap);
    uint32_t ret = ORLO_OK;
    if (OLIBCFileUnlockByFile(snap->lock_fd) != 0) {
        char lockPath[orlo::snap::kRuntimePathSize];
        if (orlo::snap::OpLockPath(snap, lockPath, sizeof(lockPath)) != ORLO_OK) lockPath[0] = '\0';
        ORLO_LOG_ERR("Failed to unlock file: %s", lockPath);
        ret = ORLO_ERR_UNLOCK_FILE;
    }
    snap->lock_fd = -1;
    return ret;
}
