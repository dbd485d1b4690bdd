/*
 * LUNs: the LUN record, its configuration sections, its directory and data paths on a
 * volume, and the per-LUN operation lock with its progress file.
 *
 * Every LUN has a section "LUN_<uuid>" in /usr/orlo/etc/iscsi_lun.conf; a LUN whose data
 * is a file on a volume (type bits 0x3 both set) has a copy of it in that volume's
 * "<volume>/@iSCSI/LUN/iscsi_lun.conf".  Both files are guarded by the one lock file
 * /tmp/iscsi/iscsi_lun.conf.lock: readers take it shared, writers exclusive, 60 seconds.
 * The functions named "...ConfSet", "...ConfRemove" and the readers take it themselves;
 * ORLOiSCSILunGlobalConfSetSection, ORLOiSCSILunVolumeConfSetSection,
 * ORLOiSCSILunGlobalConfRemove and ORLOiSCSILunVolumeConfRemove expect the caller to hold it.
 *
 * An operation on one LUN holds the LUN's lock (ORLOiSCSILunLock) for its whole length,
 * across processes, and publishes what it does in /tmp/iscsi/LUN_<uuid>.progress.
 *
 * Every function returns 0 or a result code (orloiscsi_base.h) and logs each failure once
 * at LOG_ERR.  Lists are filled by the readers and freed by the caller with
 * ORLOiSCSILunListFree.  Threads: no in-process lock is taken; lock files serialise
 * processes and threads alike.  See docs/luns.md.
 */
#ifndef ORLOISCSI_LUN_H
#define ORLOISCSI_LUN_H

#include <stddef.h>
#include <stdint.h>

#include "olibc.h"
#include "orlo_export.h"
#include "orloiscsi_list.h"

ORLO_EXTERN_C_BEGIN

/* ---- Sizes ---- */
#define ORLO_ISCSI_LID_MIN 1
#define ORLO_ISCSI_LID_MAX 1024
#define ORLO_ISCSI_UUID_LEN 36            /* characters of a textual UUID */
#define ORLO_ISCSI_LUN_ROOT_PATH_LEN 4094 /* characters of a root path */
#define ORLO_ISCSI_LUN_NAME_LEN 255       /* characters of a LUN name */

/* ---- LUN type: a bit set; only the combinations below are types ---- */
#define ORLO_ISCSI_LUN_BIT_LUN 0x1u      /* every LUN */
#define ORLO_ISCSI_LUN_BIT_FILE 0x2u     /* data is a file on a volume */
#define ORLO_ISCSI_LUN_BIT_THIN 0x4u     /* space not allocated ahead */
#define ORLO_ISCSI_LUN_BIT_ADV 0x8u      /* advanced: data in the volume's extent pool */
#define ORLO_ISCSI_LUN_BIT_SINK 0x10u
#define ORLO_ISCSI_LUN_BIT_VDISK 0x20u   /* virtual disk */
#define ORLO_ISCSI_LUN_BIT_BKP 0x40u     /* backup object */
#define ORLO_ISCSI_LUN_BIT_CINDER 0x80u
#define ORLO_ISCSI_LUN_BIT_BLUN 0x100u   /* block-level LUN (a Btrfs subvolume) */

#define ORLO_ISCSI_LUN_TYPE_BLOCK 1u
#define ORLO_ISCSI_LUN_TYPE_FILE 3u
#define ORLO_ISCSI_LUN_TYPE_THIN 7u
#define ORLO_ISCSI_LUN_TYPE_ADV 15u
#define ORLO_ISCSI_LUN_TYPE_SINK 31u
#define ORLO_ISCSI_LUN_TYPE_VDISK_ADV 47u
#define ORLO_ISCSI_LUN_TYPE_BKP_THIN 71u
#define ORLO_ISCSI_LUN_TYPE_BKP_ADV 79u
#define ORLO_ISCSI_LUN_TYPE_CINDER 143u
#define ORLO_ISCSI_LUN_TYPE_BLUN 263u
#define ORLO_ISCSI_LUN_TYPE_VDISK_BLUN 295u

/* True when every bit of mask is set in type. */
#define ORLO_ISCSI_LUN_TYPE_HAS(type, mask) ((((uint32_t)(type)) & (mask)) == (mask))
/* A LUN whose data is a file on a volume (and so has a volume copy of its section). */
#define ORLO_ISCSI_LUN_IS_FILE_BACKED(type) ORLO_ISCSI_LUN_TYPE_HAS(type, 0x3u)
/* An advanced LUN (all of bits 0xF). */
#define ORLO_ISCSI_LUN_IS_ADV(type) ORLO_ISCSI_LUN_TYPE_HAS(type, 0xFu)

