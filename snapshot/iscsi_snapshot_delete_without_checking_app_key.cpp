// Deletes a snapshot whether or not an application holds it (the LUN it belongs to is
// going, or the holder is the caller itself).
#include "base/iscsi_base_internal.h"
#include "orloiscsi_snapshot.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotDeleteWithoutCheckingAppKey(ORLOiSCSISnapshot *snap,
                                                                            const char *deleter) {
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    snap->conf_flags |= orlo::snap::kConfNoAppKey;
    return ORLOiSCSISnapshotDelete(snap, deleter);
}
