// Makes a new map file for an advanced LUN or snapshot: sized for the LUN (head plus map
// entries), a common header of type 4 with a new UUID and the current time, a map
// header whose total count is the LUN size in extents (rounded up), and empty variable
// blocks.  A file that already is a map file is refused; a file made here is removed
// again when a later step fails.
#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "platform/os_seam.h"

namespace {

uint32_t Stamp(const char *mapPath, uint64_t total) {
    char uuid[ORLO_EP_UUID_BUF_SIZE] = "";
    uint32_t ret = ORLOiSCSIEpFileHeaderFill(mapPath, uuid, EP_FILE_TYPE_MAP, 0);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderFill(\"%s\", \"%s\", EP_FILE_TYPE_MAP, 0) failed, err=%s", mapPath, uuid,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    unsigned char block[EP_BLOCK_SIZE];
    memset(block, 0, sizeof(block));
    orlo::ep::Put64(block, EP_MAP_OFF_TOTAL, total);
    ret = ORLOiSCSIEpFileMapHeaderSet(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderSet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    memset(block, 0, sizeof(block));
    uint32_t (*const setters[])(const char *, const void *) = {ORLOiSCSIEpFileMapSetVar0, ORLOiSCSIEpFileMapSetVar1,
                                                               ORLOiSCSIEpFileMapSetVar2};
    for (size_t i = 0; i < sizeof(setters) / sizeof(setters[0]); ++i) {
        ret = setters[i](mapPath, block);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpFileMapSetVar%zu(\"%s\", %p) failed, err=%s", i, mapPath,
                         static_cast<void *>(block), ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMetaInit(const char *mapPath, const char *volume,
                                                           uint64_t sizeBytes) {
    if (mapPath == nullptr || mapPath[0] == '\0' || volume == nullptr || volume[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (sizeBytes == 0) {
        ORLO_LOG_ERR("Bad LUN size: %llu", static_cast<unsigned long long>(sizeBytes));
        return EP_ERR_BAD_LUN_SIZE;
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
    struct stat st;
    bool existed = orlo::os::Lstat(mapPath, &st) == 0;
    if (!existed && errno != ENOENT) {
        ORLO_LOG_ERR("lstat(\"%s\") failed, err=%m", mapPath);
        return ORLO_ERR_STAT_PATH;
    }
    if (existed && S_ISREG(st.st_mode) && st.st_size >= static_cast<off_t>(EP_BLOCK_SIZE)) {
        bool isMap = false;
        ret = ORLOiSCSIEpIsMapFile(mapPath, &isMap);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpIsMapFile(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(&isMap),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        if (isMap) {
            ORLO_LOG_ERR("Map file %s is initialised already", mapPath);
            return ORLO_ERR_FILE_EXISTS;
        }
    }
    ret = ORLOiSCSIEpMapFileTrunc(mapPath, volume, sizeBytes);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileTrunc(\"%s\", \"%s\", %llu) failed, err=%s", mapPath, volume,
                     static_cast<unsigned long long>(sizeBytes), ORLOiSCSIErrStr(ret));
    } else {
        ret = Stamp(mapPath, orlo::ep::ExtentCount(sizeBytes, shift));
    }
    if (ret != ORLO_OK && !existed && orlo::os::Unlink(mapPath) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", mapPath);
    return ret;
}
