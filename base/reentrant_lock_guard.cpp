// A lock file a thread may take again while it holds it.  flock locks belong to the open
// file description, so a second take through a second descriptor would wait for the
// first; the thread keeps one descriptor per path and a depth instead.
#include <map>
#include <string>

#include "base/iscsi_base_internal.h"

namespace orlo {

namespace {

struct Held {
    int handle = -1;
    int depth = 0;
};

std::map<std::string, Held> &HeldByThisThread() {
    thread_local std::map<std::string, Held> held;
    return held;
}

}  // namespace

ReentrantLockGuard::ReentrantLockGuard(const char *lockPath, int timeoutSec) {
    if (lockPath == nullptr) return;
    path_ = lockPath;
    Held &h = HeldByThisThread()[path_];
    if (h.depth == 0) {
        int handle = -1;
        if (!OLIBCFileLockTimeByFile(lockPath, 1, timeoutSec, &handle)) {
            int saved = errno;
            HeldByThisThread().erase(path_);
            errno = saved;
            return;
        }
        h.handle = handle;
    }
    ++h.depth;
    held_ = true;
}

ReentrantLockGuard::~ReentrantLockGuard() {
    if (!held_) return;
    auto &all = HeldByThisThread();
    auto it = all.find(path_);
    if (it == all.end() || --it->second.depth > 0) return;
    int savedErrno = errno;
    int savedCode = OLIBCErrGet();
    const char *savedFile = OLIBCErrorGetFile();
    int savedLine = OLIBCErrorGetLine();
    if (OLIBCFileUnlockByFile(it->second.handle) != 0) {
        ORLO_LOG_ERR("Failed to unlock file: '%s'", path_.c_str());
    } else {
        OLIBCErrSetEx(savedCode, savedFile, savedLine);
    }
    all.erase(it);
    errno = savedErrno;
}

}  // namespace orlo
