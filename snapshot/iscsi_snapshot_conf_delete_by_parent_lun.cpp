// Removes every snapshot record of a LUN that goes away: each snapshot's cache copy and
// the clone-family entries made from its snapshots, then the LUN's snapshot file itself.
// A cache copy that cannot be removed is logged and the others go on: the LUN's file,
// the authority, goes in any case.
#include <cerrno>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"

namespace {

void DropCacheCopy(const ORLOiSCSISnapshot *snap) {
    char section[orlo::snap::kSectionNameSize];
    char cachePath[orlo::snap::kConfPathSize];
    char cacheLock[orlo::snap::kConfPathSize];
    if (!orlo::snap::IsUuidUsable(snap->uuid, sizeof(snap->uuid))) {
        ORLO_LOG_ERR("Bad snapshot UUID in snapshot config. lid: %d, sid: %d", snap->lid, snap->sid);
        return;
    }
    if (orlo::snap::SectionName(snap->uuid, section, sizeof(section)) != ORLO_OK ||
        orlo::snap::CachePath(snap->uuid, cachePath, sizeof(cachePath)) != ORLO_OK ||
        orlo::snap::CacheLockPath(snap->uuid, cacheLock, sizeof(cacheLock)) != ORLO_OK)
        return;
    orlo::snap::ConfLock lock(cacheLock, true);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(cacheLock);
        return;
    }
    if (!OLIBCFileExist(cachePath)) return;
    if (OLIBCFileRemoveSection(cachePath, section) < 0 && OLIBCErrGet() != OLIBC_ERR_NOT_FOUND)
        ORLO_LOG_ERR("Failed to remove section: %s from %s [0x%04X %s:%d]", section, cachePath, OLIBCErrGet(),
                     OLIBCErrorGetFile(), OLIBCErrorGetLine());
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfDeleteByParentLun(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckLun(lun);
    if (ret != ORLO_OK) return ret;
    char lunPath[orlo::snap::kConfPathSize];
    char lunLock[orlo::snap::kConfPathSize];
    ret = orlo::snap::ConfPath(lun->rootPath, lun->uuid, lunPath, sizeof(lunPath));
    if (ret == ORLO_OK) ret = orlo::snap::ConfLockPath(lun->uuid, lunLock, sizeof(lunLock));
    if (ret != ORLO_OK) return ret;

    ORLOiSCSISnapshotList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSISnapshotListFree(&list); });
    ORLOiSCSISnapshotFilter all = {};
    ret = ORLOiSCSISnapshotConfLoadByParentLun(lun, &all, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get snapshot config. parent LUN UUID: %s", lun->uuid);
        return ret;
    }
    std::vector<int32_t> sids;
    ORLOiSCSIListLink *link;
    ORLOiSCSISnapshot *snap;
    ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, snap) {
        sids.push_back(snap->sid);
        DropCacheCopy(snap);
    }
    if (!sids.empty()) orlo::snap::DropFamilyEntries(lun->lid, sids);

    orlo::snap::ConfLock lock(lunLock, true);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(lunLock);
        return ORLO_ERR_LOCK_FILE;
    }
    if (orlo::os::Unlink(lunPath) != 0 && errno != ENOENT && errno != ENOTDIR) {
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", lunPath);
        return ORLO_ERR_UNLINK_FILE;
    }
    return lock.Release();
}
