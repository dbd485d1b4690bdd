/*
 * The extent pool behind advanced LUNs: the pool files under "<volume>/@iSCSI/EP", the
 * per-LUN and per-snapshot map files, the EP I/O journal, the pool's locks, the trash of
 * map files waiting for their extents to be given back, and switching a volume's pool
 * on and off in the kernel target (/config/pool/EP_<n>).
 *
 * Every typed pool file starts with a 64-byte common header (checksum, version, magic,
 * file type, UUID, head size, creation time) followed by a 64-byte type header and, for
 * some types, 64-byte variable blocks at 4096, 4160 and 4224.  Each block carries the
 * CRC-32 of itself (computed with its first word zeroed) in its first word.  The library
 * writes these heads; the extents and the map itself are the kernel's.
 *
 * Every function returns 0 or a result code (orloiscsi_base.h) unless noted, logs each
 * failure once and releases what it took on every path.  Block buffers are 64 bytes,
 * UUID buffers 37 bytes.  Threads: no function holds an in-process lock; changes of one
 * volume's pool are serialised across processes by the pool lock (ORLOiSCSIEpLock), the
 * journal by the journal lock, the trash release by the trash lock.  None of these locks
 * times out.
 */
#ifndef ORLOISCSI_EP_H
#define ORLOISCSI_EP_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* Sizes callers need for their buffers. */
#define ORLO_EP_BLOCK_SIZE 64     /* one header or variable block */
#define ORLO_EP_MAP_HEAD_SIZE 4288 /* the whole head of a map file */
#define ORLO_EP_UUID_BUF_SIZE 37  /* a UUID string and its NUL */

/* ---- Common header and the fixed blocks ---- */

/* Builds and writes the common header of an existing file.  uuid (37 bytes, in/out):
 * a UUID string to use, or "" to have one generated and returned.  A string that does
 * not parse gives a zero UUID.  createTime 0 means now. */
ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderFill(const char *path, char *uuid, uint32_t fileType,
                                               uint32_t createTime);
