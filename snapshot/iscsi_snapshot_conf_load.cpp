// Reads the snapshot files of every LUN into one list, LUN by LUN in the LUN file's order,
// each under its own lock held shared.  The LUN's snapshot files are the authority; the
// cache is not consulted.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace {

// One LUN's file appended to list; the first failure (logged) ends the walk.
uint32_t LoadLun(const ORLOiSCSILun *lun, const ORLOiSCSISnapshotFilter *filter, ORLOiSCSISnapshotList *list) {
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
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to load snapshot config from %s", path);
        return ret;
    }
    return lock.Release();
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoad(const ORLOiSCSISnapshotFilter *filter,
                                                          ORLOiSCSISnapshotList *list) {
    if (filter == nullptr || list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    ORLOiSCSILunList luns;
    ORLOiSCSIListInit(&luns);
    auto freeLuns = orlo::MakeScopeExit([&luns]() { ORLOiSCSILunListFree(&luns); });
    ORLOiSCSILunFilter lunFilter = {};
    lunFilter.flags = ORLO_ISCSI_LUN_FILTER_ALL;
    uint32_t ret = ORLOiSCSILunConfLoad(&lunFilter, &luns);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfLoad(%p, %p) failed, err=%s", static_cast<void *>(&lunFilter),
                     static_cast<void *>(&luns), ORLOiSCSIErrStr(ret));
        ORLOiSCSISnapshotListFree(list);
        return ret;
    }
    // With FIRST_ONLY the first record kept in any LUN's file ends the walk.
    const int32_t before = list->count;
    const bool firstOnly = (filter->flags & ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY) != 0;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&luns, link, lun) {
        ret = LoadLun(lun, filter, list);
        if (ret != ORLO_OK) {
            ORLOiSCSISnapshotListFree(list);
            return ret;
        }
        if (firstOnly && list->count > before) break;
    }
    return ORLO_OK;
}
