// Bytes of extents a map file has mapped: its mapped count shifted by the pool's extent
// shift.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMappedSizeGet(const char *mapPath, const char *volume,
                                                                uint64_t *bytes) {
    if (mapPath == nullptr || mapPath[0] == '\0' || volume == nullptr || volume[0] == '\0' || bytes == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char block[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapGetVar0(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapGetVar0(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t size = 0, shift = 0;
    ret = ORLOiSCSIEpExtentSizeAndShiftGet(volume, &size, &shift);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpExtentSizeAndShiftGet(\"%s\", %p, %p) failed, err=%s", volume,
                     static_cast<void *>(&size), static_cast<void *>(&shift), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (size == 0) {
        ORLO_LOG_ERR("No extent pool on %s", volume);
        return EP_ERR_GET_EXTENT_SIZE;
    }
    *bytes = orlo::ep::Get64(block, EP_MAP_VAR0_OFF_MAPPED) << shift;
    return ORLO_OK;
}
