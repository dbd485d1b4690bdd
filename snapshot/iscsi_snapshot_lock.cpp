// Takes a snapshot's operation lock and publishes the operation in its progress file.  The
// lock is held by the record (lock_fd) until ORLOiSCSISnapshotUnlock or the death of the
// process.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"

namespace {

using orlo::snap::kRuntimePathSize;

// mkdir with mode 0700 where an existing directory counts as made.
uint32_t MakeRuntimeDir(const char *path) {
    if (orlo::os::Mkdir(path, S_IRWXU) == 0 || errno == EEXIST) return ORLO_OK;
    ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
    return ORLO_ERR_MKDIR;
}

// Writes the progress file afresh under its own lock.
uint32_t WriteProgress(const ORLOiSCSISnapshot *snap, int step) {
    char path[kRuntimePathSize];
    uint32_t ret = orlo::snap::ProgressPath(snap, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    orlo::FileLockGuard lock(path, true, orlo::snap::kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    FILE *file = orlo::os::Fopen(path, "w");
    if (file == nullptr) {
        ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", path, "w");
        // Taking the lock made the file: an empty one tells nothing, so it goes again.
        if (orlo::os::Unlink(path) != 0 && errno != ENOENT) ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    fprintf(file, "%s=%d\n", "lid", snap->lid);
    fprintf(file, "%s=%d\n", "sid", snap->sid);
    fprintf(file, "%s=%d\n", "step", step);
    fprintf(file, "%s=%s\n", "name", snap->name);
    fprintf(file, "%s=%llu\n", "totalBytes", static_cast<unsigned long long>(snap->total_size));
    if (fclose(file) != 0) ORLO_LOG_ERR("fclose(\"%s\") failed, err=%m", path);
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotLock(ORLOiSCSISnapshot *snap, int step) {
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckPathFields(snap, false);
    if (ret != ORLO_OK) return ret;
    const bool unsync = (snap->conf_flags & ORLO_ISCSI_SNAPSHOT_CONF_UNSYNC) != 0;
    ret = MakeRuntimeDir("/tmp/iscsi");
    if (ret == ORLO_OK) ret = MakeRuntimeDir(unsync ? "/tmp/iscsi/snapshot_unsync_lock" : "/tmp/iscsi/snapshot_lock");
    if (ret != ORLO_OK) return ret;
    char lockPath[kRuntimePathSize];
    ret = orlo::snap::OpLockPath(snap, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;

    snap->lock_fd = -1;
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(lockPath, 1, orlo::snap::kOpLockTimeoutSec, &handle)) {
        // Busy for the whole wait: another operation runs on the snapshot.  Anything else
        // (a link or a directory where the lock file belongs) is not a busy snapshot.
        const bool busy = orlo::LockTimedOut(errno);
        // A deletion goes on without the lock; the holder's progress file stays its own.
        if (busy && step == ORLO_ISCSI_SNAPSHOT_STEP_DELETE) return ORLO_OK;
        ORLO_LOG_LOCK_FAILED(lockPath);
        return busy ? orlo::snap::kErrLocked : static_cast<uint32_t>(ORLO_ERR_LOCK_FILE);
    }
    if (handle == 0) {
        // A descriptor of 0 cannot be told from "not locked" later: refuse to hold it.
        ORLO_LOG_LOCK_FAILED(lockPath);
        OLIBCFileUnlockByFile(handle);
        return ORLO_ERR_LOCK_FILE;
    }
    if (!unsync) {
        ret = WriteProgress(snap, step);
        if (ret != ORLO_OK) {
            if (OLIBCFileUnlockByFile(handle) != 0) ORLO_LOG_ERR("Failed to unlock file: %s", lockPath);
            return ret;
        }
    }
    snap->lock_fd = handle;
    return ORLO_OK;
}
