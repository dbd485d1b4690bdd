/*
 * Snapshots: the snapshot record and its two files, the operation lock with its progress
 * file, application keys, and clone families.
 *
 * Records.  Every snapshot of a LUN is one section "SNAPSHOT_<snapshot uuid>" in the LUN's
 * snapshot file on its volume, "<volume>/@iSCSI/Snapshot/iscsi_snapshot_<LUN uuid>.conf",
 * which travels with the volume and is the authority; a copy of the same section lives in
 * a cache under /tmp/iscsi/snapshot_cache, spread over files by the first three characters
 * of the snapshot's UUID ("iscsi_snapshot_<abc>.conf.cache"), so that a snapshot can be
 * found by UUID without knowing its LUN.  Each file has a lock file of its own:
 * /tmp/iscsi/snapshot_conf_lock/iscsi_snapshot_<LUN uuid>.conf.lock and
 * /tmp/iscsi/snapshot_cache_lock/iscsi_snapshot_<abc>.conf.cache.lock, taken shared by
 * readers and exclusive by writers, 60 seconds.  Where both are held, the LUN's lock is
 * taken first.
 *
 * Operation lock.  An operation on one snapshot (creation, deletion, ...) holds
 * /tmp/iscsi/snapshot_lock/SN_<uuid>.lock (5 seconds to get it) and publishes its step in
 * /tmp/iscsi/SN_<uuid>.progress.  Application keys: backup or replication software
 * registers a key in /tmp/iscsi/snapshot_app_lock/SN_<uuid>.app.lock to keep a snapshot
 * from being deleted.
 *
 * Clone families: a LUN cloned from another LUN, or from one of its snapshots, keeps an
 * entry "FAMILY_L<lid>" (its own lid) in /usr/orlo/etc/iscsi_family_lun.conf naming its
 * parent, guarded by /tmp/iscsi/iscsi_family_lun.conf.lock.
 *
 * Every function returns 0 or a result code (orloiscsi_base.h), unless said otherwise, and
 * logs each failure once at LOG_ERR.  Lists are filled by the readers (appended at the
 * tail, in file order) and freed by the holder with ORLOiSCSISnapshotListFree; a reader
 * that fails leaves the list empty.  Threads: no in-process lock is taken; lock files
 * serialise processes and threads alike.  See docs/snapshots.md.
 */
#ifndef ORLOISCSI_SNAPSHOT_H
#define ORLOISCSI_SNAPSHOT_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#include "olibc.h"
#include "orlo_export.h"
#include "orloiscsi_list.h"
#include "orloiscsi_lun.h"

ORLO_EXTERN_C_BEGIN

/* ---- Sizes and ranges ---- */
#define ORLO_ISCSI_SID_MIN 1
#define ORLO_ISCSI_SID_MAX 256                 /* snapshot ids of one LUN: 1..256 */
#define ORLO_ISCSI_SNAPSHOT_NAME_LEN 255       /* characters of a name */
#define ORLO_ISCSI_SNAPSHOT_STATUS_LEN 31
#define ORLO_ISCSI_SNAPSHOT_NOTE_LEN 1023
#define ORLO_ISCSI_SNAPSHOT_ROOT_PATH_LEN 4094
#define ORLO_ISCSI_SNAPSHOT_TAKEN_BY_LEN 31
#define ORLO_ISCSI_SNAPSHOT_QUANTITY_LIMIT 256 /* most snapshots per LUN, whatever the setting */
#define ORLO_ISCSI_SNAPSHOT_DEFAULT_NAME "SnapShot-" /* default names: "SnapShot-<n>" */

/* ---- Snapshot types ("type" key) ---- */
#define ORLO_ISCSI_SNAPSHOT_TYPE_UNKNOWN 0     /* stored "UNKNOWN"; cannot be read back */
#define ORLO_ISCSI_SNAPSHOT_TYPE_ADV 1         /* advanced LUN snapshot, stored "ADV" */
#define ORLO_ISCSI_SNAPSHOT_TYPE_BLUN 2        /* block-level LUN snapshot, stored "BLUN" */