/* ---- Run-time state flags (never stored) ---- */
#define ORLO_ISCSI_LUN_STATE_EP_UNMAP 0x1u    /* map file under "<volume>/@iSCSI/EP_unmap" */
#define ORLO_ISCSI_LUN_STATE_KEEP_VOLUME_CONF 0x2u /* do not touch the volume's copy on removal */
#define ORLO_ISCSI_LUN_STATE_UNSYNC 0x4u      /* unsynchronised LUN (replication destination) */
#define ORLO_ISCSI_LUN_STATE_LOCKED 0x10u     /* the caller holds the LUN's lock already */
#define ORLO_ISCSI_LUN_STATE_TMP 0x20u        /* lives under "<volume>/@iSCSI/tmp" */

/* The LUN record.  Strings are NUL-terminated inside their arrays. */
typedef struct _tag_ORLO_ISCSI_LUN {
    int32_t lid;              /* 1..1024; key "lid" */
    int32_t lockHandle;       /* handle of the LUN lock while this record holds it, else -1 */
    uint32_t stateFlags;      /* ORLO_ISCSI_LUN_STATE_* */
    uint32_t blockSize;       /* 512 or 4096; key "blocksize" */
    uint32_t extentSize;      /* extent size of an advanced LUN's pool, else 0 */
    uint64_t size;            /* bytes; key "bytes" */
    int32_t restoredTime;     /* last restore, seconds since the epoch, 0 if none */
    uint32_t type;            /* ORLO_ISCSI_LUN_TYPE_* */
    char uuid[ORLO_ISCSI_UUID_LEN + 1];
    char vpdUnitSerial[ORLO_ISCSI_UUID_LEN + 1];  /* SCSI VPD page 0x80 unit serial */
    char rootPath[ORLO_ISCSI_LUN_ROOT_PATH_LEN + 1]; /* "/volumeN", a "/dev" path, or "" */
    char name[ORLO_ISCSI_LUN_NAME_LEN + 1];          /* unique */
} ORLOiSCSILun;

/* An element of a LUN list: the record followed by its link, one zeroed heap block. */
typedef struct _tag_ORLO_ISCSI_LUN_ELEM {
    ORLOiSCSILun lun;
    ORLOiSCSIListLink link;
} ORLOiSCSILunElem;

/* A LUN list (count and head); walk it with ORLO_ISCSI_LUN_LIST_FOREACH. */
typedef ORLOiSCSIList ORLOiSCSILunList;

/* The record of a link of a LUN list. */
#define ORLO_ISCSI_LUN_OF(linkPtr) (&ORLO_ISCSI_LIST_ENTRY(linkPtr, ORLOiSCSILunElem, link)->lun)
/* for (each ORLOiSCSILun *lunVar of listPtr); linkVar is an ORLOiSCSIListLink * cursor. */
#define ORLO_ISCSI_LUN_LIST_FOREACH(listPtr, linkVar, lunVar)                               \
    for ((linkVar) = (listPtr)->head.next;                                                  \
         (linkVar) != &(listPtr)->head && (((lunVar) = ORLO_ISCSI_LUN_OF(linkVar)), 1);     \
         (linkVar) = (linkVar)->next)

/* ---- Filter ---- */
#define ORLO_ISCSI_LUN_FILTER_ROOT_PATH 0x2u      /* "rootpath" equals rootPath */
#define ORLO_ISCSI_LUN_FILTER_NAME 0x10u          /* "name" equals name */
#define ORLO_ISCSI_LUN_FILTER_LID 0x20u           /* "lid" equals lid (decides alone) */
#define ORLO_ISCSI_LUN_FILTER_LID_ARRAY 0x80u     /* "lid" is one of lids[0..lidCount) */
#define ORLO_ISCSI_LUN_FILTER_MAPPED_ONLY 0x200u  /* keep mapped objects (configuration snapshot) */
#define ORLO_ISCSI_LUN_FILTER_BKP 0x400u          /* with backup objects (in ALL_WITH_BKP) */
#define ORLO_ISCSI_LUN_FILTER_VAAI 0x800u         /* only "vaai_support" yes */
#define ORLO_ISCSI_LUN_FILTER_LOAD_TARGETS 0x1000u
#define ORLO_ISCSI_LUN_FILTER_LOAD_LUNS 0x2000u   /* set by every LUN read */
#define ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS 0x4000u
#define ORLO_ISCSI_LUN_FILTER_UUID 0x100000u      /* "uuid" equals uuid */
#define ORLO_ISCSI_LUN_FILTER_NO_BKP_BLUN_VDISK 0x200000u /* leave out backup objects, devtype 5-7 */
#define ORLO_ISCSI_LUN_FILTER_FIRST_ONLY 0x400000u /* stop after the first accepted LUN */
#define ORLO_ISCSI_LUN_FILTER_ALL 0x7000u          /* exactly: every LUN but backup objects */
#define ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP 0x7400u /* exactly: every LUN */

