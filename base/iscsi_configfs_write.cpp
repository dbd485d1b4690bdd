// Writes one value into a configfs attribute.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/configfs_paths.h"
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsWrite(const char *path, const char *text) {
    if (path == nullptr || text == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    int fd = orlo::os::Open(path, O_WRONLY | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_WRONLY) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    uint32_t ret = ORLO_OK;
    size_t len = strlen(text);
    if (len >= ORLO_CONFIGFS_BUF_SIZE) {
        ORLO_LOG_ERR("string length(%zu) exceeded ConfgiFS buffer size: %zu", len,
                     static_cast<size_t>(ORLO_CONFIGFS_BUF_SIZE));
        ret = ORLO_ERR_BAD_STRING_LENGTH;
    } else {
        // One write: configfs takes an attribute's value in a single store call.
        ssize_t n = write(fd, text, len);
        if (n < 0 || static_cast<size_t>(n) != len) {
            if (n >= 0) errno = EIO;
            ORLO_LOG_ERR("write(%d, \"%s\", %zu) failed, err=%m", fd, orlo::ConfigfsLogValue(path, text), len);
            ret = ORLO_ERR_WRITE_FILE;
        }
    }
    if (close(fd) != 0) {
        ORLO_LOG_ERR("close(%d) failed, err=%m", fd);
        ret = ORLO_ERR_CLOSE_FILE;
    }
    return ret;
}
