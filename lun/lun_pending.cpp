// The journal of LUN creations and deletions under way, and the recovery of those a
// killed process left half-done.
//
// A creation makes a directory, a data or map file and then two sections (the global
// LUN file and the volume's copy); a deletion removes them in the other order.  A process
// killed in between would leave space no section mentions, or a section without its
// twin.  So before it makes or removes anything, each of them records what it is about
// to do as a section "PENDING_<uuid>" of /usr/orlo/etc/iscsi_lun_pending.conf (under the
// LUN files' lock), and it removes that section when it is done.  A section found there
// later whose owner is gone is recovered:
//   - a creation whose global section was written is finished: the volume's copy is
//     written from it (the LUN exists once the global file holds it);
//   - any other creation is rolled back as a deletion of what it made: directory, files,
//     map file (to the extent pool's trash), a lone volume section, lock file;
//   - a deletion is carried to its end.
// The owner of a creation holds the creation lock from before its record to after its
// removal, so a record seen while holding that lock has no living owner.  The owner of a
// deletion holds the LUN's lock, so a deletion record whose LUN lock can be taken at once
// has none either.  Recovery runs at the start of every creation and deletion and at the
// service start; it also removes the progress files of processes that are gone.
#include <dirent.h>
#include <signal.h>
#include <sys/types.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"
#include "lun/lun_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace lun {

namespace {

constexpr const char kPendingSectionPrefix[] = "PENDING_";

// Set while this thread recovers, so that the deletion recovery uses does not recover
// in its turn.
thread_local bool tRecovering = false;

std::string SectionOf(const char *uuid) { return std::string(kPendingSectionPrefix) + uuid; }

bool SetValue(POLIBC_SZHASH *hash, const char *key, const std::string &value) {
    return OLIBCSzHashSetValue(hash, key, value.c_str()) >= 0;
}

struct PendingEntry {
    std::string op;
    ORLOiSCSILun lun;
};

// Reads every pending entry; false when the file cannot be read (logged).
bool LoadPending(std::vector<PendingEntry> *out) {
    if (!OLIBCFileExist(kPendingConfPath)) return true;
    SzListGuard names(nullptr);
    int n = ORLOiSCSIConfSectionEnum(kPendingConfPath, names.addr());
    if (n < 0) {
        ORLO_LOG_ERR("ORLOiSCSIConfSectionEnum(\"%s\", %p) failed, ret=%d", kPendingConfPath,
                     static_cast<void *>(names.addr()), n);
        return false;
    }
    for (int i = 0; i < n; ++i) {
        const char *section = OLIBCSzListGet(names.get(), i);
        if (section == nullptr || strncmp(section, kPendingSectionPrefix, strlen(kPendingSectionPrefix)) != 0)
            continue;
        SzHashGuard hash(OLIBCSzHashAlloc(32));
        if (hash.get() == nullptr || OLIBCFileGetSection(kPendingConfPath, section, hash.addr()) < 1) continue;
        auto get = [&hash](const char *key) {
            const char *v = OLIBCSzHashGetValue(hash.get(), key);
            return v != nullptr ? v : "";
        };
        PendingEntry e;
        memset(&e.lun, 0, sizeof(e.lun));
        e.op = get("op");
        e.lun.lockHandle = -1;
        e.lun.lid = atoi(get("lid"));
        e.lun.type = static_cast<uint32_t>(strtoul(get("type"), nullptr, 10));
        e.lun.stateFlags = static_cast<uint32_t>(strtoul(get("state_flags"), nullptr, 10));
        e.lun.blockSize = static_cast<uint32_t>(strtoul(get("blocksize"), nullptr, 10));
        e.lun.size = strtoull(get("bytes"), nullptr, 10);
        snprintf(e.lun.uuid, sizeof(e.lun.uuid), "%s", section + strlen(kPendingSectionPrefix));
        snprintf(e.lun.rootPath, sizeof(e.lun.rootPath), "%s", get("rootpath"));
        snprintf(e.lun.name, sizeof(e.lun.name), "%s", get("name"));
        out->push_back(e);
    }
    return true;
}

// Whether another process holds the LUN's lock right now.
bool LunLockBusy(const ORLOiSCSILun *lun) {
    char path[4096];
    if (!LockFilePath(lun, path, sizeof(path))) return false;
    if (os::Access(path, F_OK) != 0) return false;
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(path, 1, 0, &handle)) return LockTimedOut(errno);
    OLIBCFileUnlockByFile(handle);
    return false;
}

void RemoveProgressOf(const ORLOiSCSILun *lun) {
    char path[4096];
    if (!ProgressFilePath(lun, path, sizeof(path))) return;
    if (os::Unlink(path) != 0 && errno != ENOENT) ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
}

void Recover(PendingEntry &e) {
    ORLOiSCSILun stored;
    const bool inGlobal = ORLOiSCSILunConfGetByUuid(e.lun.uuid, &stored) == ORLO_OK;
    uint32_t ret;
    if (e.op == "create" && inGlobal) {
        // Everything was made; only the volume's copy may be missing.
        ret = ORLOiSCSILunConfSet(&stored);
        ORLO_LOG_ERR("Finished the creation of LUN %s (uuid %s) that an ended process left, err=%s", stored.name,
                     stored.uuid, ORLOiSCSIErrStr(ret));
    } else {
        ORLOiSCSILun victim = inGlobal ? stored : e.lun;
        victim.lockHandle = -1;
        victim.stateFlags = e.lun.stateFlags;
        ret = ORLOiSCSILunDelete(&victim);
        ORLO_LOG_ERR("%s LUN %s (uuid %s) that an ended process left half-%s, err=%s",
                     e.op == "create" ? "Rolled back the creation of" : "Finished the deletion of", victim.name,
                     victim.uuid, e.op == "create" ? "made" : "deleted", ORLOiSCSIErrStr(ret));
    }
    if (ret == ORLO_OK) {
        RemoveProgressOf(&e.lun);
        ClearPending(e.lun.uuid);
    }
}