/* ---- conf_flags: options of one call, never stored ---- */
#define ORLO_ISCSI_SNAPSHOT_CONF_UNSYNC 0x02u     /* unsynchronised snapshot: its own lock file, no progress file */
#define ORLO_ISCSI_SNAPSHOT_CONF_NO_CACHE 0x10u   /* ORLOiSCSISnapshotConfAdd: leave the cache alone */
#define ORLO_ISCSI_SNAPSHOT_CONF_CACHE_ONLY 0x20u /* ORLOiSCSISnapshotConfAdd: write the cache copy only */

/* The snapshot record: one zeroed heap block per record, linked into a list through the
 * link at its end.  Strings are NUL-terminated inside their arrays. */
typedef struct _tag_ORLO_ISCSI_SNAPSHOT {
    int32_t lid;             /* parent LUN; key "lid" */
    int32_t sid;             /* 1..256, unique within the parent LUN; key "sid" */
    int32_t lock_fd;         /* the operation lock while ORLOiSCSISnapshotLock holds it, else -1 */
    uint32_t conf_flags;     /* ORLO_ISCSI_SNAPSHOT_CONF_*; not stored */
    int32_t type;            /* ORLO_ISCSI_SNAPSHOT_TYPE_*; key "type" */
    uint64_t total_size;     /* bytes; key "total_size" */
    uint64_t mappedSize;     /* bytes mapped (allocated); key "mappedSize" */
    int32_t time;            /* when the record was made, seconds since the epoch; key "time" */
    int32_t snapshot_time;   /* when the snapshot was taken; key "snapshot_time" */
    bool isAppConsistence;   /* taken application-consistent; key "isAppConsistence" */
    bool lock;               /* locked against deletion; key "lock" */
    char name[ORLO_ISCSI_SNAPSHOT_NAME_LEN + 1];          /* unique within the parent LUN */
    char status[ORLO_ISCSI_SNAPSHOT_STATUS_LEN + 1];      /* status word */
    char note[ORLO_ISCSI_SNAPSHOT_NOTE_LEN + 1];          /* free text, one line */
    char rootpath[ORLO_ISCSI_SNAPSHOT_ROOT_PATH_LEN + 1]; /* the parent LUN's volume */
    char taken_by[ORLO_ISCSI_SNAPSHOT_TAKEN_BY_LEN + 1];  /* user or schedule */
    char uuid[ORLO_ISCSI_UUID_LEN + 1];                   /* the snapshot's UUID */
    char parent_uuid[ORLO_ISCSI_UUID_LEN + 1];            /* the parent LUN's UUID */
    char version[ORLO_ISCSI_UUID_LEN + 1];                /* version string */
    ORLOiSCSIListLink link;  /* membership in a snapshot list */
} ORLOiSCSISnapshot;

/* A snapshot list (count and head); walk it with ORLO_ISCSI_SNAPSHOT_LIST_FOREACH. */
typedef ORLOiSCSIList ORLOiSCSISnapshotList;

/* The record of a link of a snapshot list. */
#define ORLO_ISCSI_SNAPSHOT_OF(linkPtr) ORLO_ISCSI_LIST_ENTRY(linkPtr, ORLOiSCSISnapshot, link)
/* for (each ORLOiSCSISnapshot *snapVar of listPtr); linkVar is an ORLOiSCSIListLink * cursor. */
#define ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(listPtr, linkVar, snapVar)                           \
    for ((linkVar) = (listPtr)->head.next;                                                    \
         (linkVar) != &(listPtr)->head && (((snapVar) = ORLO_ISCSI_SNAPSHOT_OF(linkVar)), 1); \
         (linkVar) = (linkVar)->next)

/* Removes and frees every record; the list is left empty.  NULL is ignored. */
ORLO_EXPORT void ORLOiSCSISnapshotListFree(ORLOiSCSISnapshotList *list);

