// Formats a value and writes it into a configfs attribute.
#include <cstdarg>
#include <cstdio>

#include "base/configfs_paths.h"
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPrintf(const char *path, const char *format, ...) {
    if (path == nullptr || format == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char buf[ORLO_CONFIGFS_BUF_SIZE];
    va_list ap;
    va_start(ap, format);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    int n = vsnprintf(buf, sizeof(buf), format, ap);
#pragma GCC diagnostic pop
    va_end(ap);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(buf)) {
        ORLO_LOG_ERR("vsnprintf() failed with buf size %zu", sizeof(buf));
        return ORLO_ERR_PARSE_STRING;
    }
    uint32_t ret = ORLOiSCSIConfigfsWrite(path, buf);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, orlo::ConfigfsLogValue(path, buf),
                                  ORLOiSCSIErrStr(ret));
    return ret;
}
