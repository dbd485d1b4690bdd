// Deletes every snapshot of a LUN (held by an application or not) and the LUN's snapshot
// file, as the LUN itself goes.  A snapshot that cannot be deleted is logged and the
// others still go; block snapshots left over are removed together from the LUN's snapshot
// directory, which goes too.
#include <unistd.h>

#include <cerrno>
#include <string>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_snapshot.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotDeleteByLun(const ORLOiSCSILun *lun) {
    namespace sn = orlo::snap;
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = sn::CheckLun(lun);
    if (ret != ORLO_OK) return ret;
    // Objects a killed creation left without a record go as well.
    if (ORLOiSCSISnapshotRepair(lun) < 0) ORLO_LOG_ERR("Failed to repair the snapshots of LUN %s", lun->name);
    ORLOiSCSISnapshotList list = {};
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list] { ORLOiSCSISnapshotListFree(&list); });
    ORLOiSCSISnapshotFilter all = {};
    if ((ret = ORLOiSCSISnapshotConfLoadByParentLun(lun, &all, &list)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotConfLoadByParentLun(%p, %p, %p) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(&all), static_cast<void *>(&list), ORLOiSCSIErrStr(ret));
        return ret;
    }
    OLIBC_SZLIST *uuids = OLIBCSzListAlloc(list.count > 0 ? list.count : 1);
    if (uuids == nullptr) return ORLO_ERR_OUT_OF_MEMORY;
    auto freeUuids = orlo::MakeScopeExit([&uuids] { OLIBCSzListFree(uuids); });
    ORLOiSCSIListLink *link;
    ORLOiSCSISnapshot *snap;
    ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, snap) {
        OLIBCSzListPush(&uuids, snap->uuid);
        snap->lock_fd = -1;
        uint32_t r = ORLOiSCSISnapshotDeleteWithoutCheckingAppKey(snap, nullptr);
        if (r != ORLO_OK)
            ORLO_LOG_ERR("Failed to delete snapshot. UUID: %s, lid: %d, sid: %d", snap->uuid, snap->lid, snap->sid);
    }
    // The LUN's snapshot file, under its lock; then the cache copies and family entries.
    char conf[sn::kConfPathSize], confLock[sn::kConfPathSize];
    if ((ret = sn::ConfPath(lun->rootPath, lun->uuid, conf, sizeof(conf))) != ORLO_OK ||
        (ret = sn::ConfLockPath(lun->uuid, confLock, sizeof(confLock))) != ORLO_OK)
        return ret;
    {
        sn::ConfLock lock(confLock, true);
        if (!lock.held()) {
            ORLO_LOG_LOCK_FAILED(confLock);
            return ORLO_ERR_LOCK_FILE;
        }
        if (orlo::os::Unlink(conf) != 0 && errno != ENOENT) {
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", conf);
            return sn::kErrUnlink;
        }
    }
    if ((ret = ORLOiSCSISnapshotConfDeleteByParentLun(lun)) != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSISnapshotConfDeleteByParentLun(%p) failed, err=%s", static_cast<const void *>(lun),
                     ORLOiSCSIErrStr(ret));
    if (sn::IsBlockFamily(lun->type)) {
        char dir[sn::kObjectPathSize];
        if ((ret = sn::LunSnapshotDir(lun->rootPath, ORLO_ISCSI_SNAPSHOT_TYPE_BLUN, lun->uuid, dir, sizeof(dir))) != ORLO_OK)
            return ret;
        if (uuids->nItem > 0 && ORLOBtrfsDeleteSubvolListFaultTolerant(dir, uuids) != 0) {
            ORLO_LOG_ERR("Failed to delete subvolume list. parent UUID: %s. ret: %d", lun->uuid, -1);
            return sn::kErrBtrfsDelete;
        }
        if (orlo::os::Rmdir(dir) != 0 && errno != ENOENT && errno != ENOTEMPTY) {
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
            return sn::kErrRmdir;
        }
    }
    return ORLO_OK;
}
