// Sizes a map file for a LUN: the 1 MiB head plus one 8-byte entry per extent, rounded
// up to 4096 bytes, grown sparse (the kernel fills the map in).  A map file is never
// shrunk.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileTrunc(const char *mapPath, const char *volume, uint64_t sizeBytes) {
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
    uint64_t length = orlo::ep::MapFileLength(orlo::ep::ExtentCount(sizeBytes, shift));
    ret = orlo::ep::FileGrow(mapPath, length);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("FileGrow(\"%s\", %llu) failed, err=%s", mapPath, static_cast<unsigned long long>(length),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
