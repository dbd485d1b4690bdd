// Records a LUN's new size in its map file: the file grows to hold the map of the new
// size first, then the header's total count follows.  LUNs only grow; a smaller size is
// refused.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMetaSizeSet(const char *mapPath, const char *volume,
                                                              uint64_t sizeBytes) {
    if (mapPath == nullptr || mapPath[0] == '\0' || volume == nullptr || volume[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t size = 0, shift = 0;
    uint32_t ret = ORLOiSCSIEpExtentSizeAndShiftGet(volume, &size, &shift);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpExtentSizeAndShiftGet(\"%s\", %p, %p) failed, err=%s", volume,
                     static_cast<void *>(&size), static_cast<void *>(&shift), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (size == 0) {
        ORLO_LOG_ERR("No extent pool on %s", volume);
        return EP_ERR_GET_EXTENT_SIZE;
    }
    unsigned char block[EP_BLOCK_SIZE];
    ret = ORLOiSCSIEpFileMapHeaderGet(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderGet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint64_t current = orlo::ep::Get64(block, EP_MAP_OFF_TOTAL);
    uint64_t wanted = orlo::ep::ExtentCount(sizeBytes, shift);
    if (wanted < current) {
        ORLO_LOG_ERR("Map file %s cannot shrink from %llu to %llu extents", mapPath,
                     static_cast<unsigned long long>(current), static_cast<unsigned long long>(wanted));
        return EP_ERR_BAD_NEW_SIZE;
    }
    if (wanted == current) return ORLO_OK;
    ret = ORLOiSCSIEpMapFileTrunc(mapPath, volume, sizeBytes);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileTrunc(\"%s\", \"%s\", %llu) failed, err=%s", mapPath, volume,
                     static_cast<unsigned long long>(sizeBytes), ORLOiSCSIErrStr(ret));
        return ret;
    }
    orlo::ep::Put64(block, EP_MAP_OFF_TOTAL, wanted);
    ret = ORLOiSCSIEpFileMapHeaderSet(mapPath, block);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderSet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
