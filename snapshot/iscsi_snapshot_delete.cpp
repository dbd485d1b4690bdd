// Deletes a snapshot: refused while an application holds it (unless conf_flags 0x04
// says not to ask); under the snapshot's lock its backstore leaves the kernel, then an
// advanced snapshot's map file moves into the volume's extent-pool trash (its extents
// are given back in the background) and a block snapshot's subvolume is deleted; then
// its record, and the LUN's snapshot directory when it was the last.  A failure is
// logged, written to the event log, and returned; the lock is always released.
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_snapshot.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

namespace {

namespace sn = orlo::snap;

uint32_t DeleteAdv(ORLOiSCSISnapshot *snap) {
    uint32_t ret = ORLOiSCSIEpTrashMkdir(snap->rootpath);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpTrashMkdir(\"%s\") failed, err=%s", snap->rootpath, ORLOiSCSIErrStr(ret));
        return ret;
    }
    char map[sn::kObjectPathSize], trash[sn::kObjectPathSize], dir[sn::kObjectPathSize];
    ORLOiSCSISnapshot inTrash = *snap;
    inTrash.conf_flags |= sn::kConfTrash;
    if ((ret = sn::AdvMapPath(snap, map, sizeof(map))) != ORLO_OK ||
        (ret = sn::AdvMapPath(&inTrash, trash, sizeof(trash))) != ORLO_OK ||
        (ret = sn::AdvSnapshotDir(snap, dir, sizeof(dir))) != ORLO_OK)
        return ret;
    if (strcmp(map, trash) != 0) {
        if (orlo::os::Access(trash, F_OK) == 0 || errno != ENOENT) {
            ORLO_LOG_ERR("Failed to access %s or trash can already exist a lun with same name(%s), err=%m", trash,
                         snap->uuid);
            return sn::kErrFileExists;
        }
        if (orlo::os::Access(map, F_OK) == 0) {
            if ((ret = ORLOiSCSIFileRename(map, trash, 0)) != ORLO_OK) {
                ORLO_LOG_ERR("ORLOiSCSIFileRename(\"%s\", \"%s\", 0) failed, err=%s", map, trash, ORLOiSCSIErrStr(ret));
                return sn::kErrRename;
            }
        }
        if (orlo::os::Rmdir(dir) != 0 && errno != ENOENT) {
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
            return sn::kErrRmdir;
        }
    }
    if ((ret = ORLOiSCSILunUnmapALUNInBackground(snap->rootpath)) != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunUnmapALUNInBackground(\"%s\") failed, err=%s", snap->rootpath, ORLOiSCSIErrStr(ret));
    if ((ret = ORLOiSCSISnapshotConfDelete(snap)) != ORLO_OK)
        ORLO_LOG_ERR("Failed to remove configuration with lid:%d, sid:%d", snap->lid, snap->sid);
    return ret;
}

uint32_t DeleteBlun(ORLOiSCSISnapshot *snap) {
    char subvol[sn::kObjectPathSize];
    uint32_t ret = sn::BlunSubvolPath(snap, subvol, sizeof(subvol));
    if (ret != ORLO_OK) return ret;
    if (ORLOBtrfsDeleteSubvolFaultTolerant(subvol) != 0) {
        ORLO_LOG_PLATFORM("ORLOBtrfsDeleteSubvolFaultTolerant(\"%s\")", subvol);
        return sn::kErrBtrfsDelete;
    }
    if ((ret = ORLOiSCSISnapshotConfDelete(snap)) != ORLO_OK)
        ORLO_LOG_ERR("Failed to remove configuration with lid:%d, sid:%d", snap->lid, snap->sid);
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotDelete(ORLOiSCSISnapshot *snap, const char *deleter) {
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = sn::CheckPathFields(snap, true);
    if (ret != ORLO_OK) return ret;
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    const bool haveLun = ORLOiSCSILunConfGetByUuid(snap->parent_uuid, &lun) == ORLO_OK;
    if (!haveLun) {
        ORLO_LOG_ERR("Failed to parent LUN info. LUN UUID: %s, snapshot UUID: %s", snap->parent_uuid, snap->uuid);
        snprintf(lun.name, sizeof(lun.name), "%s", snap->name);
        lun.type = snap->type == ORLO_ISCSI_SNAPSHOT_TYPE_BLUN ? ORLO_ISCSI_LUN_TYPE_BLUN : ORLO_ISCSI_LUN_TYPE_ADV;
    }
    if ((snap->conf_flags & sn::kConfNoAppKey) == 0) {
        bool held = false;
        if ((ret = ORLOiSCSISnapshotIsLockedByApp(snap, &held)) != ORLO_OK) return ret;
        if (held) {
            ORLO_LOG_ERR("Cannot delete a snapshot locked by app. sid: %d, name: %s", snap->sid, snap->name);
            return sn::kErrDeleteLocked;
        }
    }
    if ((ret = ORLOiSCSISnapshotLock(snap, ORLO_ISCSI_SNAPSHOT_STEP_DELETE)) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to lock snapshot. sid: %d, name: %s, uuid: %s", snap->sid, snap->name, snap->uuid);
        return ret;
    }
    auto unlock = orlo::MakeScopeExit([snap] {
        if (snap->lock_fd > 0 && ORLOiSCSISnapshotUnlock(snap) != ORLO_OK)
            ORLO_LOG_ERR("Failed to unlock snapshot. sid: %d, name: %s, uuid: %s", snap->sid, snap->name, snap->uuid);
    });
    if ((ret = ORLOiSCSISnapshotUnload(snap)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotUnload(%p) failed, err=%s", static_cast<void *>(snap), ORLOiSCSIErrStr(ret));
        ret = sn::kErrUnloadSnapshot;
    } else if (snap->type == ORLO_ISCSI_SNAPSHOT_TYPE_ADV) {
        ret = DeleteAdv(snap);
    } else if (snap->type == ORLO_ISCSI_SNAPSHOT_TYPE_BLUN) {
        ret = DeleteBlun(snap);
    } else {
        ORLO_LOG_ERR("Invalid snapshot type: %d", snap->type);
        ret = sn::kErrBadType;
    }
    if (ret == ORLO_OK) {
        char lunDir[sn::kObjectPathSize];
        if ((ret = sn::LunSnapshotDir(snap->rootpath, snap->type, snap->parent_uuid, lunDir, sizeof(lunDir))) == ORLO_OK &&
            orlo::os::Rmdir(lunDir) != 0 && errno != ENOENT && errno != ENOTEMPTY && errno != EEXIST) {
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", lunDir);
            ret = sn::kErrRmdir;
        }
    }
    if (ret == ORLO_OK) {
        // A deleted snapshot has nothing left to hold or lock: its key file and its lock
        // file go (the lock file while still held), so that files named after UUIDs do
        // not pile up under /tmp/iscsi.
        char path[sn::kRuntimePathSize];
        if (sn::AppKeyPath(snap, path, sizeof(path)) == ORLO_OK && orlo::os::Unlink(path) != 0 && errno != ENOENT)
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
        if (snap->lock_fd > 0 && sn::OpLockPath(snap, path, sizeof(path)) == ORLO_OK && orlo::os::Unlink(path) != 0 &&
            errno != ENOENT)
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    }
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to delete snapshot. name: %s.", snap->name);
        std::string text = std::string("Failed to delete snapshot ") + snap->name;
        if (deleter != nullptr && deleter[0] != '\0') text += std::string(" (by ") + deleter + ")";
        sn::Event(sn::kEventDeleteFailed, &lun, text.c_str());
    }
    return ret;
}