/* ---- Filter: which sections a reader keeps ---- */
#define ORLO_ISCSI_SNAPSHOT_FILTER_ALL 0x000u        /* exactly 0: every section */
#define ORLO_ISCSI_SNAPSHOT_FILTER_ROOT_PATH 0x001u  /* "rootpath" equals rootpath */
#define ORLO_ISCSI_SNAPSHOT_FILTER_LID 0x002u        /* "lid" equals lid */
#define ORLO_ISCSI_SNAPSHOT_FILTER_SID 0x004u        /* "sid" equals sid */
#define ORLO_ISCSI_SNAPSHOT_FILTER_UUID 0x020u       /* "uuid" equals uuid */
#define ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE 0x040u     /* "snapshot_time" is less than time */
#define ORLO_ISCSI_SNAPSHOT_FILTER_NAME 0x080u       /* "name" equals name */
#define ORLO_ISCSI_SNAPSHOT_FILTER_PARENT_UUID 0x100u /* "parent_uuid" equals parent_uuid */
#define ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY 0x200u /* stop after the first accepted record */

/* A non-zero filter keeps a section that holds "rootpath", "lid", "sid", "uuid", "name" and
 * "snapshot_time" and passes every test whose bit is set; without BEFORE and PARENT_UUID it
 * must also have passed at least one equality test (FIRST_ONLY alone keeps nothing). */
typedef struct _tag_ORLO_ISCSI_SNAPSHOT_FILTER {
    uint32_t flags;
    int32_t lid;
    int32_t sid;
    const char *rootpath;
    const char *uuid;
    const char *name;
    const char *parent_uuid;
    int32_t time;            /* bound of ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE */
} ORLOiSCSISnapshotFilter;

/* ---- Writing and removing records ---- */

/* Writes the record's section into the cache and into its LUN's snapshot file (adding it,
 * or replacing the section of the same UUID), the cache first; conf_flags 0x10 leaves the
 * cache alone, 0x20 writes the cache only.  A record that could not be read back as written
 * is refused before anything is written: 18990513 "Bad snapshot_name" (empty, over 255
 * characters, not UTF-8, a control character or "]"), 18990518 "Bad snapshot_note" (a line
 * break), 18990520 "Bad snapshot UUID", 18990599 "Bad parent UUID", 18990004 for another
 * field.  When the LUN's file cannot be written after the cache was, the cache keeps the
 * copy (nothing is rolled back). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfAdd(const ORLOiSCSISnapshot *snap);
/* Removes the clone-family entries made from the snapshot, then its section from the LUN's
 * snapshot file and from the cache (a section or file that is not there is no error). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfDelete(const ORLOiSCSISnapshot *snap);
/* Drops every snapshot of the LUN from the cache and the family file, then removes the
 * LUN's snapshot file. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfDeleteByParentLun(const ORLOiSCSILun *lun);

/* ---- Reading records ---- */

/* Every section of the file at path that the filter keeps, appended to list.  Takes no
 * lock (the caller holds the file's).  A missing file adds nothing.  A kept section that
 * lacks a key fails the read with 18990033, an unknown "type" with 18990598. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoadWithPath(const ORLOiSCSISnapshotFilter *filter,
                                                       ORLOiSCSISnapshotList *list, const char *path);
/* The snapshot files of every LUN (backup objects aside), in the LUN file's order. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoad(const ORLOiSCSISnapshotFilter *filter, ORLOiSCSISnapshotList *list);
/* The LUN's snapshot file (its root path and uuid).  18990201 for a missing argument. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoadByParentLun(const ORLOiSCSILun *lun, const ORLOiSCSISnapshotFilter *filter,
                                                          ORLOiSCSISnapshotList *list);
/* The same for the LUN of that uuid (18990531 when there is none). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoadByParentUuid(const char *lunUuid, const ORLOiSCSISnapshotFilter *filter,
                                                           ORLOiSCSISnapshotList *list);
/* Every snapshot of the LUN of that lid (18990531 when there is none). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetByLid(int32_t lid, ORLOiSCSISnapshotList *list);
/* Copies the snapshot out (the whole record; its link is not a list member);
 * 18990532 "No such snapshot" when there is none, and then *snap is left as it was. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetBySid(int32_t lid, int32_t sid, ORLOiSCSISnapshot *snap);
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetByLidAndName(int32_t lid, const char *name, ORLOiSCSISnapshot *snap);
/* From the cache: the snapshot of that UUID, whatever its LUN. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetByUuid(const char *uuid, ORLOiSCSISnapshot *snap);
/* From a LUN's snapshot file on a volume (not the cache); 18990532 without a log line when
 * there is none. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfInVolumeLoadByUuid(const char *volume, const char *lunUuid,
                                                             const char *uuid, ORLOiSCSISnapshot *snap);

/* ---- The per-LUN snapshot file lock, held across several calls ----
 * A caller that must choose a snapshot's sid, name and UUID and write it as one step holds
 * the LUN's snapshot file lock (exclusive, 60 seconds) around ORLOiSCSISnapshotUnusedSidFind,
 * ORLOiSCSISnapshotUnusedNameFind, ORLOiSCSISnapshotUuidGenerate and
 * ORLOiSCSISnapshotConfAdd: while this thread holds it, the library's own takes of that lock
 * are free, and every other thread and process waits.  Only calls about that LUN may be made
 * under it.  Lock and Unlock pair up (they nest); C++ callers use the guard. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLock(const ORLOiSCSILun *lun);
ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfUnlock(const ORLOiSCSILun *lun);

/* ---- Choosing identities and counting ---- */

