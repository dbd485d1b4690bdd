// Takes a snapshot of a LUN of the block family (a read-only subvolume of the LUN's) or of
// the advanced family (a copy of the LUN's map file, made by the kernel while the LUN
// stays online and finished in the background).
//
// In order: the LUN's type; its lock (unless the caller holds it: state flag 0x10), which
// keeps a second creation of the same LUN out until this one is done; the space; the count
// against the per-LUN limit, the name, the sid and the UUID; the record filled in; the
// snapshot's own lock; the plug-ins of an application-consistent snapshot; then the object
// and the record.  An advanced snapshot's record is written "Unhealthy" at once; a background
// process polls the kernel's clone every 3 seconds, and when it is done turns the record
// "Healthy" with its version and mapped size, takes the snapshot's backstore out of the
// kernel and releases both locks, which it has held since the fork.  A failure after the
// object was begun takes the object and the record away again.
#include <fcntl.h>
#include <signal.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <string>

#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_snapshot.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"
#include "lun/lun_create_internal.h"

namespace {

namespace sn = orlo::snap;

constexpr int kLunLockStep = 10;     // the LUN lock's operation code while a snapshot is taken
constexpr unsigned int kPollSec = 3; // the background process's look at the kernel's clone

// ---- The background finish of an advanced snapshot ----

// Everything but the two locks it inherited goes: the caller's descriptors (its pipes and
// terminal) must not be kept open by a process that lives on after the call.
void DetachFromCaller(int keepA, int keepB) {
    setsid();
    int null = orlo::os::Open("/dev/null", O_RDWR | O_CLOEXEC);
    for (int fd = 0; fd < 1024; ++fd) {
        if (fd == keepA || fd == keepB || fd == null) continue;
        if (fd <= 2 && null >= 0) {
            dup2(null, fd);
            continue;
        }
        close(fd);
    }
    if (null > 2) close(null);
    signal(SIGTERM, SIG_DFL);
    signal(SIGINT, SIG_IGN);
    signal(SIGHUP, SIG_IGN);
}

[[noreturn]] void FinishInBackground(ORLOiSCSILun lun, ORLOiSCSISnapshot snap, bool unlockLun, const char *map,
                                     const char *dir) {
    DetachFromCaller(snap.lock_fd, unlockLun ? lun.lockHandle : -1);
    int status;
    do {
        sleep(kPollSec);
        status = ORLOiSCSIEpMapFileCloneStatus(map, dir);
    } while (status > 0);
    uint32_t ret = ORLO_OK;
    if (status < 0) {
        ORLO_LOG_ERR("Failed to sync snapshot creating status. lid: %d, sid: %d", snap.lid, snap.sid);
        ret = sn::kErrTakeSnapshot;
    } else {
        snprintf(snap.status, sizeof(snap.status), "%s", "Healthy");
        if ((ret = ORLOiSCSIEpMapFileBaseVersionGet(map, snap.version)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpMapFileBaseVersionGet(\"%s\", %p) failed, err=%s", map,
                         static_cast<void *>(snap.version), ORLOiSCSIErrStr(ret));
            ret = sn::kErrBaseVersion;
        } else if ((ret = ORLOiSCSIEpMapFileMappedSizeGet(map, snap.rootpath, &snap.mappedSize)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpMapFileMappedSizeGet(\"%s\", \"%s\", %p) failed, err=%s", map, snap.rootpath,
                         static_cast<void *>(&snap.mappedSize), ORLOiSCSIErrStr(ret));
            ret = sn::kErrMappedSize;
        } else if ((ret = ORLOiSCSISnapshotConfAdd(&snap)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to update status of snapshot LUN to Healthy. lid: %d, sid: %d", snap.lid, snap.sid);
        } else {
            char when[32];
            time_t t = snap.snapshot_time;
            struct tm tmv;
            strftime(when, sizeof(when), "%Y/%m/%d %T", localtime_r(&t, &tmv));
            std::string text = std::string("Snapshot taken at ") + when + " by " + snap.taken_by;
            sn::Event(sn::kEventTaken, &lun, text.c_str());
        }
    }
    uint32_t u = ORLOiSCSISnapshotUnload(&snap);
    if (u != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSISnapshotUnload(%p) failed, err=%s", static_cast<void *>(&snap), ORLOiSCSIErrStr(u));
    if (ORLOiSCSISnapshotUnlock(&snap) != ORLO_OK)
        ORLO_LOG_ERR("Failed to unlock snapshot. sid: %d, name: %s, uuid: %s", snap.sid, snap.name, snap.uuid);
    if (unlockLun && ORLOiSCSILunUnlock(&lun) != ORLO_OK)
        ORLO_LOG_ERR("Failed to unlock LUN. lid: %d, name: %s", lun.lid, lun.name);
    _exit(ret == ORLO_OK ? 0 : 1);
}

// The kernel clone of an advanced snapshot, and the fork of the process that waits for it.
// On success *handedOver says the locks now belong to that process.
uint32_t CloneInKernel(ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap, bool unlockLun, bool *handedOver) {
    *handedOver = false;
    uint32_t ret = ORLOiSCSILunLoad(lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunLoad(%p) failed, err=%s", static_cast<void *>(lun), ORLOiSCSIErrStr(ret));
        return sn::kErrLoadLun;
    }
    if ((ret = ORLOiSCSISnapshotLoad(snap)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotLoad(%p) failed, err=%s", static_cast<void *>(snap), ORLOiSCSIErrStr(ret));
        return sn::kErrLoadSnapshot;
    }
    char lunDir[320];
    if ((ret = ORLOiSCSILunConfigfsDirPath(lun, lunDir, sizeof(lunDir))) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<void *>(lun),
                     static_cast<void *>(lunDir), sizeof(lunDir), ORLOiSCSIErrStr(ret));
        ORLOiSCSISnapshotUnload(snap);
        return ORLO_ERR_PARSE_STRING;
    }
    char lunMap[sn::kObjectPathSize], map[sn::kObjectPathSize], dir[sn::kObjectPathSize];
    if (ORLOiSCSILunMapPathGet(lun, lunMap, sizeof(lunMap)) != ORLO_OK ||
        sn::AdvMapPath(snap, map, sizeof(map)) != ORLO_OK || sn::ConfigfsDirPath(snap, dir, sizeof(dir)) != ORLO_OK) {
        ORLOiSCSISnapshotUnload(snap);
        return ORLO_ERR_PARSE_STRING;
    }
    if ((ret = ORLOiSCSIEpMapFileCloneStart(lunMap, lunDir, dir)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileCloneStart(\"%s\", \"%s\", \"%s\") failed, err=%s", lunMap, lunDir, dir,
                     ORLOiSCSIErrStr(ret));
        ORLOiSCSISnapshotUnload(snap);
        return ret;
    }
    pid_t child = OLIBCProcForkChildNoWait();
    if (child == 0) FinishInBackground(*lun, *snap, unlockLun, map, dir);
    if (child < 0) {
        ORLO_LOG_PLATFORM("OLIBCProcForkChildNoWait()");
        ORLOiSCSISnapshotUnload(snap);
        return sn::kErrFork;
    }
    // The background process holds the locks through the descriptors it inherited; they
    // are only closed here, never unlocked (that would release them for it too).
    close(snap->lock_fd);
    snap->lock_fd = -1;
    if (unlockLun) {
        close(lun->lockHandle);
        lun->lockHandle = -1;
    }
    *handedOver = true;
    return ORLO_OK;
}

// The LUN's snapshots counted against the limit, the name checked (a default one chosen
// when none was given), the smallest free sid, a fresh UUID, and the record filled in.
// Creations of one LUN are serialised by the LUN's lock, which covers these choices and
// the record's write that follows.
uint32_t Identify(const ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap, bool adv) {
    ORLOiSCSISnapshotList list = {};
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list] { ORLOiSCSISnapshotListFree(&list); });
    uint32_t ret = ORLOiSCSISnapshotConfGetByLid(lun->lid, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get snapshots' info for lid: %d", lun->lid);
        return ret;
    }
    if (list.count >= ORLOiSCSISnapshotQuantityLimitGet()) {
        ORLO_LOG_ERR("Maximum snapshot count reached.");
        sn::Event(sn::kEventOutOfSpace, lun, "Maximum snapshot count reached");
        return sn::kErrMaxCount;
    }
    if (snap->name[0] == '\0') {
        if ((ret = ORLOiSCSISnapshotUnusedNameFind(lun->lid, snap->name, sizeof(snap->name))) != ORLO_OK) return ret;
    }
    bool used = false;
    if ((ret = ORLOiSCSISnapshotIsNameUsed(&list, snap->name, &used)) != ORLO_OK) return ret;
    if (used) {
        ORLO_LOG_ERR("Duplicated snapshot name. lid: %d, name: %s", lun->lid, snap->name);
        return sn::kErrBadName;
    }
    snap->sid = ORLOiSCSISnapshotUnusedSidFind(lun, &list);
    if (snap->sid < 0) {
        ORLO_LOG_ERR("Failed to get unused sid from LUN: %d", lun->lid);
        return sn::kErrUnusedSid;
    }
    memset(snap->uuid, 0, sizeof(snap->uuid));
    if ((ret = ORLOiSCSISnapshotUuidGenerate(snap->uuid)) != ORLO_OK) return ret;

    const time_t now = time(nullptr);
    snap->lid = lun->lid;
    snap->total_size = lun->size;
    snap->mappedSize = 0;
    snap->time = static_cast<int32_t>(now);
    if (snap->snapshot_time == 0) snap->snapshot_time = static_cast<int32_t>(now);
    snprintf(snap->rootpath, sizeof(snap->rootpath), "%s", lun->rootPath);
    snprintf(snap->parent_uuid, sizeof(snap->parent_uuid), "%s", lun->uuid);
    snap->type = adv ? ORLO_ISCSI_SNAPSHOT_TYPE_ADV : ORLO_ISCSI_SNAPSHOT_TYPE_BLUN;
    snprintf(snap->status, sizeof(snap->status), "%s", adv ? "Unhealthy" : "Healthy");
    snap->version[0] = '\0';
    ORLO_LOG_WEBAPI_DEBUG("Snapshot UUID: %s ,snapshot ID: %d", snap->uuid, snap->sid);
    return ORLO_OK;
}

uint32_t AddRecord(ORLOiSCSISnapshot *snap, bool *added) {
    uint32_t ret = ORLOiSCSISnapshotConfAdd(snap);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to add Snapshot config from parent-lid:%d, sid:%d", snap->lid, snap->sid);
        return ret;
    }
    *added = true;
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotCreate(ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap) {
    if (lun == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    const bool adv = sn::IsAdvFamily(lun->type);
    if (!adv && !sn::IsBlockFamily(lun->type)) {
        ORLO_LOG_ERR("Do not support snapshot with this type of LUN. type: %u (%s)", lun->type,
                     ORLOiSCSILunTypeName(lun->type));
        return sn::kErrBadLunType;
    }
    // What the record will be written with is checked before any lock is taken.
    snap->lock_fd = -1;
    {
        ORLOiSCSISnapshot probe = *snap;
        snprintf(probe.uuid, sizeof(probe.uuid), "%s", "00000000-0000-0000-0000-000000000000");
        snprintf(probe.parent_uuid, sizeof(probe.parent_uuid), "%s", lun->uuid);
        snprintf(probe.rootpath, sizeof(probe.rootpath), "%s", lun->rootPath);
        if (probe.name[0] == '\0') snprintf(probe.name, sizeof(probe.name), "%s", "SnapShot-1");
        probe.type = adv ? ORLO_ISCSI_SNAPSHOT_TYPE_ADV : ORLO_ISCSI_SNAPSHOT_TYPE_BLUN;
        uint32_t ret = sn::CheckRecord(&probe, true);
        if (ret != ORLO_OK) return ret;
    }

    const bool lockLun = (lun->stateFlags & ORLO_ISCSI_LUN_STATE_LOCKED) == 0;
    uint32_t ret;
    if (lockLun && (ret = ORLOiSCSILunLock(lun, kLunLockStep)) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to lock LUN. lid: %d, name: %s", lun->lid, lun->name);
        return ret;
    }
    bool handedOver = false;  // the locks went to the background process
    bool added = false, objectBegun = false, snapLocked = false;
    auto finish = orlo::MakeScopeExit([&] {
        if (snapLocked && !handedOver && ORLOiSCSISnapshotUnlock(snap) != ORLO_OK)
            ORLO_LOG_ERR("Failed to unlock snapshot. sid: %d, name: %s, uuid: %s", snap->sid, snap->name, snap->uuid);
        if (lockLun && !handedOver && ORLOiSCSILunUnlock(lun) != ORLO_OK)
            ORLO_LOG_ERR("Failed to unlock LUN. lid: %d, name: %s", lun->lid, lun->name);
    });

    ret = [&]() -> uint32_t {
        // With the LUN locked no other creation of it runs: what a killed one left is
        // settled first, so the count and the names below are those of real snapshots.
        if (ORLOiSCSISnapshotRepair(lun) < 0) ORLO_LOG_ERR("Failed to repair the snapshots of LUN %s", lun->name);
        if (!ORLOiSCSISnapshotIsSpaceEnoughToCreate(lun)) {
            ORLO_LOG_ERR("Out of volume space");
            sn::Event(sn::kEventOutOfSpace, lun, "Out of volume space");
            return sn::kErrOutOfSpace;
        }
        uint32_t r = Identify(lun, snap, adv);
        if (r != ORLO_OK) return r;
        if ((r = ORLOiSCSISnapshotLock(snap, ORLO_ISCSI_SNAPSHOT_STEP_CREATE)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to lock snapshot. sid: %d, name: %s, uuid: %s", snap->sid, snap->name, snap->uuid);
            return r;
        }
        snapLocked = true;
        bool appWay = false;
        if (snap->isAppConsistence) {
            int plugins = ORLOiSCSISnapshotLunPlugInNotify(lun, snap, -1, 0);
            if (plugins < 0) {
                ORLO_LOG_ERR("Failed to Notify PlugIn Lun, lid:%d", lun->lid);
                return sn::kErrPluginNotify;
            }
            appWay = plugins > 0;  // no plug-in: the plain way
        }
        objectBegun = true;
        if (!adv) {
            if (appWay) {
                added = true;  // it writes the record itself; taken away with the rest on failure
                return ORLOiSCSISnapshotCreateBySubvol(lun, snap, nullptr);
            }
            if ((r = ORLOiSCSISnapshotObjectCreateBLUN(lun, snap)) != ORLO_OK) {
                ORLO_LOG_ERR("Failed to Snapshot lun, parent's lid:%d, child sid:%d", lun->lid, snap->sid);
                return r;
            }
            return AddRecord(snap, &added);
        }
        if ((r = ORLOiSCSISnapshotObjectCreateADV(lun, snap)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to Snapshot lun, parent's lid:%d, child sid:%d", lun->lid, snap->sid);
            return r;
        }
        if ((r = AddRecord(snap, &added)) != ORLO_OK) return r;
        if (appWay) return ORLOiSCSISnapshotCreateByMirror(lun, snap, nullptr);
        return CloneInKernel(lun, snap, lockLun, &handedOver);
    }();

    if (ret != ORLO_OK && (objectBegun || added)) {
        // Rollback: the object, then the record.
        if (objectBegun && adv) {
            char map[sn::kObjectPathSize], dir[sn::kObjectPathSize];
            if (sn::AdvMapPath(snap, map, sizeof(map)) == ORLO_OK && orlo::os::Unlink(map) != 0 && errno != ENOENT)
                ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", map);
            if (sn::AdvSnapshotDir(snap, dir, sizeof(dir)) == ORLO_OK && orlo::os::Rmdir(dir) != 0 && errno != ENOENT)
                ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        } else if (objectBegun) {
            char subvol[sn::kObjectPathSize];
            if (sn::BlunSubvolPath(snap, subvol, sizeof(subvol)) == ORLO_OK && ORLOBtrfsDeleteSubvolFaultTolerant(subvol) != 0)
                ORLO_LOG_PLATFORM("ORLOBtrfsDeleteSubvolFaultTolerant(\"%s\")", subvol);
        }
        if (added && ORLOiSCSISnapshotConfDelete(snap) != ORLO_OK)
            ORLO_LOG_ERR("Failed to remove family config for sid: %d, lid: %d", snap->sid, snap->lid);
        char lunDir[sn::kObjectPathSize];
        if (sn::LunSnapshotDir(lun->rootPath, snap->type, lun->uuid, lunDir, sizeof(lunDir)) == ORLO_OK &&
            orlo::os::Rmdir(lunDir) != 0 && errno != ENOENT && errno != ENOTEMPTY && errno != EEXIST)
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", lunDir);
    }
    return ret;
}
