/*
 * Private helpers of the snapshot code: result codes, the fixed paths of the snapshot
 * files and lock files, the checks a record passes before it is written, the locks (with
 * the per-thread hold of a LUN's snapshot file lock), the reader's pieces and the removal
 * of clone-family entries made from snapshots.
 */
#ifndef ORLO_SNAPSHOT_SNAPSHOT_INTERNAL_H
#define ORLO_SNAPSHOT_SNAPSHOT_INTERNAL_H

#include <stddef.h>
#include <stdint.h>

#include <string>
#include <vector>

#include "orloiscsi_snapshot.h"

namespace orlo {
namespace snap {

// Result codes of the snapshot code beyond those of orloiscsi_base.h.
constexpr uint32_t kErrSetHashValue = 18990032;   // Failed to set hash value
constexpr uint32_t kErrGetHashValue = 18990033;   // Failed to get hash value
constexpr uint32_t kErrInvalidInput = 18990201;   // Invalid input
constexpr uint32_t kErrNotAccepted = 18990430;    // Not accepted by filter
constexpr uint32_t kErrBadName = 18990513;        // Bad snapshot_name
constexpr uint32_t kErrBadNote = 18990518;        // Bad snapshot_note
constexpr uint32_t kErrBadUuid = 18990520;        // Bad snapshot UUID
constexpr uint32_t kErrBadAppKey = 18990524;      // Bad app_key
constexpr uint32_t kErrNoSuchLun = 18990531;      // No such LUN
constexpr uint32_t kErrNoSuchSnapshot = 18990532; // No such snapshot
constexpr uint32_t kErrLocked = 18990547;         // Snapshot is locked
constexpr uint32_t kErrBadType = 18990598;        // Bad snapshot type
constexpr uint32_t kErrBadParentUuid = 18990599;  // Bad parent UUID

constexpr int kConfLockTimeoutSec = 60;    // snapshot files, cache files, progress and key files
constexpr int kOpLockTimeoutSec = 5;       // the operation lock
constexpr size_t kConfPathSize = 320;      // configuration paths
constexpr size_t kSectionNameSize = 64;    // "SNAPSHOT_" and a UUID
constexpr size_t kRuntimePathSize = 4096;  // lock, progress and key files
constexpr size_t kAppKeyMax = 127;
constexpr const char *kLineFmt = "\t%s=%s\n";
constexpr const char *kSectionFmt = "SNAPSHOT_%s";
constexpr const char *kOrloInfoDefaults = "/etc.defaults/orloinfo.conf";

// ---- Paths ----
// Each writes the path into buf; 18990050 (logged) when it does not fit.
// "<volume>/@iSCSI/Snapshot/iscsi_snapshot_<lun uuid>.conf"
uint32_t ConfPath(const char *volume, const char *lunUuid, char *buf, size_t size);
// "/tmp/iscsi/snapshot_conf_lock/iscsi_snapshot_<lun uuid>.conf.lock"
uint32_t ConfLockPath(const char *lunUuid, char *buf, size_t size);
// "/tmp/iscsi/snapshot_cache/iscsi_snapshot_<abc>.conf.cache" and its lock
// "/tmp/iscsi/snapshot_cache_lock/iscsi_snapshot_<abc>.conf.cache.lock", <abc> being the
// first three characters of uuid, whatever they are.
uint32_t CachePath(const char *uuid, char *buf, size_t size);
uint32_t CacheLockPath(const char *uuid, char *buf, size_t size);
// "SNAPSHOT_<uuid>"
uint32_t SectionName(const char *uuid, char *buf, size_t size);
// The operation lock ("/tmp/iscsi/snapshot_lock/SN_<uuid>.lock", or
// "/tmp/iscsi/snapshot_unsync_lock/SN_<uuid>_unsync.lock" with conf_flags 0x02), the
// progress file "/tmp/iscsi/SN_<uuid>.progress" and the key file
// "/tmp/iscsi/snapshot_app_lock/SN_<uuid>.app.lock".
uint32_t OpLockPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
uint32_t ProgressPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
uint32_t AppKeyPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size);

// ---- Checks ----
// A UUID that can name files and a section: terminated inside its field of size bytes, at
// least three characters (the cache's spread), no "/", "]", blank or control character.
bool IsUuidUsable(const char *uuid, size_t size);
// The record's uuid (18990520) and, when lunFile, its parent_uuid (18990599) and rootpath
// (18990004) checked for building paths; one log line on failure.
uint32_t CheckPathFields(const ORLOiSCSISnapshot *snap, bool lunFile);
// Every field that is written, checked so that it reads back as written; lunFile as above.
uint32_t CheckRecord(const ORLOiSCSISnapshot *snap, bool lunFile);
// The same check of a LUN record whose snapshot file is to be named: its uuid (18990599)
// and root path (18990004).
uint32_t CheckLun(const ORLOiSCSILun *lun);
// "ADV", "BLUN" or "UNKNOWN".
const char *TypeWord(int32_t type);

// ---- Locks ----
// A lock file held for a scope.  When this thread holds the path through
// ORLOiSCSISnapshotConfLock, the guard rides on that hold and releases nothing.
class ConfLock {
  public:
    ConfLock(const char *lockPath, bool exclusive, int timeoutSec = kConfLockTimeoutSec);
    ConfLock(const ConfLock &) = delete;
    ConfLock &operator=(const ConfLock &) = delete;
    ~ConfLock() { Release(); }
    bool held() const { return held_; }
    // Releases now: 0, or 18990016 with "Failed to unlock file: %s" logged.
    uint32_t Release();

  private:
    std::string path_;
    int handle_ = -1;
    bool held_ = false;
};
// The hold of a LUN's snapshot file lock across calls (ORLOiSCSISnapshotConfLock/Unlock):
// counted per thread and per path.
uint32_t HoldConfLock(const char *lunUuid);
uint32_t DropConfLock(const char *lunUuid);

// ---- Reading ----
// The first record the filter keeps from the file at path, read under lockPath held
// shared, copied into *out: 0, 18990532 when the filter keeps none (not logged), or the
// failure (logged).
uint32_t ReadFirst(const ORLOiSCSISnapshotFilter *filter, const char *path, const char *lockPath,
                   ORLOiSCSISnapshot *out);
// The LUN of a lid into *lun: 0, 18990531 when there is none, or the failure; both logged
// "Failed to load LUN config by lid: %d".
uint32_t LunOfLid(int32_t lid, ORLOiSCSILun *lun);

// ---- Clone families ----
// Removes from the family file the entries whose parent is snapshot (parentLid, s) for
// each s of parentSids, in one rewrite under the family file's lock.  Failures are only
// logged ("Failed to load family config." / "Failed to remove family config. lid: %d"):
// removing a snapshot's record goes on regardless.
void DropFamilyEntries(int32_t parentLid, const std::vector<int32_t> &parentSids);

}  // namespace snap
}  // namespace orlo

#endif
