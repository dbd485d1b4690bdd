// Lock files: advisory whole-file locks (flock) on a file of their own.
//
// flock locks belong to the open file description, so two handles in one process
// exclude each other just as two processes do, and the kernel drops a lock when its
// holder dies, however it dies.  A timed request polls with a short back-off (1 ms
// doubling to 20 ms) until the lock is free or the time is up; -1 blocks in the kernel.
// The lock file is made 0600 and is never reached through a symbolic link.  After the
// lock is taken the path is checked to still name the locked file, so a lock file that
// someone removed or replaced meanwhile is locked afresh rather than trusted.
#include <fcntl.h>
#include <sys/file.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

#include "olibc.h"
#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace {

constexpr int64_t kNsPerMs = 1000000;
constexpr int64_t kFirstPauseNs = 1 * kNsPerMs;
constexpr int64_t kLongestPauseNs = 20 * kNsPerMs;

int64_t NowNs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000000000 + ts.tv_nsec;
}

void Pause(int64_t ns) {
    struct timespec ts;
    ts.tv_sec = static_cast<time_t>(ns / 1000000000);
    ts.tv_nsec = static_cast<long>(ns % 1000000000);
    while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
}

int OpenLockFile(const char *path) {
    int fd = orlo::os::Open(path, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC | O_NOCTTY, 0600);
    // A lock file made by another user may be readable only; a read-only handle locks too.
    if (fd < 0 && errno == EACCES) fd = orlo::os::Open(path, O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NOCTTY);
    return fd;
}

// Takes the lock on fd.  0 held, 1 timed out, -1 failed.
int Acquire(int fd, int exclusive, int timeoutSec, int64_t deadline) {
    int op = exclusive ? LOCK_EX : LOCK_SH;
    if (timeoutSec < 0) {
        while (flock(fd, op) != 0) {
            if (errno != EINTR) return -1;
        }
        return 0;
    }
    int64_t pause = kFirstPauseNs;
    for (;;) {
        if (flock(fd, op | LOCK_NB) == 0) return 0;
        if (errno != EWOULDBLOCK && errno != EINTR) return -1;
        int64_t left = deadline - NowNs();
        if (left <= 0) return 1;
        Pause(pause < left ? pause : left);
        pause = pause * 2 < kLongestPauseNs ? pause * 2 : kLongestPauseNs;
    }
}

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBCFileLockTimeByFile(const char *lockPath, int exclusive, int timeoutSec, int *pHandle) {
    if (pHandle != nullptr) *pHandle = -1;
    if (!orlo::olibc::IsValidPath(lockPath) || pHandle == nullptr || timeoutSec < -1) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return 0;
    }
    int64_t deadline = NowNs() + static_cast<int64_t>(timeoutSec) * 1000000000;
    for (;;) {
        int fd = OpenLockFile(lockPath);
        if (fd < 0) {
            int saved = errno;  // ELOOP for a symbolic link, EISDIR for a directory
            OLIBCErrSet(orlo::olibc::CodeOfErrno(saved, OLIBC_ERR_FOPEN));
            errno = saved;
            return 0;
        }
        struct stat held;
        const bool statted = fstat(fd, &held) == 0;
        if (!statted || !S_ISREG(held.st_mode)) {
            // A FIFO or a device where the lock file belongs: never locked through.
            int saved = statted ? EINVAL : errno;
            close(fd);
            OLIBCErrSet(OLIBC_ERR_FOPEN);
            errno = saved;
            return 0;
        }
        int rc = Acquire(fd, exclusive, timeoutSec, deadline);
        if (rc != 0) {
            int saved = errno;
            close(fd);
            errno = rc > 0 ? ETIMEDOUT : saved;
            OLIBCErrSet(rc > 0 ? OLIBC_ERR_CONF : OLIBC_ERR_IO);
            return 0;
        }
        struct stat now;
        if (orlo::os::Lstat(lockPath, &now) == 0 && now.st_dev == held.st_dev && now.st_ino == held.st_ino) {
            *pHandle = fd;
            return 1;
        }
        // The file was unlinked or replaced while we waited: our lock guards nothing.
        close(fd);
        if (timeoutSec >= 0 && NowNs() >= deadline) {
            errno = ETIMEDOUT;
            OLIBCErrSet(OLIBC_ERR_CONF);
            return 0;
        }
    }
}

ORLO_EXPORT int OLIBCFileUnlockByFile(int handle) {
    if (handle < 0) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    if (flock(handle, LOCK_UN) != 0) {
        int saved = errno;
        if (saved != EBADF) close(handle);
        errno = saved;
        OLIBCErrSet(saved == EBADF ? OLIBC_ERR_BAD_PARAM : OLIBC_ERR_IO);
        return -1;
    }
    if (close(handle) != 0) {
        OLIBCErrSet(OLIBC_ERR_IO);
        return -1;
    }
    return 0;
}

}  // extern "C"
