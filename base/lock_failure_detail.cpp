// What stands where a lock file should be, told in words for the log line of a lock that
// could not be taken.
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"

namespace orlo {

std::string LockFailureDetail(const char *lockPath, int err) {
    if (LockTimedOut(err)) return std::string();
    struct stat st;
    if (lockPath != nullptr && os::Lstat(lockPath, &st) == 0 && !S_ISREG(st.st_mode)) {
        const char *what = S_ISLNK(st.st_mode)    ? "a symbolic link"
                           : S_ISDIR(st.st_mode)  ? "a directory"
                           : S_ISFIFO(st.st_mode) ? "a FIFO"
                           : S_ISSOCK(st.st_mode) ? "a socket"
                                                  : "a device node";
        return std::string(" It is ") + what + ", not a regular file; the lock cannot be taken until it is removed.";
    }
    char buf[128];
    const char *text = strerror_r(err, buf, sizeof(buf));
    return std::string(" ") + text + ".";
}

}  // namespace orlo
