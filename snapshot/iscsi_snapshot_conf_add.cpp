// Writes a snapshot's section "SNAPSHOT_<uuid>" into the cache and into its LUN's snapshot
// file: appended when new, replaced when a section of that UUID is there.  The cache is
// written first, each file under its own lock, never both locks at once (unless the caller
// holds the LUN's lock across the call, see ORLOiSCSISnapshotConfLock).  A failure on the
// LUN's file after the cache was written leaves the cache's copy: nothing is rolled back,
// and the next add or delete of the snapshot sets both right.
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"

namespace {

using orlo::snap::kConfPathSize;

constexpr int kHashSize = 128;

// The seventeen keys, in the order they are written.
uint32_t FillHash(const ORLOiSCSISnapshot *snap, POLIBC_SZHASH *hash) {
    char num[32];
    auto set = [hash](const char *key, const char *value) { return OLIBCSzHashSetValue(hash, key, value) == 0; };
    bool ok = true;
    snprintf(num, sizeof(num), "%d", snap->lid);
    ok = ok && set("lid", num);
    snprintf(num, sizeof(num), "%d", snap->sid);
    ok = ok && set("sid", num);
    snprintf(num, sizeof(num), "%llu", static_cast<unsigned long long>(snap->total_size));
    ok = ok && set("total_size", num);
    snprintf(num, sizeof(num), "%llu", static_cast<unsigned long long>(snap->mappedSize));
    ok = ok && set("mappedSize", num);
    snprintf(num, sizeof(num), "%ld", static_cast<long>(snap->time));
    ok = ok && set("time", num);
    snprintf(num, sizeof(num), "%ld", static_cast<long>(snap->snapshot_time));
    ok = ok && set("snapshot_time", num);
    ok = ok && set("isAppConsistence", snap->isAppConsistence ? "yes" : "no");
    ok = ok && set("lock", snap->lock ? "yes" : "no");
    ok = ok && set("name", snap->name);
    ok = ok && set("status", snap->status);
    ok = ok && set("note", snap->note);
    ok = ok && set("rootpath", snap->rootpath);
    ok = ok && set("taken_by", snap->taken_by);
    ok = ok && set("uuid", snap->uuid);
    ok = ok && set("version", snap->version);
    ok = ok && set("parent_uuid", snap->parent_uuid);
    ok = ok && set("type", orlo::snap::TypeWord(snap->type));
    if (!ok) {
        ORLO_LOG_ERR("Failed to set value into hash[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                     OLIBCErrorGetLine());
        return orlo::snap::kErrSetHashValue;
    }
    return ORLO_OK;
}

// Adds the section to the file at path, or replaces it when the file has it already (the
// caller holds the file's lock).
uint32_t PutSection(const char *path, const char *section, const OLIBC_SZHASH *hash) {
    if (!OLIBCFileExist(path) && OLIBCFileTouch(path) < 0) {
        ORLO_LOG_ERR("Failed to touch %s [0x%04X %s:%d]", path, OLIBCErrGet(), OLIBCErrorGetFile(),
                     OLIBCErrorGetLine());
        return ORLO_ERR_TOUCH_FILE;
    }
    if (OLIBCFileAddSection(path, section, hash, orlo::snap::kLineFmt) >= 1) return ORLO_OK;
    const int addErr = OLIBCErrGet();
    const char *addFile = OLIBCErrorGetFile();
    const int addLine = OLIBCErrorGetLine();
    POLIBC_SZHASH probe = nullptr;
    const bool exists = OLIBCFileGetSection(path, section, &probe) == 1;
    OLIBCSzHashFree(probe);
    if (!exists) {
        ORLO_LOG_ERR("Failed to add section: %s to %s [0x%04X %s:%d]", section, path, addErr, addFile, addLine);
        OLIBCErrSetEx(addErr, addFile, addLine);
        return ORLO_ERR_ADD_SECTION;
    }
    if (OLIBCFileSetSection(path, section, section, hash, orlo::snap::kLineFmt) < 1) {
        ORLO_LOG_ERR("Failed to set section: %s from %s [0x%04X %s:%d]", section, path, OLIBCErrGet(),
                     OLIBCErrorGetFile(), OLIBCErrorGetLine());
        return ORLO_ERR_GET_SECTION;  // this code, though its text speaks of getting
    }
    return ORLO_OK;
}

// Makes "<volume>/@iSCSI/Snapshot" when the volume has none yet (the volume's @iSCSI tree
// first, a subvolume of its own on Btrfs).
uint32_t MakeSnapshotDir(const char *volume) {
    char dir[kConfPathSize];
    int n = snprintf(dir, sizeof(dir), "%s/@iSCSI/Snapshot", volume);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(dir)) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(dir));
        return ORLO_ERR_PARSE_STRING;
    }
    if (orlo::os::Access(dir, F_OK) == 0) return ORLO_OK;
    uint32_t ret = ORLOiSCSIBaseMkdir(volume);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIBaseMkdir(\"%s\") failed, err=%s", volume, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIMkdir(dir, 0);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIMkdir(\"%s\", 0) failed, err=%s", dir, ORLOiSCSIErrStr(ret));
    return ret;
}

