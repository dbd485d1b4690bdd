// Look-ups shared by the readers of one record: a file read under its lock for the first
// record a filter keeps, and the LUN of a lid.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace orlo {
namespace snap {

uint32_t ReadFirst(const ORLOiSCSISnapshotFilter *filter, const char *path, const char *lockPath,
                   ORLOiSCSISnapshot *out) {
    ORLOiSCSISnapshotList list;
    ORLOiSCSIListInit(&list);
    auto freeList = MakeScopeExit([&list]() { ORLOiSCSISnapshotListFree(&list); });
    ConfLock lock(lockPath, false);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(lockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = ORLOiSCSISnapshotConfLoadWithPath(filter, &list, path);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotConfLoadWithPath(%p, %p, \"%s\") failed, err=%s",
                     static_cast<const void *>(filter), static_cast<void *>(&list), path, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *first = ORLOiSCSIListFirst(&list);
    if (first == nullptr) return kErrNoSuchSnapshot;
    *out = *ORLO_ISCSI_SNAPSHOT_OF(first);
    out->link.next = out->link.prev = nullptr;  // a copy is no list member
    return ORLO_OK;
}

uint32_t LunOfLid(int32_t lid, ORLOiSCSILun *lun) {
    ORLOiSCSILunList luns;
    ORLOiSCSIListInit(&luns);
    auto freeLuns = MakeScopeExit([&luns]() { ORLOiSCSILunListFree(&luns); });
    uint32_t ret = ORLOiSCSILunConfGetByLid(lid, 0, &luns);
    ORLOiSCSIListLink *first = ret == ORLO_OK ? ORLOiSCSIListFirst(&luns) : nullptr;
    if (first == nullptr) {
        ORLO_LOG_ERR("Failed to load LUN config by lid: %d", lid);
        return ret != ORLO_OK ? ret : kErrNoSuchLun;
    }
    *lun = *ORLO_ISCSI_LUN_OF(first);
    return ORLO_OK;
}

}  // namespace snap
}  // namespace orlo
