// Takes a LUN's snapshot file lock for a caller that reads and writes that LUN's snapshots
// in several calls as one step (choosing a sid, a name and a UUID, then adding the record).
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLock(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckLun(lun);
    if (ret != ORLO_OK) return ret;
    return orlo::snap::HoldConfLock(lun->uuid);
}
