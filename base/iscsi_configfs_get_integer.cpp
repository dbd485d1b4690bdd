// Reads a signed integer from a configfs attribute.
#include <cstdio>

#include "base/configfs_read.h"
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsGetInteger(const char *path, int *value) {
    if (path == nullptr || value == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char buf[ORLO_CONFIGFS_BUF_SIZE + 1];
    ssize_t n = 0;
    uint32_t ret = orlo::ConfigfsReadOnce(path, buf, ORLO_CONFIGFS_BUF_SIZE, &n);
    if (ret != ORLO_OK) return ret;
    buf[n] = '\0';
    // A value is at least one digit and the newline configfs ends it with.
    if (n < 2) {
        ORLO_LOG_ERR("Failed to read integer.");
        return ORLO_ERR_PARSE_STRING;
    }
    int v = 0;
    if (sscanf(buf, "%d", &v) != 1) {
        ORLO_LOG_ERR("sscanf(\"%s\", \"%%d\") failed: no integer in %s", buf, path);
        return ORLO_ERR_PARSE_STRING;
    }
    *value = v;
    return ORLO_OK;
}
