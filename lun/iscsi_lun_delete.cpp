// Deletes a LUN.  A LUN a target maps is refused, and so is one another operation
// holds.  Under the LUN's lock: the backstore leaves the kernel (nothing is touched when
// that fails), the LUN's snapshots are deleted, an advanced LUN's map file moves into its
// volume's extent-pool trash,
// the LUN's directory goes (a Btrfs subvolume with everything in it, otherwise its files
// and then the directory), and so do its configuration sections and its lock file.
// From the unload on, a failing step is logged and the others still run, so that a
// retried deletion finds only what could not be removed; the first failure is returned.
// The map file's extents are given back to the pool afterwards, in the background
// (ORLOiSCSILunUnmapALUNInBackground), once the LUN lock is no longer held.
#include <dirent.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "lun/lun_internal.h"
#include "lun/lun_kernel.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_snapshot.h"
#include "platform/os_seam.h"

namespace {

constexpr size_t kPathSize = 4096;

void Remember(uint32_t *first, uint32_t ret) {
    if (*first == ORLO_OK) *first = ret;
}

// Moves an advanced LUN's map file to "<volume>/@iSCSI/EP_unmap/<uuid>".  *moved tells
// whether the trash now holds it; a LUN without a map file has nothing to move.
uint32_t MoveMapToTrash(const ORLOiSCSILun *lun, bool *moved) {
    *moved = false;
    char mapPath[kPathSize];
    uint32_t ret = ORLOiSCSILunMapPathGet(lun, mapPath, sizeof(mapPath));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunMapPathGet(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(mapPath), sizeof(mapPath), ORLOiSCSIErrStr(ret));
        return ret;
    }
    char trashPath[EP_PATH_SIZE];
    ret = orlo::ep::TrashEntryPath(lun->rootPath, lun->uuid, trashPath, sizeof(trashPath));
    if (ret != ORLO_OK) return ret;
    struct stat st;
    if (orlo::os::Lstat(mapPath, &st) != 0) {
        if (errno != ENOENT) {
            ORLO_LOG_ERR("lstat(\"%s\") failed, err=%m", mapPath);
            return ORLO_ERR_STAT_PATH;
        }
        // No map file: perhaps an earlier, interrupted deletion moved it already.
        *moved = orlo::os::Lstat(trashPath, &st) == 0;
        return ORLO_OK;
    }
    ret = ORLOiSCSIEpTrashMkdir(lun->rootPath);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpTrashMkdir(\"%s\") failed, err=%s", lun->rootPath, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (strcmp(mapPath, trashPath) != 0 && orlo::os::Rename(mapPath, trashPath) != 0) {
        ORLO_LOG_ERR("rename(\"%s\", \"%s\") failed, err=%m", mapPath, trashPath);
        return ORLO_ERR_RENAME_FILE;
    }
    *moved = true;
    return ORLO_OK;
}

// Removes the LUN's directory on its volume.  keep names a file that must stay (a map
// file that could not reach the trash: its extents would be lost with it), or NULL.
uint32_t RemoveLunDir(const ORLOiSCSILun *lun, const char *keep) {
    char dir[kPathSize];
    uint32_t ret = ORLOiSCSILunDirPathGet(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunDirPathGet(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ret;
    }
    // A subvolume (BLUN, VDISK_BLUN on Btrfs) goes as a whole.
    if (keep == nullptr && ORLOBtrfsIsSubVol(dir) == 1) {
        ret = ORLOiSCSIRmdir(dir);
        if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIRmdir(\"%s\") failed, err=%s", dir, ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t first = ORLO_OK;
    {
        orlo::DirGuard d(orlo::os::Opendir(dir));
        if (d.get() == nullptr) {
            if (errno == ENOENT) return ORLO_OK;  // removed by an earlier attempt
            ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", dir);
            return ORLO_ERR_OPEN_DIR;
        }
        while (struct dirent *e = readdir(d.get())) {
            if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
            std::string path = std::string(dir) + "/" + e->d_name;
            if (keep != nullptr && path == keep) continue;
            struct stat st;
            if (orlo::os::Lstat(path.c_str(), &st) != 0) continue;
            if (S_ISDIR(st.st_mode)) {
                ret = ORLOiSCSIRmdir(path.c_str());
                if (ret != ORLO_OK) {
                    ORLO_LOG_ERR("ORLOiSCSIRmdir(\"%s\") failed, err=%s", path.c_str(), ORLOiSCSIErrStr(ret));
                    Remember(&first, ret);
                }
            } else if (orlo::os::Unlink(path.c_str()) != 0 && errno != ENOENT) {
                ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path.c_str());
                Remember(&first, ORLO_ERR_UNLINK_FILE);
            }
        }
    }
    if (keep != nullptr) return first;  // the directory stays with the kept file
    ret = ORLOiSCSIRmdir(dir);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIRmdir(\"%s\") failed, err=%s", dir, ORLOiSCSIErrStr(ret));
        Remember(&first, ret);
    }
    return first;
}

// The LUN's lock file goes while it is still held: a deleted LUN has nothing left to
// lock, and lock files named after uuids would otherwise pile up under /tmp/iscsi.
void RemoveLockFile(const ORLOiSCSILun *lun) {
    char path[kPathSize];
    if (!orlo::lun::LockFilePath(lun, path, sizeof(path))) return;
    if (orlo::os::Unlink(path) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
}

// The steps under the LUN lock; nothing is removed unless the backstore left the kernel.
// *inTrash: the map file waits in the volume's trash.
uint32_t DeleteLocked(ORLOiSCSILun *lun, bool *inTrash) {
    uint32_t ret = ORLOiSCSILunUnload(lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunUnload(%p) failed, err=%s", static_cast<void *>(lun), ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t first = ORLO_OK;
    // Its snapshots go first: their records name the LUN, and a block LUN's subvolume
    // snapshots live beside its own.
    if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type)) {
        ret = ORLOiSCSISnapshotDeleteByLun(lun);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSISnapshotDeleteByLun(%p) failed, err=%s", static_cast<void *>(lun),
                         ORLOiSCSIErrStr(ret));
            Remember(&first, ret);
        }
    }
    if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type)) {
        char mapPath[kPathSize] = "";
        bool keepMap = false;
        if (ORLO_ISCSI_LUN_IS_ADV(lun->type)) {
            ret = MoveMapToTrash(lun, inTrash);
            if (ret != ORLO_OK) {
                Remember(&first, ret);
                keepMap = ORLOiSCSILunMapPathGet(lun, mapPath, sizeof(mapPath)) == ORLO_OK;
            }
        }
        ret = RemoveLunDir(lun, keepMap ? mapPath : nullptr);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("Failed to remove the files of LUN. lid: %d, name: %s, err=%s", lun->lid, lun->name,
                         ORLOiSCSIErrStr(ret));
            Remember(&first, ret);
        }
    }
    ret = ORLOiSCSILunConfRemove(lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfRemove(%p) failed, err=%s", static_cast<void *>(lun), ORLOiSCSIErrStr(ret));
        Remember(&first, ret);
    }
    return first;
}

}  // namespace