typedef struct _tag_ORLO_ISCSI_LUN_FILTER {
    uint32_t flags;
    int32_t lid;
    const char *rootPath;
    const char *name;
    const char *uuid;
    const int32_t *lids;
    int32_t lidCount;
    /* Target and mapping criteria, read by the configuration snapshot (orloiscsi_conf.h):
     * 0x0001 tid, 0x0004 target name (in name), 0x0008 iqn, 0x0100 tids[0..tidCount),
     * 0x0040 mapping LUN number. */
    int32_t tid;
    int32_t lun;
    const char *iqn;
    const int32_t *tids;
    int32_t tidCount;
} ORLOiSCSILunFilter;

/* ---- Type names ---- */

/* "BLOCK", "FILE", "THIN", "ADV", "SINK", "VDISK_ADV", "BKP_THIN", "BKP_ADV", "CINDER",
 * "BLUN", "VDISK_BLUN", or "UNKNOWN" for any other value; never NULL. */
ORLO_EXPORT const char *ORLOiSCSILunTypeName(uint32_t type);

/* ---- Reading ---- */

/* Every accepted LUN section of the file at path, appended to list in file order.  A
 * missing file is an empty result.  On failure the list is left empty. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfLoadByPath(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list,
                                                const char *path);
/* The same on /usr/orlo/etc/iscsi_lun.conf. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfLoad(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list);
/* The LUNs of a configuration snapshot (ORLOiSCSIConfGet) taken with filter, appended to
 * list; with 0x200 only those a loaded mapping points to.  On failure the list is left
 * empty. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfLoadByFilter(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list);
/* Every LUN (flags 0x7000 | extraFlags: backup objects only with 0x400). */
ORLO_EXPORT uint32_t ORLOiSCSILunConfGetAll(ORLOiSCSILunList *list, uint32_t extraFlags);
/* The LUN with that lid (flags 0x2020 | extraFlags). */
ORLO_EXPORT uint32_t ORLOiSCSILunConfGetByLid(int32_t lid, uint32_t extraFlags, ORLOiSCSILunList *list);
/* The LUN with that name (flags 0x2010 | extraFlags). */
ORLO_EXPORT uint32_t ORLOiSCSILunConfGetByLunName(const char *name, uint32_t extraFlags, ORLOiSCSILunList *list);
/* Copies the LUN with that uuid into *lun, replacing the whole record (lock handle -1, no
 * state flags: do not reload a record that holds the LUN lock); 18990531 when there is none,
 * and then *lun is left as it was. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfGetByUuid(const char *uuid, ORLOiSCSILun *lun);
/* Every LUN of a volume's copy "<volume>/@iSCSI/LUN/iscsi_lun.conf", backup objects too. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfInVolumeLoad(const char *volume, ORLOiSCSILunList *list);
/* Copies the LUN with that uuid from a volume's copy into *lun; 18990531 when none. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfInVolumeLoadByUuid(const char *volume, const char *uuid, ORLOiSCSILun *lun);
/* Fills *lun from the keys of one section (lock handle -1, state flags untouched). */
ORLO_EXPORT uint32_t ORLOiSCSILunStructCreate(ORLOiSCSILun *lun, const OLIBC_SZHASH *section);
/* Removes and frees every element; the list is left empty.  NULL is ignored. */
ORLO_EXPORT void ORLOiSCSILunListFree(ORLOiSCSILunList *list);

/* ---- Writing and removing ---- */

/* Writes the LUN's section into the global file and, for a file-backed LUN, into its
 * volume's copy (making the LUN's directory when the section is new).  Refuses a record
 * that could not be read back as written (18990004) before anything is written. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfSet(const ORLOiSCSILun *lun);
/* One of the two files; the caller holds /tmp/iscsi/iscsi_lun.conf.lock. */
ORLO_EXPORT uint32_t ORLOiSCSILunGlobalConfSetSection(const ORLOiSCSILun *lun);
ORLO_EXPORT uint32_t ORLOiSCSILunVolumeConfSetSection(const ORLOiSCSILun *lun);
/* Removes the LUN's clone relations, mappings and section from the global file, and its
 * section from the volume's copy unless state flag 0x2 is set. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfRemove(const ORLOiSCSILun *lun);
/* One of the two files; the caller holds /tmp/iscsi/iscsi_lun.conf.lock. */
ORLO_EXPORT uint32_t ORLOiSCSILunGlobalConfRemove(const ORLOiSCSILun *lun);
ORLO_EXPORT uint32_t ORLOiSCSILunVolumeConfRemove(const ORLOiSCSILun *lun);

