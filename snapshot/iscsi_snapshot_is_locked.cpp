// Whether an operation runs on a snapshot: its published step is not idle.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotIsLocked(const ORLOiSCSISnapshot *snap, bool *locked) {
    if (snap == nullptr || locked == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSISnapshotProgress progress;
    uint32_t ret = ORLOiSCSISnapshotProgressGet(snap, &progress);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get snapshot progress. name: %.*s, UUID: %.*s", static_cast<int>(sizeof(snap->name)),
                     snap->name, static_cast<int>(sizeof(snap->uuid)), snap->uuid);
        return ret;
    }
    *locked = progress.step != ORLO_ISCSI_SNAPSHOT_STEP_IDLE;
    return ORLO_OK;
}
