// How many snapshots a LUN has.  A failed read answers with its result code, which is
// larger than any limit: a LUN whose snapshots cannot be counted takes no more.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT int ORLOiSCSISnapshotQuantityGet(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    ORLOiSCSISnapshotList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSISnapshotListFree(&list); });
    uint32_t ret = ORLOiSCSISnapshotConfGetByLid(lun->lid, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotConfGetByLid(%d, %p) failed, err=%s", lun->lid, static_cast<void *>(&list),
                     ORLOiSCSIErrStr(ret));
        return static_cast<int>(ret);
    }
    return list.count;
}
