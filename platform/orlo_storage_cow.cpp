// Copy-on-write control and space allocation: the no-copy-on-write inode flag through
// FS_IOC_GETFLAGS/FS_IOC_SETFLAGS, and fallocate with a full file system reported as
// OLIBC_ERR_NO_SPACE.
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>

#include "olibc.h"
#include "orlo_storage.h"
#include "platform/orlo_storage_internal.h"
#include "platform/os_seam.h"

extern "C" {

ORLO_EXPORT int ORLOFSSetNodatacow(const char *path) {
    if (path == nullptr || path[0] == '\0') {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    // O_NONBLOCK so that a FIFO in the way does not hang the call.
    int fd = orlo::os::Open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_IO);
        return -1;
    }
    int flags = 0;
    int rc = 0;
    if (ioctl(fd, FS_IOC_GETFLAGS, &flags) != 0) {
        rc = -1;
    } else if ((flags & FS_NOCOW_FL) == 0) {
        flags |= FS_NOCOW_FL;
        if (ioctl(fd, FS_IOC_SETFLAGS, &flags) != 0) rc = -1;
    }
    int saved = errno;
    ::close(fd);
    if (rc != 0) ORLO_STORAGE_FAIL(saved, OLIBC_ERR_IO);
    return rc;
}

ORLO_EXPORT int ORLOFSFallocate(int fd, int mode, off_t offset, off_t len) {
    if (fd < 0 || offset < 0 || len <= 0) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    int rc;
    do {
        rc = fallocate(fd, mode, offset, len);
    } while (rc != 0 && errno == EINTR);
    if (rc != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_IO);
        return -1;
    }
    return 0;
}

}  // extern "C"
