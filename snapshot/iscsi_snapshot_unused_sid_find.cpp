// The smallest snapshot id (1..256) that no snapshot of a LUN has.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace {

void Mark(const ORLOiSCSISnapshotList *list, bool *taken) {
    if (!ORLOiSCSIListIsInit(list)) return;
    for (const ORLOiSCSIListLink *link = list->head.next; link != &list->head; link = link->next) {
        int32_t sid = ORLO_ISCSI_SNAPSHOT_OF(link)->sid;
        if (sid >= ORLO_ISCSI_SID_MIN && sid <= ORLO_ISCSI_SID_MAX) taken[sid] = true;
    }
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSISnapshotUnusedSidFind(const ORLOiSCSILun *lun, const ORLOiSCSISnapshotList *list) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    bool taken[ORLO_ISCSI_SID_MAX + 1] = {};
    if (list != nullptr) {
        Mark(list, taken);
    } else {
        ORLOiSCSISnapshotList own;
        ORLOiSCSIListInit(&own);
        auto freeOwn = orlo::MakeScopeExit([&own]() { ORLOiSCSISnapshotListFree(&own); });
        uint32_t ret = ORLOiSCSISnapshotConfGetByLid(lun->lid, &own);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("Failed to get snapshots' conf for lid: %d", lun->lid);
            return -1;
        }
        Mark(&own, taken);
    }
    for (int sid = ORLO_ISCSI_SID_MIN; sid <= ORLO_ISCSI_SID_MAX; ++sid)
        if (!taken[sid]) return sid;
    return -1;
}
