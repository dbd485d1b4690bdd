// The path of a volume's @iSCSI directory, which must already exist.
#include <sys/stat.h>

#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIDirPathGet(const char *volume, char *buf, size_t size) {
    if (volume == nullptr || volume[0] == '\0' || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    int n = snprintf(buf, size, "%s/@iSCSI", volume);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        buf[0] = '\0';
        ORLO_LOG_ERR("snprintf() failed with buffer size %d", static_cast<int>(size));
        return ORLO_ERR_PARSE_STRING;
    }
    struct stat st;
    if (orlo::os::Stat(buf, &st) != 0 || !S_ISDIR(st.st_mode)) {
        ORLO_LOG_ERR("iSCSI folder do not exist on %s", volume);
        return ORLO_ERR_ISCSI_DIR_NOT_FOUND;
    }
    return ORLO_OK;
}
