// Gives back a LUN's snapshot file lock taken with ORLOiSCSISnapshotConfLock (the last of
// nested takes releases it).
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfUnlock(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckLun(lun);
    if (ret != ORLO_OK) return ret;
    return orlo::snap::DropConfLock(lun->uuid);
}