namespace {
uint32_t DeleteUnmapped(ORLOiSCSILun *lun, bool *inTrash, uint32_t *first);
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunDelete(ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type) && lun->rootPath[0] != '/') {
        ORLO_LOG_ERR("invalid LUN root path. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    // What killed creations and deletions left is settled first (not while a creation
    // runs: its process does it).
    orlo::lun::RecoverPending(false);
    bool inTrash = false;
    uint32_t first = ORLO_OK;
    {
        // Under the target lock no mapping of this LUN can appear between the check and
        // the removal of its sections.  Released before the background release starts:
        // that process must not inherit it.
        orlo::ReentrantLockGuard targetLock(orlo::kTargetLockPath, orlo::kTargetLockTimeoutSec);
        if (!targetLock.held()) {
            ORLO_LOG_LOCK_FAILED(orlo::kTargetLockPath);
            return ORLO_ERR_LOCK_FILE;
        }
        uint32_t ret = DeleteUnmapped(lun, &inTrash, &first);
        if (ret != ORLO_OK) return ret;
    }
    if (inTrash) {
        uint32_t ret = ORLOiSCSILunUnmapALUNInBackground(lun->rootPath);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILunUnmapALUNInBackground(\"%s\") failed, err=%s", lun->rootPath,
                         ORLOiSCSIErrStr(ret));
            Remember(&first, ret);
        }
    }
    return first;
}

namespace {

// The deletion of a LUN no target maps, under its lock.  The refusal's code, else 0 with
// the result of the deletion in *first.
uint32_t DeleteUnmapped(ORLOiSCSILun *lun, bool *inTrash, uint32_t *first) {
    int mapped = 0;
    uint32_t ret = ORLOiSCSILunIsMapped(lun, &mapped);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunIsMapped(%p, %p) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(&mapped), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (mapped) {
        ORLO_LOG_ERR("LUN is mapped. lid: %d, name: %s", lun->lid, lun->name);
        return orlo::lun::kErrLunMapped;
    }
    ret = ORLOiSCSILunLock(lun, orlo::lun::kLunStepDelete);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunLock(%p, %d) failed, err=%s", static_cast<void *>(lun), orlo::lun::kLunStepDelete,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    // Recorded while the LUN's lock is held, so that recovery can tell a deletion under
    // way (lock busy) from one whose process was killed (lock free).
    ret = orlo::lun::RecordPending(lun, "delete");
    if (ret != ORLO_OK) {
        *first = ret;
    } else {
        *first = DeleteLocked(lun, inTrash);
        if (*first == ORLO_OK) {
            orlo::lun::ClearPending(lun->uuid);
            RemoveLockFile(lun);
        }
    }
    ret = ORLOiSCSILunUnlock(lun);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunUnlock(%p) failed, err=%s", static_cast<void *>(lun), ORLOiSCSIErrStr(ret));
    return ORLO_OK;
}

}  // namespace
