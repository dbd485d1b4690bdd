// Every snapshot of the LUN of a lid.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetByLid(int32_t lid, ORLOiSCSISnapshotList *list) {
    if (list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSILun lun;
    uint32_t ret = orlo::snap::LunOfLid(lid, &lun);
    if (ret != ORLO_OK) return ret;
    ORLOiSCSISnapshotFilter filter = {};
    filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_ALL;
    return ORLOiSCSISnapshotConfLoadByParentLun(&lun, &filter, list);
}