/* Whether a record of the list has exactly this name. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotIsNameUsed(const ORLOiSCSISnapshotList *list, const char *name, bool *used);
/* The number of snapshots of the LUN; -1 for a NULL LUN, and the result code itself when
 * they cannot be read (so that the limit counts as reached). */
ORLO_EXPORT int ORLOiSCSISnapshotQuantityGet(const ORLOiSCSILun *lun);
/* "max_snapshot_per_lun" of /etc.defaults/orloinfo.conf, at most 256; 256 when missing. */
ORLO_EXPORT int ORLOiSCSISnapshotQuantityLimitGet(void);
/* Whether the LUN has as many snapshots as the limit; false for a NULL LUN. */
ORLO_EXPORT bool ORLOiSCSISnapshotIsQuantityLimitReached(const ORLOiSCSILun *lun);
/* The smallest sid (1..256) that no snapshot of the list (or, with a NULL list, of the
 * LUN) has; -1 when all are taken or the LUN's snapshots cannot be read. */
ORLO_EXPORT int ORLOiSCSISnapshotUnusedSidFind(const ORLOiSCSILun *lun, const ORLOiSCSISnapshotList *list);
/* "SnapShot-<n>" with the smallest n from 1 that no snapshot of the LUN is named after;
 * "SnapShot-0" when 1..256 all are.  18990201 without a buffer, 18990050 when the name does
 * not fit. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnusedNameFind(int32_t lid, char *buf, size_t size);
/* A fresh UUID (37-byte buffer) that the cache does not hold.  The cache file searched is
 * the one named by the first three characters the buffer holds on entry. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotUuidGenerate(char *uuid);

/* ---- Operation lock and progress file ---- */

/* Steps published in the progress file. */
#define ORLO_ISCSI_SNAPSHOT_STEP_UNKNOWN (-1) /* the lock is held, nothing published */
#define ORLO_ISCSI_SNAPSHOT_STEP_CREATE 0
#define ORLO_ISCSI_SNAPSHOT_STEP_DELETE 1
#define ORLO_ISCSI_SNAPSHOT_STEP_IDLE 4

/* Takes the snapshot's operation lock (5 seconds) into snap->lock_fd and publishes step in
 * its progress file.  A lock held elsewhere gives 18990547 "Snapshot is locked", except for
 * a deletion (step 1), which goes on without it (lock_fd -1) and leaves the holder's
 * progress file alone. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotLock(ORLOiSCSISnapshot *snap, int step);
/* Removes the progress file and releases the lock; a record without the lock is logged and
 * succeeds. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnlock(ORLOiSCSISnapshot *snap);

/* What a snapshot's progress file and operation lock say. */
typedef struct _tag_ORLO_ISCSI_SNAPSHOT_PROGRESS {
    int32_t isLocked;     /* 1 while some handle holds the operation lock */
    int32_t hasProgress;  /* 1 when a progress file was read (stale if isLocked is 0) */
    int32_t step;         /* the published step while the lock is held; 4 (idle) when it is
                             free; -1 when it is held and nothing is published */
    int32_t lid;          /* "lid", "sid", "name", "totalBytes" of the progress file */
    int32_t sid;
    uint64_t totalBytes;
    char name[ORLO_ISCSI_SNAPSHOT_NAME_LEN + 1];
} ORLOiSCSISnapshotProgress;

