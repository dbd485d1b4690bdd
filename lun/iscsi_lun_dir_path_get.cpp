// The directory that holds a LUN's files on its volume.
#include <cstdio>

#include "lun/lun_path_check.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunDirPathGet(const ORLOiSCSILun *lun, char *buf, size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_LUN_CHECK_PATH_RECORD(lun);
    int n = (lun->stateFlags & ORLO_ISCSI_LUN_STATE_TMP)
                ? snprintf(buf, size, "%s/@iSCSI/tmp/%s", lun->rootPath, lun->uuid)
                : snprintf(buf, size, "%s/@iSCSI/LUN/%s/%s", lun->rootPath, ORLOiSCSILunTypeName(lun->type), lun->uuid);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
