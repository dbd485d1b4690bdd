// Removes a snapshot's record: first the clone-family entries made from it, then its
// section from its LUN's snapshot file and from the cache, with the LUN's lock taken
// before the cache's.  A section (or file) that is not there is nothing to remove.  The
// cache is left alone when the LUN's file could not be changed, so that both keep agreeing.
#include <vector>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace {

// Removes section from the file at path (the caller holds its lock).
uint32_t RemoveSection(const char *path, const char *section) {
    if (!OLIBCFileExist(path)) return ORLO_OK;
    if (OLIBCFileRemoveSection(path, section) >= 0) return ORLO_OK;
    if (OLIBCErrGet() == OLIBC_ERR_NOT_FOUND) return ORLO_OK;  // gone meanwhile
    ORLO_LOG_ERR("Failed to remove section: %s from %s [0x%04X %s:%d]", section, path, OLIBCErrGet(),
                 OLIBCErrorGetFile(), OLIBCErrorGetLine());
    return ORLO_ERR_REMOVE_SECTION;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfDelete(const ORLOiSCSISnapshot *snap) {
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::snap::CheckPathFields(snap, true);
    if (ret != ORLO_OK) return ret;
    char section[orlo::snap::kSectionNameSize];
    char cachePath[orlo::snap::kConfPathSize];
    char cacheLock[orlo::snap::kConfPathSize];
    char lunPath[orlo::snap::kConfPathSize];
    char lunLock[orlo::snap::kConfPathSize];
    ret = orlo::snap::SectionName(snap->uuid, section, sizeof(section));
    if (ret == ORLO_OK) ret = orlo::snap::CachePath(snap->uuid, cachePath, sizeof(cachePath));
    if (ret == ORLO_OK) ret = orlo::snap::CacheLockPath(snap->uuid, cacheLock, sizeof(cacheLock));
    if (ret == ORLO_OK) ret = orlo::snap::ConfPath(snap->rootpath, snap->parent_uuid, lunPath, sizeof(lunPath));
    if (ret == ORLO_OK) ret = orlo::snap::ConfLockPath(snap->parent_uuid, lunLock, sizeof(lunLock));
    if (ret != ORLO_OK) return ret;

    orlo::snap::DropFamilyEntries(snap->lid, std::vector<int32_t>{snap->sid});

    orlo::snap::ConfLock lunLocked(lunLock, true);
    if (!lunLocked.held()) {
        ORLO_LOG_LOCK_FAILED(lunLock);
        return ORLO_ERR_LOCK_FILE;
    }
    orlo::snap::ConfLock cacheLocked(cacheLock, true);
    if (!cacheLocked.held()) {
        ORLO_LOG_LOCK_FAILED(cacheLock);
        return ORLO_ERR_LOCK_FILE;
    }
    ret = RemoveSection(lunPath, section);
    if (ret == ORLO_OK) ret = RemoveSection(cachePath, section);
    uint32_t unlocked = cacheLocked.Release();
    uint32_t lunUnlocked = lunLocked.Release();
    if (ret != ORLO_OK) return ret;
    return unlocked != ORLO_OK ? unlocked : lunUnlocked;
}
