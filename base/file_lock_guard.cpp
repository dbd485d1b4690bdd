// Scope guard of a lock file: the constructor takes the lock (the caller checks held()
// and logs a failure to take it), the destructor releases it on every way out.
#include <cerrno>

#include "base/iscsi_base_internal.h"

namespace orlo {

FileLockGuard::FileLockGuard(const char *lockPath, bool exclusive, int timeoutSec) : path_(lockPath) {
    if (lockPath == nullptr) return;
    if (!OLIBCFileLockTimeByFile(lockPath, exclusive ? 1 : 0, timeoutSec, &handle_)) handle_ = -1;
}

FileLockGuard::~FileLockGuard() {
    if (handle_ < 0) return;
    // Releasing must not disturb what the caller is about to report.
    int savedErrno = errno;
    int savedCode = OLIBCErrGet();
    const char *savedFile = OLIBCErrorGetFile();
    int savedLine = OLIBCErrorGetLine();
    if (OLIBCFileUnlockByFile(handle_) != 0) {
        ORLO_LOG_ERR("Failed to unlock file: '%s'", path_);
    } else {
        OLIBCErrSetEx(savedCode, savedFile, savedLine);
    }
    handle_ = -1;
    errno = savedErrno;
}

}  // namespace orlo
