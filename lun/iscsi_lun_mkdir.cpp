// Makes a LUN's directory on its volume: "<volume>/@iSCSI/LUN/<type>/<uuid>", or
// "<volume>/@iSCSI/tmp/<uuid>" while the LUN lives under a temporary name.  Block-level
// LUNs (BLUN, VDISK_BLUN) are Btrfs subvolumes where the volume is Btrfs, so that they can
// be snapshotted and deleted as one; the others are plain directories.
#include <cstdio>

#include "lun/lun_path_check.h"
#include "orlo_storage.h"
#include "orloiscsi_base.h"
#include "orloiscsi_file.h"

namespace {

constexpr size_t kPathSize = 4096;

uint32_t MakeOne(const char *path, int asSubvol) {
    uint32_t ret = ORLOiSCSIMkdir(path, asSubvol);
    if (ret != ORLO_OK) ORLO_LOG_ERR("Failed to create LUN directory. path: %s", path);
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunMkdir(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_LUN_CHECK_PATH_RECORD(lun);
    if (!ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type)) {
        ORLO_LOG_ERR("LUN of type %s has no directory. lid: %d", ORLOiSCSILunTypeName(lun->type), lun->lid);
        return orlo::lun::kErrBadLunType;
    }
    // The volume's @iSCSI tree (a subvolume of its own on Btrfs) and the runtime directories.
    uint32_t ret = ORLOiSCSIBaseMkdir(lun->rootPath);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIBaseMkdir(\"%s\") failed, err=%s", lun->rootPath, ORLOiSCSIErrStr(ret));
        return ret;
    }
    char path[kPathSize];
    const bool tmp = (lun->stateFlags & ORLO_ISCSI_LUN_STATE_TMP) != 0;
    if (!tmp) {
        // The LUN directory's parents: "@iSCSI/LUN" and the type's directory below it.
        const char *const parents[] = {"%s/@iSCSI/LUN", "%s/@iSCSI/LUN/%s"};
        for (const char *fmt : parents) {
            int n = snprintf(path, sizeof(path), fmt, lun->rootPath, ORLOiSCSILunTypeName(lun->type));
            if (n < 0 || static_cast<size_t>(n) >= sizeof(path)) {
                ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
                return ORLO_ERR_PARSE_STRING;
            }
            ret = MakeOne(path, 0);
            if (ret != ORLO_OK) return ret;
        }
    }
    ret = ORLOiSCSILunDirPathGet(lun, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    const bool asSubvol =
        (lun->type & ORLO_ISCSI_LUN_BIT_BLUN) != 0 && ORLOGetFSType(lun->rootPath) == ORLO_FSTYPE_BTRFS;
    return MakeOne(path, asSubvol ? 1 : 0);
}