// Progress files of processes that are gone: "P<pid>.progress" whose pid does not run,
// and "LUN_<uuid>.progress" whose LUN lock is free (an operation publishes one only while
// it holds the lock).
void SweepStaleProgress() {
    DirGuard d(os::Opendir("/tmp/iscsi"));
    if (d.get() == nullptr) return;
    while (struct dirent *e = readdir(d.get())) {
        const char *name = e->d_name;
        size_t n = strlen(name);
        if (n < 10 || strcmp(name + n - 9, ".progress") != 0) continue;
        std::string path = std::string("/tmp/iscsi/") + name;
        int pid = 0;
        char tail[16];
        if (sscanf(name, "P%d%15s", &pid, tail) == 2 && strcmp(tail, ".progress") == 0 && pid > 0) {
            if (kill(pid, 0) != 0 && errno == ESRCH) os::Unlink(path.c_str());
            continue;
        }
        if (strncmp(name, "LUN_", 4) == 0 && n == 4 + ORLO_ISCSI_UUID_LEN + 9) {
            ORLOiSCSILun probe;
            memset(&probe, 0, sizeof(probe));
            memcpy(probe.uuid, name + 4, ORLO_ISCSI_UUID_LEN);
            if (!LunLockBusy(&probe)) {
                // Taken under the progress file's own lock, as every writer of it does.
                FileLockGuard lock(path.c_str(), true, 0);
                if (lock.held() && !LunLockBusy(&probe)) os::Unlink(path.c_str());
            }
        }
    }
}

}  // namespace

uint32_t RecordPending(const ORLOiSCSILun *lun, const char *op) {
    SzHashGuard hash(OLIBCSzHashAlloc(32));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzHashAlloc(32) failed");
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    if (!SetValue(hash.addr(), "op", op) || !SetValue(hash.addr(), "lid", std::to_string(lun->lid)) ||
        !SetValue(hash.addr(), "type", std::to_string(lun->type)) ||
        !SetValue(hash.addr(), "state_flags", std::to_string(lun->stateFlags)) ||
        !SetValue(hash.addr(), "blocksize", std::to_string(lun->blockSize)) ||
        !SetValue(hash.addr(), "bytes", std::to_string(lun->size)) || !SetValue(hash.addr(), "rootpath", lun->rootPath) ||
        !SetValue(hash.addr(), "name", lun->name)) {
        ORLO_LOG_ERR("OLIBCSzHashSetValue() failed for the pending record of %s", lun->uuid);
        return kErrSetHashValue;
    }
    FileLockGuard lock(kConfLockPath, true, kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kConfLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    const std::string section = SectionOf(lun->uuid);
    uint32_t ret = ORLOiSCSIPutSectionToConfig(kPendingConfPath, section.c_str(), hash.get());
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIPutSectionToConfig(\"%s\", \"%s\", %p) failed, err=%s", kPendingConfPath,
                     section.c_str(), static_cast<void *>(hash.get()), ORLOiSCSIErrStr(ret));
    return ret;
}

void ClearPending(const char *uuid) {
    if (!OLIBCFileExist(kPendingConfPath)) return;
    FileLockGuard lock(kConfLockPath, true, kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kConfLockPath);
        return;
    }
    SzListGuard list(OLIBCSzListAlloc(1));
    const std::string section = SectionOf(uuid);
    if (list.get() == nullptr || OLIBCSzListPush(list.addr(), section.c_str()) < 0) return;
    uint32_t ret = ORLOiSCSIRemoveSectionList(kPendingConfPath, list.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIRemoveSectionList(\"%s\", %p) failed, err=%s", kPendingConfPath,
                     static_cast<void *>(list.get()), ORLOiSCSIErrStr(ret));
        return;
    }
    // Nothing under way: the journal goes with its last record.
    SzListGuard left(nullptr);
    if (ORLOiSCSIConfSectionEnum(kPendingConfPath, left.addr()) == 0 && os::Unlink(kPendingConfPath) != 0 &&
        errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", kPendingConfPath);
}

void RecoverPending(bool creationLockHeld) {
    if (tRecovering) return;
    std::optional<FileLockGuard> creation;
    if (!creationLockHeld) {
        // Only when no creation runs; a busy creation lock means another process is at
        // work and will recover in its turn.
        creation.emplace(kCreationLockPath, true, 0);
        if (!creation->held()) return;
    }
    tRecovering = true;
    auto done = MakeScopeExit([] { tRecovering = false; });
    std::vector<PendingEntry> entries;
    if (LoadPending(&entries)) {
        for (PendingEntry &e : entries) {
            if (e.op == "delete" && LunLockBusy(&e.lun)) continue;  // its owner is still at it
            Recover(e);
        }
    }
    SweepStaleProgress();
}

}  // namespace lun
}  // namespace orlo
