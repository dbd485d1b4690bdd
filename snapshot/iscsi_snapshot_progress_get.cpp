// Reads what an operation on a snapshot publishes: its progress file (read under the
// file's own lock, so never half-written) and whether the snapshot's operation lock is
// held.
//
// The lock decides.  A progress file outlives a holder that was killed (the kernel drops
// the lock, nobody removes the file), and trusting it would report that snapshot busy
// until the next lock and unlock of it, which may never come: so while the lock is free
// the step is idle (4), whatever a file left behind says.  While the lock is held and
// nothing is published (an unsynchronised snapshot, or a holder between taking the lock
// and writing its file), the step is -1, unknown but not idle.
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"

namespace {

using orlo::snap::kRuntimePathSize;

// Whether some handle holds the operation lock: a shared lock that cannot be had at once.
uint32_t ProbeLock(const ORLOiSCSISnapshot *snap, int32_t *locked) {
    *locked = 0;
    if (snap->lock_fd > 0) {  // this very record holds it
        *locked = 1;
        return ORLO_OK;
    }
    char lockPath[kRuntimePathSize];
    uint32_t ret = orlo::snap::OpLockPath(snap, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Access(lockPath, F_OK) != 0) return ORLO_OK;  // never locked since boot
    int handle = -1;
    if (OLIBCFileLockTimeByFile(lockPath, 0, 0, &handle)) {
        if (OLIBCFileUnlockByFile(handle) != 0) ORLO_LOG_ERR("Failed to unlock file: '%s'", lockPath);
        return ORLO_OK;
    }
    if (orlo::LockTimedOut(errno)) {
        *locked = 1;
        return ORLO_OK;
    }
    ORLO_LOG_LOCK_FAILED(lockPath);
    return ORLO_ERR_LOCK_FILE;
}

void CopyValue(char *dst, size_t size, const char *src) {
    size_t n = strnlen(src, size - 1);
    memcpy(dst, src, n);
    dst[n] = '\0';
}

uint32_t ReadProgress(const ORLOiSCSISnapshot *snap, ORLOiSCSISnapshotProgress *progress) {
    char path[kRuntimePathSize];
    uint32_t ret = orlo::snap::ProgressPath(snap, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Access(path, F_OK) != 0) return ORLO_OK;  // nothing published
    orlo::FileLockGuard lock(path, true, orlo::snap::kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    orlo::FileGuard file(orlo::os::Fopen(path, "r"));
    if (file.get() == nullptr) {
        if (errno == ENOENT) return ORLO_OK;
        ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", path, "r");
        return ORLO_ERR_OPEN_FILE;
    }
    char *buf = nullptr;
    size_t cap = 0;
    auto freeBuf = orlo::MakeScopeExit([&buf]() { free(buf); });
    int keys = 0;
    ssize_t n;
    while ((n = getline(&buf, &cap, file.get())) >= 0) {
        if (n > 0 && buf[n - 1] == '\n') buf[--n] = '\0';
        char *eq = strchr(buf, '=');
        if (eq == nullptr) continue;
        *eq = '\0';
        const char *key = buf;
        const char *value = eq + 1;
        ++keys;
        if (strcmp(key, "lid") == 0)
            progress->lid = static_cast<int32_t>(strtol(value, nullptr, 10));
        else if (strcmp(key, "sid") == 0)
            progress->sid = static_cast<int32_t>(strtol(value, nullptr, 10));
        else if (strcmp(key, "step") == 0)
            progress->step = static_cast<int32_t>(strtol(value, nullptr, 10));
        else if (strcmp(key, "name") == 0)
            CopyValue(progress->name, sizeof(progress->name), value);
        else if (strcmp(key, "totalBytes") == 0)
            progress->totalBytes = strtoull(value, nullptr, 10);
        else
            --keys;
    }
    if (ferror(file.get())) {
        ORLO_LOG_ERR("getline(%p, %p, %p) failed, err=%m", static_cast<void *>(&buf), static_cast<void *>(&cap),
                     static_cast<void *>(file.get()));
        return ORLO_ERR_READ_FILE;
    }
    if (keys > 0) {
        progress->hasProgress = 1;
    } else if (orlo::os::Unlink(path) != 0 && errno != ENOENT) {
        // Empty: made by a lock on its path and never written.  Nobody writes it without
        // this lock, so it can go.
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotProgressGet(const ORLOiSCSISnapshot *snap,
                                                             ORLOiSCSISnapshotProgress *progress) {
    if (snap == nullptr || progress == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckPathFields(snap, false);
    if (ret != ORLO_OK) return ret;
    memset(progress, 0, sizeof(*progress));
    progress->step = ORLO_ISCSI_SNAPSHOT_STEP_UNKNOWN;
    if (!(snap->conf_flags & ORLO_ISCSI_SNAPSHOT_CONF_UNSYNC)) {
        ret = ReadProgress(snap, progress);
        if (ret != ORLO_OK) return ret;
    }
    ret = ProbeLock(snap, &progress->isLocked);
    if (ret != ORLO_OK) return ret;
    if (!progress->isLocked) {
        progress->step = ORLO_ISCSI_SNAPSHOT_STEP_IDLE;
    } else if (!progress->hasProgress) {
        progress->step = ORLO_ISCSI_SNAPSHOT_STEP_UNKNOWN;
    }
    return ORLO_OK;
}
