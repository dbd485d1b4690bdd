// Reads one LUN's snapshot file, under its lock held shared.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoadByParentLun(const ORLOiSCSILun *lun,
                                                                     const ORLOiSCSISnapshotFilter *filter,
                                                                     ORLOiSCSISnapshotList *list) {
    if (lun == nullptr || filter == nullptr || list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return orlo::snap::kErrInvalidInput;
    }
    uint32_t ret = orlo::snap::CheckLun(lun);
    if (ret != ORLO_OK) return ret;
    char path[orlo::snap::kConfPathSize];
    char lockPath[orlo::snap::kConfPathSize];
    ret = orlo::snap::ConfPath(lun->rootPath, lun->uuid, path, sizeof(path));
    if (ret == ORLO_OK) ret = orlo::snap::ConfLockPath(lun->uuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    orlo::snap::ConfLock lock(lockPath, false);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(lockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    ret = ORLOiSCSISnapshotConfLoadWithPath(filter, list, path);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSISnapshotConfLoadWithPath(%p, %p, \"%s\") failed, err=%s",
                     static_cast<const void *>(filter), static_cast<void *>(list), path, ORLOiSCSIErrStr(ret));
    return ret;
}
