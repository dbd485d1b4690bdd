// The path of one of a LUN's data files: its map file for an advanced LUN (file number
// 0), its image for the other file LUNs.  A LUN whose map file waits in the extent
// pool's unmap area (state flag 0x1) has it there, under its uuid alone.
#include <cstdio>

#include "lun/lun_path_check.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunDataPathGet(const ORLOiSCSILun *lun, int fileNo, char *buf, size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (fileNo < 0) {
        ORLO_LOG_ERR("invalid LUN file number: %d", fileNo);
        return ORLO_ERR_BAD_PARAMETER;
    }
    ORLO_LUN_CHECK_PATH_RECORD(lun);
    int n;
    if (lun->stateFlags & ORLO_ISCSI_LUN_STATE_EP_UNMAP)
        n = snprintf(buf, size, "%s/@iSCSI/EP_unmap/%s", lun->rootPath, lun->uuid);
    else if (lun->stateFlags & ORLO_ISCSI_LUN_STATE_TMP)
        n = snprintf(buf, size, "%s/@iSCSI/tmp/%s/%s_%05d", lun->rootPath, lun->uuid, lun->uuid, fileNo);
    else
        n = snprintf(buf, size, "%s/@iSCSI/LUN/%s/%s/%s_%05d", lun->rootPath, ORLOiSCSILunTypeName(lun->type),
                     lun->uuid, lun->uuid, fileNo);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
