// Takes a LUN's operation lock and publishes the operation in the LUN's progress file.
// The lock is held by the record (its lockHandle) until ORLOiSCSILunUnlock or the death
// of the process.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "orloiscsi_ep.h"
#include "platform/os_seam.h"

namespace {

constexpr int kLunLockTimeoutSec = 5;
constexpr int kProgressLockTimeoutSec = 60;
constexpr size_t kPathSize = 4096;

// mkdir with mode 0700 where an existing directory counts as made.
uint32_t MakeRuntimeDir(const char *path) {
    if (orlo::os::Mkdir(path, S_IRWXU) == 0 || errno == EEXIST) return ORLO_OK;
    ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
    return ORLO_ERR_MKDIR;
}

// The bytes the operation will go through: nothing for creating, and for steps 5 and 6,
// of an advanced LUN; what its map file maps for its other operations; its size for the
// other types.
uint32_t TotalBytes(const ORLOiSCSILun *lun, int step, uint64_t *total) {
    if (!ORLO_ISCSI_LUN_IS_ADV(lun->type)) {
        *total = lun->size;
        return ORLO_OK;
    }
    if (step == ORLO_ISCSI_LUN_STEP_CREATE || step == ORLO_ISCSI_LUN_STEP_5 || step == ORLO_ISCSI_LUN_STEP_6) {
        *total = 0;
        return ORLO_OK;
    }
    char mapPath[kPathSize];
    uint32_t ret = ORLOiSCSILunMapPathGet(lun, mapPath, sizeof(mapPath));
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIEpMapFileMappedSizeGet(mapPath, lun->rootPath, total);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileMappedSizeGet(\"%s\", \"%s\", %p) failed, err=%s", mapPath, lun->rootPath,
                     static_cast<void *>(total), ORLOiSCSIErrStr(ret));
        return orlo::lun::kErrMappedSize;
    }
    return ORLO_OK;
}

// Writes the progress file afresh under its own lock.
uint32_t WriteProgress(const ORLOiSCSILun *lun, int step) {
    char path[kPathSize];
    if (!orlo::lun::ProgressFilePath(lun, path, sizeof(path))) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
        return ORLO_ERR_PARSE_STRING;
    }
    orlo::FileLockGuard lock(path, true, kProgressLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    // Taking the lock made the file; if nothing is written into it, it goes again.
    auto removeEmpty = orlo::MakeScopeExit([&path]() {
        if (orlo::os::Unlink(path) != 0 && errno != ENOENT)
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    });
    uint64_t total = 0;
    uint32_t ret = TotalBytes(lun, step, &total);
    if (ret != ORLO_OK) return ret;
    FILE *file = orlo::os::Fopen(path, "w");
    if (file == nullptr) {
        ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", path, "w");
        return ORLO_ERR_OPEN_FILE;
    }
    removeEmpty.Dismiss();
    fprintf(file, "%s=%d\n", "lid", lun->lid);
    fprintf(file, "%s=%d\n", "pid", static_cast<int>(getpid()));
    fprintf(file, "%s=%d\n", "step", step);
    fprintf(file, "%s=%llu\n", "total_bytes", static_cast<unsigned long long>(total));
    fprintf(file, "%s=%s\n", "org_path", lun->rootPath);
    fprintf(file, "%s=%s\n", "new_path", lun->rootPath);
    fprintf(file, "%s=%s\n", "name", lun->name);
    if (fclose(file) != 0) ORLO_LOG_ERR("fclose(\"%s\") failed, err=%m", path);
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunLock(ORLOiSCSILun *lun, int step) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    const bool unsync = (lun->stateFlags & ORLO_ISCSI_LUN_STATE_UNSYNC) != 0;
    uint32_t ret = MakeRuntimeDir("/tmp/iscsi");
    if (ret == ORLO_OK) ret = MakeRuntimeDir(unsync ? "/tmp/iscsi/lun_unsync" : "/tmp/iscsi/lun_lock");
    if (ret != ORLO_OK) return ret;

    char lockPath[kPathSize];
    if (!orlo::lun::LockFilePath(lun, lockPath, sizeof(lockPath))) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(lockPath));
        return ORLO_ERR_PARSE_STRING;
    }
    lun->lockHandle = -1;
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(lockPath, 1, kLunLockTimeoutSec, &handle)) {
        // Step 5 may find the LUN busy: it goes on without the lock (and without touching
        // the holder's progress file).
        if (step == ORLO_ISCSI_LUN_STEP_5) return ORLO_OK;
        // Busy for the whole wait: another operation holds the LUN.  Anything else (a
        // symbolic link or a directory where the lock file belongs) is not a busy LUN.
        const bool busy = orlo::LockTimedOut(errno);
        ORLO_LOG_LOCK_FAILED(lockPath);
        return busy ? orlo::lun::kErrLunLocked : static_cast<uint32_t>(ORLO_ERR_LOCK_FILE);
    }
    if (handle == 0) {
        // A handle of 0 cannot be told from "not locked" later: refuse to hold it.
        ORLO_LOG_LOCK_FAILED(lockPath);
        OLIBCFileUnlockByFile(handle);
        return ORLO_ERR_LOCK_FILE;
    }
    if (!unsync) {
        ret = WriteProgress(lun, step);
        if (ret != ORLO_OK) {
            if (OLIBCFileUnlockByFile(handle) != 0) ORLO_LOG_ERR("Failed to unlock file: %s", lockPath);
            return ret;
        }
    }
    lun->lockHandle = handle;
    return ORLO_OK;
}