/* Getters return a block as stored (checksum included, not verified); setters checksum a
 * copy of the given block and write it.  The common header is forced to disk only for a
 * journal file. */
ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderGet(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderSet(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapHeaderGet(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapHeaderSet(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileTblHeaderGet(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileTblHeaderSet(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileFriHeaderGet(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileFriHeaderSet(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileDatHeaderGet(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileDatHeaderSet(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlHeaderGet(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlHeaderSet(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapGetVar0(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapSetVar0(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapGetVar1(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapSetVar1(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapGetVar2(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapSetVar2(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlGetVar0(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlSetVar0(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlGetVar1(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlSetVar1(const char *path, const void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileFriGetVar0(const char *path, void *block);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileFriSetVar0(const char *path, const void *block);
/* The first ORLO_EP_MAP_HEAD_SIZE bytes of a map file. */
ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapGetAll(const char *path, void *buf);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileUuidGet(const char *path, char *uuid);
ORLO_EXPORT uint32_t ORLOiSCSIEpFileCreateTimeGet(const char *path, uint32_t *createTime);

/* A common header decoded, with the verdicts of its checksum and magic (and of the type
 * header's checksum when the file is long enough to have one). */
typedef struct _tag_ORLOiSCSIEpFileHeaderInfo {
    uint32_t checksumStored;
    uint32_t checksumComputed;
    bool checksumOk;
    uint32_t version;
    uint32_t magic0;
    uint32_t magic1;
    bool magicOk;
    uint32_t fileType;               /* 1 table, 2 free index, 3 data, 4 map, 5 journal */
    char uuid[ORLO_EP_UUID_BUF_SIZE];
    uint32_t headSize;
    uint32_t createTime;
    bool typeHeaderPresent;
    uint32_t typeChecksumStored;
    uint32_t typeChecksumComputed;
    bool typeChecksumOk;
} ORLOiSCSIEpFileHeaderInfo;
ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderDecode(const char *path, ORLOiSCSIEpFileHeaderInfo *info);

/* ---- The pool ---- */

/* The pool's extent size in bytes and its base-2 logarithm; both 0 when the volume has
 * no pool yet. */
ORLO_EXPORT uint32_t ORLOiSCSIEpExtentSizeAndShiftGet(const char *volume, uint32_t *size, uint32_t *shift);
/* Default extent size when a pool is made with extent size 0: 1 MiB. */
#define ORLO_EP_DEFAULT_EXTENT_SIZE 0x00100000u
/* Makes "<volume>/@iSCSI/EP" and its table, free-index and data files when the volume has
 * no pool; an existing pool is kept and must have the same extent size (0 accepts any).
 * The volume's @iSCSI directory must exist (ORLOiSCSIBaseMkdir). */
ORLO_EXPORT uint32_t ORLOiSCSIEpMetaFilesCreate(const char *volume, uint32_t extentSize);
/* Used space of the pool in bytes: (total - free extents of the free index) << shift;
 * 0 when the volume has no pool. */
ORLO_EXPORT uint32_t ORLOiSCSIEpUsedSpaceGet(const char *volume, uint64_t *bytes);

/* Switches the pool of /volume<n> on in the kernel (/config/pool/EP_<n>); 0 when it is
 * on already.  Disable takes it down again; 0 when it is off already. */
ORLO_EXPORT uint32_t ORLOiSCSIEpEnable(int volumeNumber);
ORLO_EXPORT uint32_t ORLOiSCSIEpDisable(int volumeNumber);
/* Whether the pool of /volume<n> is on: its configfs directory exists and "enable" is 1. */
ORLO_EXPORT uint32_t ORLOiSCSIEpIsEnabled(int volumeNumber, bool *enabled);
/* For every /volume<n> whose pool has an unmap buffer (EP_BUF): the pool on, unmap on. */
ORLO_EXPORT uint32_t ORLOiSCSIEpUnmapBufferCheckAndEnable(void);

/* What an administrator wants to know about a volume's pool. */
typedef struct _tag_ORLOiSCSIEpInfo {
    bool exists;            /* the table file is there */
    uint32_t extentSize;
    uint32_t extentShift;
    uint64_t totalExtents;  /* from the free index */
    uint64_t freeExtents;
    uint64_t usedBytes;
    char uuid[ORLO_EP_UUID_BUF_SIZE]; /* the pool's UUID (its table's) */
    bool enabled;           /* on in the kernel */
    bool unmapEnabled;
    bool rodEnabled;
} ORLOiSCSIEpInfo;
ORLO_EXPORT uint32_t ORLOiSCSIEpInfoGet(const char *volume, ORLOiSCSIEpInfo *info);

/* ---- Map files ---- */

ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileAttributeGet(const char *mapPath, uint32_t *attribute);
/* Replaces the low three bits of the attribute word with value, keeping the rest. */
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileAttributeSet(const char *mapPath, uint32_t value);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileIsVirtual(const char *mapPath, bool *isVirtual);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileChildAttributeGet(const char *mapPath, uint32_t *attribute);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileIsStable(const char *mapPath, bool *stable);
/* False also when the child attribute cannot be read. */
ORLO_EXPORT bool ORLOiSCSIEpChildLunIsMirror(const char *mapPath);
ORLO_EXPORT bool ORLOiSCSIEpChildLunIsPromoted(const char *mapPath);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileTotalCountGet(const char *mapPath, uint64_t *count);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileParentTotalCountGet(const char *mapPath, uint64_t *count);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileSyncedCountGet(const char *mapPath, uint64_t *count);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileParentUuidGet(const char *mapPath, char *uuid);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileBaseVersionGet(const char *mapPath, char *uuid);
/* Mapped extents in bytes (mapped count << the pool's extent shift). */
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMappedSizeGet(const char *mapPath, const char *volume, uint64_t *bytes);
/* Starts a kernel clone / mirror of the parent into the child backstore: writes
 * "ep_parent_name=<last component of the parent's configfs directory>" and then
 * "ep_clone_parent=<parent map file UUID>" (or "ep_mirror_parent=...") into the child's
 * control file. */
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileCloneStart(const char *parentMapPath, const char *parentConfigfsDir,
                                                  const char *childConfigfsDir);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMirrorStart(const char *parentMapPath, const char *parentConfigfsDir,
                                                   const char *childConfigfsDir);
/* 1 while the kernel runs the clone, 0 when it is done, -1 when it failed. */
ORLO_EXPORT int ORLOiSCSIEpMapFileCloneStatus(const char *mapPath, const char *childConfigfsDir);
ORLO_EXPORT uint32_t ORLOiSCSIEpIsCloneDone(const char *mapPath, bool *done);
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMirrorPromote(const char *mapPath, const char *configfsDir);
/* Synced and total extent counts of a clone or mirror child. */
ORLO_EXPORT uint32_t ORLOiSCSIEpChildLunSyncProgressGet(const char *mapPath, uint64_t *synced, uint64_t *total);

/* Bytes a map file takes for a LUN of sizeBytes: the 1 MiB head plus 8 bytes per extent,
 * rounded up to 4096.  Grows (never shrinks) the file to that, creating it if needed. */
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileTrunc(const char *mapPath, const char *volume, uint64_t sizeBytes);
/* Makes a new map file for a LUN of sizeBytes on the volume's pool: sized as
 * ORLOiSCSIEpMapFileTrunc does, common header of type 4 with a new UUID and the current
 * time, map header with total count = sizeBytes / extent size (rounded up), empty
 * variable blocks.  Refuses (18990012) a file that is a map file already. */
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMetaInit(const char *mapPath, const char *volume, uint64_t sizeBytes);
/* Records a new LUN size: total count and file size grow; a smaller size is refused. */
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMetaSizeSet(const char *mapPath, const char *volume, uint64_t sizeBytes);
/* Magic, file type 4 and a good checksum of the common header. */
ORLO_EXPORT uint32_t ORLOiSCSIEpIsMapFile(const char *path, bool *isMap);

/* Everything the head of a map file says about the object's version and relations. */
typedef struct _tag_ORLOiSCSIEpMapVersionInfo {
    char uuid[ORLO_EP_UUID_BUF_SIZE];         /* the map file's own UUID */
    uint32_t createTime;
    uint32_t attribute;
    uint64_t totalCount;
    char parentUuid[ORLO_EP_UUID_BUF_SIZE];
    uint64_t parentTotalCount;
    uint64_t mappedCount;
    uint64_t syncedCount;
    uint32_t childAttribute;
    char baseVersion[ORLO_EP_UUID_BUF_SIZE];
} ORLOiSCSIEpMapVersionInfo;
ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileVersionInfoGet(const char *mapPath, ORLOiSCSIEpMapVersionInfo *info);
/* Grows the child's map file (created if missing) to the length of the parent's. */
ORLO_EXPORT uint32_t ORLOiSCSIEpCloneFileTrunc(const char *childMapPath, const char *parentMapPath);
/* Stamps a clone's map file from its source: type 4, a new UUID, the source's creation
 * time, total and parent total count = the source's total, parent UUID = the source's
 * UUID, base version = the source's base version; mapped and synced counts 0. */
ORLO_EXPORT uint32_t ORLOiSCSIEpCloneMapMetaDataFillUp(const char *childMapPath, const char *parentMapPath);

/* ---- Locks, journal and trash ---- */

/* Pool lock of /volume<n>: "/tmp/ep_pool_<n>_access.lock", exclusive, no time-out. */
ORLO_EXPORT uint32_t ORLOiSCSIEpLock(int32_t *fd, int volumeNumber);
/* Releases when fd >= 0; 18990016 when the release fails. */
ORLO_EXPORT uint32_t ORLOiSCSIEpUnlock(int32_t fd);
ORLO_EXPORT uint32_t ORLOiSCSIEpJournalLock(int32_t *fd);
ORLO_EXPORT uint32_t ORLOiSCSIEpJournalUnlock(int32_t fd);
/* Trash lock of a volume ("/volume2" gives "/tmp/ep_trash_volume2_unmap_all.lock"). */
ORLO_EXPORT uint32_t ORLOiSCSIEpTrashLock(int32_t *fd, const char *volume);
/* 18990003 when fd < 0 (nothing held). */
ORLO_EXPORT uint32_t ORLOiSCSIEpTrashUnlock(int32_t fd);
/* The clean-up form: releases *fd when held and sets it to -1, so it may be called on
 * every way out; 18990003 only for a null pointer. */
ORLO_EXPORT uint32_t ORLOiSCSIEpTrashCleanUnlock(int32_t *fd);
/* Makes "<volume>/@iSCSI/EP_unmap" (no copy-on-write on Btrfs). */
ORLO_EXPORT uint32_t ORLOiSCSIEpTrashMkdir(const char *volume);

/* The journal root directory ("vaai_journal_rootpath", default "/var/db/iscsi"):
 * 0, or -1 when the setting cannot be read or the buffer is too small. */
ORLO_EXPORT int ORLOiSCSIEpJournalRootPathGet(char *buf, size_t size, bool forceDefault);
/* Moves the journal to a new root: stops and unloads the whole service first; refused
 * while the kernel uses the journal. */
ORLO_EXPORT uint32_t ORLOiSCSIEpJournalRootPathChange(const char *newRoot);
/* The kernel's "/config/pool/ext_jnl_enable"; false when it is missing. */
ORLO_EXPORT uint32_t ORLOiSCSIEpIsJournalEnabled(bool *enabled);
/* Makes "<root>/EP_JNL" of the configured size; a usable journal is kept. */
ORLO_EXPORT uint32_t ORLOiSCSIEpJournalFileCreate(void);

ORLO_EXTERN_C_END

#endif
