// The lock files of the snapshot code, and the per-thread hold of a LUN's snapshot file
// lock across calls.
//
// flock locks belong to the open file description: a second take of a lock this thread
// already holds, through a second descriptor, would wait for the first.  A caller that
// holds a LUN's snapshot file lock (ORLOiSCSISnapshotConfLock) while it calls the readers
// and writers of that LUN therefore has its hold counted here, and the library's own takes
// of that lock in this thread ride on it.
#include <cerrno>
#include <map>
#include <string>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace orlo {
namespace snap {

namespace {

struct Hold {
    int handle = -1;
    int depth = 0;
};

std::map<std::string, Hold> &HoldsOfThisThread() {
    thread_local std::map<std::string, Hold> holds;
    return holds;
}

}  // namespace

ConfLock::ConfLock(const char *lockPath, bool exclusive, int timeoutSec) : path_(lockPath) {
    auto &holds = HoldsOfThisThread();
    if (!holds.empty() && holds.count(path_) != 0) {  // held exclusive by this thread already
        held_ = true;
        return;
    }
    if (OLIBCFileLockTimeByFile(lockPath, exclusive ? 1 : 0, timeoutSec, &handle_)) {
        held_ = true;
    } else {
        handle_ = -1;
    }
}

uint32_t ConfLock::Release() {
    if (!held_) return ORLO_OK;
    held_ = false;
    if (handle_ < 0) return ORLO_OK;  // rode on the thread's hold
    int handle = handle_;
    handle_ = -1;
    int savedErrno = errno;
    if (OLIBCFileUnlockByFile(handle) != 0) {
        ORLO_LOG_ERR("Failed to unlock file: %s", path_.c_str());
        errno = savedErrno;
        return ORLO_ERR_UNLOCK_FILE;
    }
    errno = savedErrno;
    return ORLO_OK;
}

uint32_t HoldConfLock(const char *lunUuid) {
    char lockPath[kConfPathSize];
    uint32_t ret = ConfLockPath(lunUuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    auto &holds = HoldsOfThisThread();
    auto it = holds.find(lockPath);
    if (it != holds.end()) {
        ++it->second.depth;
        return ORLO_OK;
    }
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(lockPath, 1, kConfLockTimeoutSec, &handle)) {
        ORLO_LOG_LOCK_FAILED(lockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    Hold &h = holds[lockPath];
    h.handle = handle;
    h.depth = 1;
    return ORLO_OK;
}

uint32_t DropConfLock(const char *lunUuid) {
    char lockPath[kConfPathSize];
    uint32_t ret = ConfLockPath(lunUuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    auto &holds = HoldsOfThisThread();
    auto it = holds.find(lockPath);
    if (it == holds.end()) {
        ORLO_LOG_ERR("Snapshot config lock is not held by this thread: %s", lockPath);
        return ORLO_ERR_UNLOCK_FILE;
    }
    if (--it->second.depth > 0) return ORLO_OK;
    int handle = it->second.handle;
    holds.erase(it);
    if (OLIBCFileUnlockByFile(handle) != 0) {
        ORLO_LOG_ERR("Failed to unlock file: %s", lockPath);
        return ORLO_ERR_UNLOCK_FILE;
    }
    return ORLO_OK;
}

}  // namespace snap
}  // namespace orlo
