// Reads a configfs attribute's text, trailing newline included.
#include <algorithm>

#include "base/configfs_read.h"
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsGetString(const char *path, char *buf, size_t size) {
    if (path == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    size_t want = std::min(size, static_cast<size_t>(ORLO_CONFIGFS_BUF_SIZE));
    ssize_t n = 0;
    uint32_t ret = orlo::ConfigfsReadOnce(path, buf, want, &n);
    if (ret != ORLO_OK) return ret;
    size_t got = static_cast<size_t>(n);
    if (got == size && buf[got - 1] != '\0') {
        // The value filled the caller's buffer: it may have been cut.
        ORLO_LOG_ERR("Read buffer is not big enough.");
        return ORLO_ERR_READ_FILE;
    }
    if (got == 0 || buf[got - 1] != '\0') buf[got] = '\0';
    return ORLO_OK;
}
