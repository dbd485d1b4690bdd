// Makes the data of a LUN that lives in a file on a volume.  An advanced LUN gets its map
// file in the volume's extent pool (the pool must exist: ORLOiSCSIEpMetaFilesCreate); the
// others get their data file "<uuid>_00000" in the LUN's directory, sparse when thin,
// else grown with the volume's grow mode (allocated on ext4 and Btrfs, zero-filled
// elsewhere) while this process's progress file tells how far it got.
//
// Growing is all or nothing: a failed growth puts the file back to the size it had.  So a
// new file that does not fit fails with "Out of free space" and is removed again; only a
// data file that was there before this call (a creation resumed with the same uuid) can
// have obtained some space, and then the LUN keeps that size instead of failing.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"
#include "lun/lun_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace {

constexpr size_t kPathSize = 4096;

uint32_t MakeMapFile(ORLOiSCSILun *lun, int fsType) {
    if (fsType == ORLO_FSTYPE_EXT3) {
        ORLO_LOG_ERR("EP LUN is not supported in ext3 filesystem type.");
        return ORLO_ERR_BAD_FS_TYPE;
    }
    char mapPath[kPathSize];
    uint32_t ret = ORLOiSCSILunMapPathGet(lun, mapPath, sizeof(mapPath));
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIEpMapFileMetaInit(mapPath, lun->rootPath, lun->size);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileMetaInit(\"%s\", \"%s\", %llu) failed, err=%s", mapPath, lun->rootPath,
                     static_cast<unsigned long long>(lun->size), ORLOiSCSIErrStr(ret));
        return ret;
    }
    // The record carries its pool's extent size from now on.
    uint32_t extentSize = 0, shift = 0;
    if (ORLOiSCSIEpExtentSizeAndShiftGet(lun->rootPath, &extentSize, &shift) == ORLO_OK) lun->extentSize = extentSize;
    return ORLO_OK;
}

uint32_t GrowDataFile(ORLOiSCSILun *lun, int fsType) {
    const bool thin = ORLO_ISCSI_LUN_TYPE_HAS(lun->type, ORLO_ISCSI_LUN_TYPE_THIN);
    unsigned int mode = 0;
    if (ORLOiSCSIFileTruncModeGet(thin ? 1 : 0, fsType, &mode) < 0) {
        int err = OLIBCErrGet();
        const char *errFile = OLIBCErrorGetFile();
        int errLine = OLIBCErrorGetLine();
        ORLO_LOG_ERR("Failed to get iSCSI file truncate mode [0x%04X %s:%d]", err, errFile, errLine);
        return orlo::lun::kErrTruncMode;
    }
    char path[kPathSize];
    uint32_t ret = ORLOiSCSILunDataPathGet(lun, 0, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    struct stat st;
    const bool existed = orlo::os::Lstat(path, &st) == 0;
    uint64_t progress = 0;
    ret = ORLOiSCSIFileTrunc(path, lun->size, &progress, mode);
    if (ret == ORLO_OK) return ORLO_OK;

    const uint64_t finalSize = orlo::os::Stat(path, &st) == 0 ? static_cast<uint64_t>(st.st_size) : 0;
    ORLO_LOG_ERR("Failed to TRUNC %s, request size %llu, final size: %llu", path,
                 static_cast<unsigned long long>(lun->size), static_cast<unsigned long long>(finalSize));
    const uint64_t obtained = finalSize - finalSize % lun->blockSize;
    if (ret == ORLO_ERR_OUT_OF_SPACE && existed && obtained > 0 && obtained < lun->size) {
        ORLO_LOG_ERR("Warning: not enough space, update size from %llu to %llu.",
                     static_cast<unsigned long long>(lun->size), static_cast<unsigned long long>(obtained));
        lun->size = obtained;
        return ORLO_OK;
    }
    if (!existed && orlo::os::Unlink(path) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunObjectCreateFILE(ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type) || orlo::lun::TypeFind(lun->type) == nullptr) {
        ORLO_LOG_ERR("Unknown lun type: %d (%s)", static_cast<int>(lun->type), ORLOiSCSILunTypeName(lun->type));
        return orlo::lun::kErrBadLunType;
    }
    if (lun->size == 0 || lun->blockSize == 0) {
        ORLO_LOG_ERR("Bad LUN size: %llu (block size %u)", static_cast<unsigned long long>(lun->size), lun->blockSize);
        return orlo::lun::kErrBadSize;
    }
    const int fsType = ORLOGetFSType(lun->rootPath);
    if (fsType < 0) {
        ORLO_LOG_PLATFORM("ORLOGetFSType(\"%s\")", lun->rootPath);
        return orlo::lun::kErrFsInfo;
    }
    return ORLO_ISCSI_LUN_IS_ADV(lun->type) ? MakeMapFile(lun, fsType) : GrowDataFile(lun, fsType);
}
