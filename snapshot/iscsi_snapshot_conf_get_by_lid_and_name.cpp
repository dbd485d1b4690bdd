// The snapshot of a LUN (by lid) with a name.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetByLidAndName(int32_t lid, const char *name,
                                                                     ORLOiSCSISnapshot *snap) {
    if (name == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSILun lun;
    uint32_t ret = orlo::snap::LunOfLid(lid, &lun);
    if (ret != ORLO_OK) return ret;
    ret = orlo::snap::CheckLun(&lun);
    if (ret != ORLO_OK) return ret;
    char path[orlo::snap::kConfPathSize];
    char lockPath[orlo::snap::kConfPathSize];
    ret = orlo::snap::ConfPath(lun.rootPath, lun.uuid, path, sizeof(path));
    if (ret == ORLO_OK) ret = orlo::snap::ConfLockPath(lun.uuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    ORLOiSCSISnapshotFilter filter = {};
    filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_LID | ORLO_ISCSI_SNAPSHOT_FILTER_NAME;
    filter.lid = lid;
    filter.name = name;
    ret = orlo::snap::ReadFirst(&filter, path, lockPath, snap);
    if (ret == orlo::snap::kErrNoSuchSnapshot) ORLO_LOG_ERR("No such snapshot. lid: %d, name: %s", lid, name);
    return ret;
}