/* Reads the snapshot's progress file and whether its lock is held. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotProgressGet(const ORLOiSCSISnapshot *snap, ORLOiSCSISnapshotProgress *progress);
/* Whether an operation runs on the snapshot (its step is not 4). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotIsLocked(const ORLOiSCSISnapshot *snap, bool *locked);
/* Waits, a second at a time, until no operation runs on the snapshot; seconds 0 waits
 * without end, else gives up with 18990010 "Timeout".  18990201 without a record. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotWaitUntilUnlock(const ORLOiSCSISnapshot *snap, int seconds);

/* ---- Application keys: 1 to 127 characters, no line break (else 18990524) ---- */

/* Registers the key (once: a key already there is not added again). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotLockByAppKey(const ORLOiSCSISnapshot *snap, const char *appKey);
/* Removes the key (a key not there is no error). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnlockByAppKey(const ORLOiSCSISnapshot *snap, const char *appKey);
/* Appends the registered keys to *ppList (a list of OLIBCSzListAlloc); the key file is
 * refused whole (18990008) when one of its lines is empty or longer than 127 characters. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotLockedAppKeysGet(const ORLOiSCSISnapshot *snap, POLIBC_SZLIST *ppList);
/* Whether at least one key is registered. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotIsLockedByApp(const ORLOiSCSISnapshot *snap, bool *locked);

/* ---- Taking and deleting snapshots ----
 * Advanced-family LUNs (every type with bits 0xF: ADV, SINK, VDISK_ADV, BKP_ADV) get "ADV"
 * snapshots: a map file "<volume>/@iSCSI/Snapshot/ADV/<lun uuid>/<uuid>/<uuid>_00000" that
 * the kernel fills by cloning the LUN's map file while the LUN stays online.  Block-family
 * LUNs (bits 0x107: BLUN, VDISK_BLUN) get "BLUN" snapshots: a read-only Btrfs snapshot
 * "<volume>/@iSCSI/Snapshot/BLUN/<lun uuid>/<uuid>" of the LUN's subvolume.  See
 * docs/snapshots.md. */
/* More conf_flags read by creation and deletion. */
#define ORLO_ISCSI_SNAPSHOT_CONF_TRASH 0x01u       /* made for the trash (map file in EP_unmap) */
#define ORLO_ISCSI_SNAPSHOT_CONF_NO_APP_KEY 0x04u  /* delete without the application-key check */
#define ORLO_ISCSI_SNAPSHOT_CONF_SCHEDULE 0x08u    /* taken by a schedule */
/* Takes a snapshot of lun.  The caller fills name (or leaves it empty for a free default
 * name), note, taken_by, isAppConsistence, conf_flags and, if it wants, snapshot_time; the
 * call completes the rest.  The LUN is locked for the call unless its stateFlags carry
 * ORLO_ISCSI_LUN_STATE_LOCKED.  A block snapshot is "Healthy" on return.  An advanced one is
 * recorded "Unhealthy" and finished by a background process that polls the kernel's clone
 * every 3 seconds and turns it "Healthy" with its version and mapped size; that process
 * holds the LUN's and the snapshot's locks until it ends (wait with
 * ORLOiSCSISnapshotWaitUntilUnlock).  Refusals: 18990500 (another type of LUN, before any
 * lock), 18990002 (space), 18990543 (the per-LUN limit), 18990513 (a name the LUN's
 * snapshots have, or a bad name), 18990408 (application plug-ins). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotCreate(ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap);
/* The read-only Btrfs snapshot of a block-family LUN; 18990058 when it exists. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotObjectCreateBLUN(const ORLOiSCSILun *lun, const ORLOiSCSISnapshot *snap);
/* The map file of an advanced snapshot, sized and stamped as a clone of the LUN's. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotObjectCreateADV(const ORLOiSCSILun *lun, const ORLOiSCSISnapshot *snap);
/* Application-consistent ways (the plug-ins quiesce and resume around the moment of the
 * snapshot; engine is not used and may be NULL). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotCreateBySubvol(const ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap, void *engine);
ORLO_EXPORT uint32_t ORLOiSCSISnapshotCreateByMirror(const ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap, void *engine);
/* The snapshot plug-ins in /usr/orlo/plugins/snapshot/app_consistent/: event -1 counts them
 * (negative on failure), event 4 asks them to quiesce, event 5 to resume (with result);
 * 0 or -1. */
