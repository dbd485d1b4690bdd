// Reads what a LUN's operation publishes: its progress file (read under the file's own
// lock, so never half-written) and whether the LUN's lock is held, which tells a live
// operation from a progress file left behind by a process that died.
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "platform/os_seam.h"

namespace {

constexpr int kProgressLockTimeoutSec = 60;
constexpr size_t kPathSize = 4096;

void CopyValue(char *dst, size_t size, const char *src) {
    size_t n = strnlen(src, size - 1);
    memcpy(dst, src, n);
    dst[n] = '\0';
}

// Whether some handle holds the LUN lock: a shared lock that cannot be had at once.
uint32_t ProbeLock(const ORLOiSCSILun *lun, int32_t *locked) {
    *locked = 0;
    if (lun->lockHandle > 0) {  // this very record holds it
        *locked = 1;
        return ORLO_OK;
    }
    char lockPath[kPathSize];
    if (!orlo::lun::LockFilePath(lun, lockPath, sizeof(lockPath))) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(lockPath));
        return ORLO_ERR_PARSE_STRING;
    }
    if (orlo::os::Access(lockPath, F_OK) != 0) return ORLO_OK;  // never locked since boot
    int handle = -1;
    if (OLIBCFileLockTimeByFile(lockPath, 0, 0, &handle)) {
        if (OLIBCFileUnlockByFile(handle) != 0) ORLO_LOG_ERR("Failed to unlock file: '%s'", lockPath);
        return ORLO_OK;
    }
    if (errno == ETIMEDOUT) {
        *locked = 1;
        return ORLO_OK;
    }
    ORLO_LOG_LOCK_FAILED(lockPath);
    return ORLO_ERR_LOCK_FILE;
}

uint32_t ReadProgress(const ORLOiSCSILun *lun, ORLOiSCSILunProgress *progress) {
    char path[kPathSize];
    if (!orlo::lun::ProgressFilePath(lun, path, sizeof(path))) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
        return ORLO_ERR_PARSE_STRING;
    }
    if (orlo::os::Access(path, F_OK) != 0) return ORLO_OK;  // no operation published
    orlo::FileLockGuard lock(path, true, kProgressLockTimeoutSec);
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
        else if (strcmp(key, "pid") == 0)
            progress->pid = static_cast<int32_t>(strtol(value, nullptr, 10));
        else if (strcmp(key, "step") == 0)
            progress->step = static_cast<int32_t>(strtol(value, nullptr, 10));
        else if (strcmp(key, "total_bytes") == 0)
            progress->totalBytes = strtoull(value, nullptr, 10);
        else if (strcmp(key, "org_path") == 0)
            CopyValue(progress->orgPath, sizeof(progress->orgPath), value);
        else if (strcmp(key, "new_path") == 0)
            CopyValue(progress->newPath, sizeof(progress->newPath), value);
        else if (strcmp(key, "name") == 0)
            CopyValue(progress->name, sizeof(progress->name), value);
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
        // Empty: made by a lock on its path, never written.  Nobody writes it without this
        // lock, so it can go.
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunProgressGet(const ORLOiSCSILun *lun, ORLOiSCSILunProgress *progress) {
    if (lun == nullptr || progress == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    memset(progress, 0, sizeof(*progress));
    // An unsynchronised LUN publishes no progress file: only its lock tells.
    if (!(lun->stateFlags & ORLO_ISCSI_LUN_STATE_UNSYNC)) {
        uint32_t ret = ReadProgress(lun, progress);
        if (ret != ORLO_OK) return ret;
    }
    return ProbeLock(lun, &progress->isLocked);
}