// One file under its lock, held exclusive.
uint32_t WriteUnderLock(const char *lockPath, const char *path, const char *section, const OLIBC_SZHASH *hash,
                        const char *volume) {
    orlo::snap::ConfLock lock(lockPath, true);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(lockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = ORLO_OK;
    if (volume != nullptr) ret = MakeSnapshotDir(volume);
    if (ret == ORLO_OK) ret = PutSection(path, section, hash);
    uint32_t unlocked = lock.Release();
    return ret != ORLO_OK ? ret : unlocked;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfAdd(const ORLOiSCSISnapshot *snap) {
    if (snap == nullptr) {
        ORLO_LOG_ERR("Null input pointer");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_NULL_POINTER;
    }
    const uint32_t flags = snap->conf_flags;
    const bool toCache = !(flags & ORLO_ISCSI_SNAPSHOT_CONF_NO_CACHE);
    const bool toLunFile = !(flags & ORLO_ISCSI_SNAPSHOT_CONF_CACHE_ONLY);
    // Everything is checked and every path built before the first write.
    uint32_t ret = orlo::snap::CheckRecord(snap, toLunFile);
    if (ret != ORLO_OK) return ret;
    char section[orlo::snap::kSectionNameSize];
    char cachePath[kConfPathSize];
    char cacheLock[kConfPathSize];
    char lunPath[kConfPathSize];
    char lunLock[kConfPathSize];
    ret = orlo::snap::SectionName(snap->uuid, section, sizeof(section));
    if (ret == ORLO_OK) ret = orlo::snap::CachePath(snap->uuid, cachePath, sizeof(cachePath));
    if (ret == ORLO_OK) ret = orlo::snap::CacheLockPath(snap->uuid, cacheLock, sizeof(cacheLock));
    if (ret == ORLO_OK && toLunFile) ret = orlo::snap::ConfPath(snap->rootpath, snap->parent_uuid, lunPath, sizeof(lunPath));
    if (ret == ORLO_OK && toLunFile) ret = orlo::snap::ConfLockPath(snap->parent_uuid, lunLock, sizeof(lunLock));
    if (ret != ORLO_OK) return ret;

    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("Failed to alloc pshHash [0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    ret = FillHash(snap, hash.addr());
    if (ret != ORLO_OK) return ret;

    if (toCache) {
        ret = WriteUnderLock(cacheLock, cachePath, section, hash.get(), nullptr);
        if (ret != ORLO_OK) return ret;
    }
    if (!toLunFile) return ORLO_OK;
    return WriteUnderLock(lunLock, lunPath, section, hash.get(), snap->rootpath);
}