/* ---- Directories and paths on the volume ---- */

/* Makes "<volume>/@iSCSI/LUN" and the LUN's directory "<volume>/@iSCSI/LUN/<type>/<uuid>"
 * (or "<volume>/@iSCSI/tmp/<uuid>" with state flag 0x20).  BLUN and VDISK_BLUN get a Btrfs
 * subvolume where the volume is Btrfs.  An existing directory is fine. */
ORLO_EXPORT uint32_t ORLOiSCSILunMkdir(const ORLOiSCSILun *lun);
/* The LUN's directory (as above) into buf; 18990050 when it does not fit. */
ORLO_EXPORT uint32_t ORLOiSCSILunDirPathGet(const ORLOiSCSILun *lun, char *buf, size_t size);
/* The LUN's data file number fileNo: "<volume>/@iSCSI/LUN/<type>/<uuid>/<uuid>_%05d", or
 * "<volume>/@iSCSI/tmp/<uuid>/<uuid>_%05d" with state flag 0x20, or
 * "<volume>/@iSCSI/EP_unmap/<uuid>" with state flag 0x1; 18990050 when it does not fit. */
ORLO_EXPORT uint32_t ORLOiSCSILunDataPathGet(const ORLOiSCSILun *lun, int fileNo, char *buf, size_t size);
/* An advanced LUN's map file: its data file number 0. */
ORLO_EXPORT uint32_t ORLOiSCSILunMapPathGet(const ORLOiSCSILun *lun, char *buf, size_t size);

/* ---- LUN lock and progress file ---- */

/* Operation codes ("step") known to the lock. */
#define ORLO_ISCSI_LUN_STEP_CREATE 3
#define ORLO_ISCSI_LUN_STEP_5 5   /* a busy lock is no error for this step */
#define ORLO_ISCSI_LUN_STEP_6 6

/* Takes the LUN's lock (5 seconds; 18990535 when another holder keeps it) and writes its
 * progress file.  With step 5 a busy lock returns 0 without the lock (lockHandle -1). */
ORLO_EXPORT uint32_t ORLOiSCSILunLock(ORLOiSCSILun *lun, int step);
/* Removes the progress file and releases the lock; a record without the lock is logged
 * and succeeds. */
ORLO_EXPORT uint32_t ORLOiSCSILunUnlock(ORLOiSCSILun *lun);

/* What a LUN's progress file and lock say. */
typedef struct _tag_ORLO_ISCSI_LUN_PROGRESS {
    int32_t isLocked;       /* 1 while some handle holds the LUN lock (the locker is alive) */
    int32_t hasProgress;    /* 1 when a progress file was read (it may be stale if isLocked is 0) */
    int32_t lid;            /* "lid" */
    int32_t pid;            /* "pid": the locking process */
    int32_t step;           /* "step": the operation code given to ORLOiSCSILunLock */
    uint64_t totalBytes;    /* "total_bytes" */
    char orgPath[ORLO_ISCSI_LUN_ROOT_PATH_LEN + 1]; /* "org_path" */
    char newPath[ORLO_ISCSI_LUN_ROOT_PATH_LEN + 1]; /* "new_path" */
    char name[ORLO_ISCSI_LUN_NAME_LEN + 1];         /* "name" */
} ORLOiSCSILunProgress;

/* Reads the LUN's progress file (none for an unsynchronised LUN) and whether its lock is
 * held.  A missing progress file is success with hasProgress 0. */
ORLO_EXPORT uint32_t ORLOiSCSILunProgressGet(const ORLOiSCSILun *lun, ORLOiSCSILunProgress *progress);
/* Whether an operation holds the LUN's lock. */
ORLO_EXPORT uint32_t ORLOiSCSILunIsLocked(const ORLOiSCSILun *lun, int *locked);
/* Waits, a second at a time, until the LUN is not locked; seconds 0 waits without end,
 * else gives up with 18990010 after that many seconds. */
ORLO_EXPORT uint32_t ORLOiSCSILunWaitUntilUnlock(const ORLOiSCSILun *lun, int seconds);

/* ---- Creation ---- */

