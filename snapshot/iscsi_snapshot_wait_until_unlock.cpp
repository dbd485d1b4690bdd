// Waits, asking once a second, until no operation runs on a snapshot.
#include <unistd.h>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotWaitUntilUnlock(const ORLOiSCSISnapshot *snap, int seconds) {
    if (snap == nullptr || seconds < 0) {
        ORLO_LOG_BAD_PARAMS();
        return orlo::snap::kErrInvalidInput;
    }
    for (int waited = 0;; ++waited) {
        bool locked = false;
        uint32_t ret = ORLOiSCSISnapshotIsLocked(snap, &locked);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("Failed to check if snapshot is locked. sid: %d, name: %.*s", snap->sid,
                         static_cast<int>(sizeof(snap->name)), snap->name);
            return ret;
        }
        if (!locked) return ORLO_OK;
        if (seconds > 0 && waited >= seconds) {
            ORLO_LOG_ERR("Snapshot is still locked after %d seconds. sid: %d, name: %.*s", seconds, snap->sid,
                         static_cast<int>(sizeof(snap->name)), snap->name);
            return ORLO_ERR_TIMEOUT;
        }
        sleep(1);
    }
}
