// Whether a LUN has as many snapshots as it may have.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT bool ORLOiSCSISnapshotIsQuantityLimitReached(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return false;
    }
    return ORLOiSCSISnapshotQuantityGet(lun) >= ORLOiSCSISnapshotQuantityLimitGet();
}
