// The snapshot of a LUN (by lid) with a sid.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetBySid(int32_t lid, int32_t sid, ORLOiSCSISnapshot *snap) {
    if (snap == nullptr) {
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
    filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_LID | ORLO_ISCSI_SNAPSHOT_FILTER_SID;
    filter.lid = lid;
    filter.sid = sid;
    ret = orlo::snap::ReadFirst(&filter, path, lockPath, snap);
    if (ret == orlo::snap::kErrNoSuchSnapshot) ORLO_LOG_ERR("No such snapshot. lid: %d, sid: %d", lid, sid);
    return ret;
}