ORLO_EXPORT int ORLOiSCSISnapshotLunPlugInNotify(const ORLOiSCSILun *lun, const ORLOiSCSISnapshot *snap, int event,
                                                 int result);
/* Whether the LUN's volume has room for one more snapshot (see docs/snapshots.md). */
ORLO_EXPORT bool ORLOiSCSISnapshotIsSpaceEnoughToCreate(const ORLOiSCSILun *lun);
/* The directories of a LUN's snapshots on its volume. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotMkdir(const ORLOiSCSISnapshot *snap);
/* An advanced snapshot's backstore under the extent pool's host, named
 * "LUN_<lun uuid>_SN_<uuid>" ("UNMAP_..." under the trash host for conf_flags 0x01,
 * "UNSYNC_..." for 0x02); 0 when it is there already / gone already. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotLoad(const ORLOiSCSISnapshot *snap);
ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnload(const ORLOiSCSISnapshot *snap);
/* Deletes a snapshot; 18990540 while an application holds it (unless conf_flags has 0x04).
 * deleter names who deletes it, for the event log (NULL for nobody in particular). */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotDelete(ORLOiSCSISnapshot *snap, const char *deleter);
ORLO_EXPORT uint32_t ORLOiSCSISnapshotDeleteWithoutCheckingAppKey(ORLOiSCSISnapshot *snap, const char *deleter);
/* Deletes every snapshot of the LUN and its snapshot file. */
ORLO_EXPORT uint32_t ORLOiSCSISnapshotDeleteByLun(const ORLOiSCSILun *lun);
/* Settles what a process killed half-way through a creation or deletion left: a snapshot
 * object whose record is missing goes (with any cached copy of the record), a record
 * whose object is missing goes; snapshots whose operation lock is held are left alone.
 * The caller holds the LUN's lock (snapshot creation and LUN deletion run it themselves).
 * The number of repairs, or -1 when the LUN's snapshots cannot be read. */
ORLO_EXPORT int ORLOiSCSISnapshotRepair(const ORLOiSCSILun *lun);

/* ---- Clone families ---- */

/* Removes the clone relations of LUN lid (1..1024) on either side: its own entry as a
 * clone and the entries that name it as parent (a LUN that is gone is nobody's parent, and
 * its lid may be given to a new LUN).  A missing file, or no such entry, is success and
 * leaves the file as it is. */
ORLO_EXPORT uint32_t ORLOiSCSILunFamilyConfRemove(int32_t lid);

ORLO_EXTERN_C_END

#ifdef __cplusplus
/* Holds a LUN's snapshot file lock for a scope (ORLOiSCSISnapshotConfLock and Unlock).
 * Check held(): a failure to take it has been logged. */
class ORLO_EXPORT ORLOiSCSISnapshotConfLockGuard {
  public:
    explicit ORLOiSCSISnapshotConfLockGuard(const ORLOiSCSILun *lun);
    ~ORLOiSCSISnapshotConfLockGuard();
    ORLOiSCSISnapshotConfLockGuard(const ORLOiSCSISnapshotConfLockGuard &) = delete;
    ORLOiSCSISnapshotConfLockGuard &operator=(const ORLOiSCSISnapshotConfLockGuard &) = delete;
    bool held() const { return held_; }

  private:
    bool held_;
    char lunUuid_[ORLO_ISCSI_UUID_LEN + 1];
};
#endif

#endif