/* The most LUNs the appliance takes: "max_iscsiluns" of /etc.defaults/orloinfo.conf,
 * 256 when missing or negative. */
ORLO_EXPORT int ORLOiSCSILunQuantityLimitGet(void);
/* Whether the number of LUNs has reached that limit. */
ORLO_EXPORT uint32_t ORLOiSCSILunIsQuantityLimitReached(int *reached);
/* Whether some LUN has that name. */
ORLO_EXPORT uint32_t ORLOiSCSILunIsNameExist(const char *name, int *exists);
/* The smallest lid no LUN uses; -1 on failure. */
ORLO_EXPORT int ORLOiSCSILunUnusedLidGet(void);
/* A new UUID string (37-byte buffer) that no LUN uses. */
ORLO_EXPORT uint32_t ORLOiSCSILunUuidGenerate(char *uuid);
/* Whether the LUN's volume has room for it (see docs/luns.md for the rule);
 * 18990584 "Failed to pass space check" when not. */
ORLO_EXPORT uint32_t ORLOiSCSILunIsSpaceEnoughToCreate(const ORLOiSCSILun *lun);
/* Makes the LUN's backing object by type: a grown data file, an advanced LUN's map file,
 * or the binding of a BLOCK LUN to its device.  May lower lun->size when space ran short. */
ORLO_EXPORT uint32_t ORLOiSCSILunObjectCreate(ORLOiSCSILun *lun);
ORLO_EXPORT uint32_t ORLOiSCSILunObjectCreateFILE(ORLOiSCSILun *lun);
ORLO_EXPORT uint32_t ORLOiSCSILunObjectCreateBLOCK(ORLOiSCSILun *lun);
/* Creates a LUN from a filled record (name, type, size, root path, block size; lid, uuid
 * and serial optional).  On success the record holds the assigned lid, uuid and serial. */
ORLO_EXPORT uint32_t ORLOiSCSILunCreate(ORLOiSCSILun *lun);

/* ---- Loading into and unloading from the kernel target ---- */

/* The LUN's backstore directory under its host directory ("LUN_<uuid>", "UNMAP_LUN_<uuid>"
 * with state flag 0x1, "UNSYNC_LUN_<uuid>" with 0x4). */
ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsDirPath(const ORLOiSCSILun *lun, char *buf, size_t size);
/* Writes the backstore's "control" file. */
ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsControl(const ORLOiSCSILun *lun, const char *control);
/* Writes the backstore's "enable" file (1 or 0). */
ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsEnable(const ORLOiSCSILun *lun, int enable);
/* The control string that tells the kernel where the LUN's data lies (640 bytes). */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPrepareControlInitString(const ORLOiSCSILun *lun, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpControlInitString(const ORLOiSCSILun *lun, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileControlInitString(const ORLOiSCSILun *lun, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsBlockControlInitString(const ORLOiSCSILun *lun, char *buf, size_t size);
/* Makes the LUN a kernel backstore; a loaded LUN is left as it is. */
ORLO_EXPORT uint32_t ORLOiSCSILunLoad(const ORLOiSCSILun *lun);
/* Whether the LUN's backstore exists in the kernel. */
ORLO_EXPORT uint32_t ORLOiSCSILunIsLoaded(const ORLOiSCSILun *lun, int *loaded);
/* Takes the LUN's backstore out of the kernel; one still linked by a target is refused
 * (18990534 "LUN is mapped"); a LUN not loaded is success. */
ORLO_EXPORT uint32_t ORLOiSCSILunUnload(const ORLOiSCSILun *lun);

/* Writes the LUN backstore's attrib/<attr> (the backstore must be loaded). */
ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsAttribSet(const ORLOiSCSILun *lun, const char *attr, const char *value);

/* ---- Deletion ---- */

/* Whether a mapping of the LUN is stored (iSCSI_MAP_T*_L<lid> in the mapping file). */
ORLO_EXPORT uint32_t ORLOiSCSILunIsMapped(const ORLOiSCSILun *lun, int *mapped);
/* Deletes a LUN: refuses a mapped one (18990534) and a locked one (18990535), holds its
 * lock, unloads it, moves an advanced LUN's map file into the volume's EP trash and gives
 * its extents back in the background, removes its files or subvolume and its sections. */
ORLO_EXPORT uint32_t ORLOiSCSILunDelete(ORLOiSCSILun *lun);
/* Gives back, in a background process, the extents of every map file in the volume's
 * trash "<volume>/@iSCSI/EP_unmap", and removes them. */
ORLO_EXPORT uint32_t ORLOiSCSILunUnmapALUNInBackground(const char *volume);

ORLO_EXTERN_C_END

#endif
