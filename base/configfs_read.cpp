#include "base/configfs_read.h"

#include <fcntl.h>
#include <unistd.h>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"

namespace orlo {

uint32_t ConfigfsReadOnce(const char *path, char *buf, size_t size, ssize_t *got) {
    *got = 0;
    int fd = os::Open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_RDONLY) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    uint32_t ret = ORLO_OK;
    ssize_t n = read(fd, buf, size);
    if (n < 0) {
        ORLO_LOG_ERR("read(%d, %p, %zu) failed, err=%m", fd, static_cast<void *>(buf), size);
        ret = ORLO_ERR_READ_FILE;
    } else {
        *got = n;
    }
    if (close(fd) != 0) {
        ORLO_LOG_ERR("close(%d) failed, err=%m", fd);
        ret = ORLO_ERR_CLOSE_FILE;
    }
    return ret;
}

}  // namespace orlo
