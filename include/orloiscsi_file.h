/*
 * liborloiscsiep base file utilities: the per-volume @iSCSI directory, directories that
 * become Btrfs subvolumes where the volume is Btrfs, growing LUN files in one of three
 * ways with a progress file that other processes can read, copying and moving files,
 * UUIDs and the CRC-32 used by the extent-pool file headers.
 *
 * Every function that returns uint32_t returns 0 or a result code (see orloiscsi_base.h)
 * and logs each failure once at LOG_ERR.  Paths are the appliance's own; under
 * ORLO_SYSROOT they are mapped into a sandbox.
 *
 * Threads: no function takes an in-process lock.  The progress file belongs to the
 * calling process (its name carries the pid), so two threads of one process must not
 * grow files at the same time.
 */
#ifndef ORLOISCSI_FILE_H
#define ORLOISCSI_FILE_H

#include <stddef.h>
#include <stdint.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* ---- Growing files ---- */

/* How ORLOiSCSIFileTrunc grows a file. */
#define ORLO_ISCSI_TRUNC_MODE_SPARSE 1u   /* set the size only */
#define ORLO_ISCSI_TRUNC_MODE_ZERO   2u   /* write zeros */
#define ORLO_ISCSI_TRUNC_MODE_ALLOC  3u   /* allocate space (fallocate) */

/* Progress file of the growing process, a flat key=value file with the planned and the
 * finished byte counts in decimal ("total_bytes=...", "done_bytes=..."). */
#define ORLO_ISCSI_FILE_PROGRESS_PATH_FMT "/tmp/iscsi/P%d.progress"
#define ORLO_ISCSI_FILE_PROGRESS_TOTAL "total_bytes"
#define ORLO_ISCSI_FILE_PROGRESS_DONE "done_bytes"

/* Bytes allocated per step in ORLO_ISCSI_TRUNC_MODE_ALLOC; the progress file is updated
 * after each step. */
#define ORLO_ISCSI_FILE_ALLOC_STEP (1ULL << 30)

/* The grow mode for a file system type (ORLOGetFSType): ORLO_ISCSI_TRUNC_MODE_SPARSE
 * when sparse is set, ALLOC for ext4 and Btrfs, ZERO for the others.  -1 (platform code
 * 0x0D00) for a negative type, a type above 14 other than 18, or a null mode. */
ORLO_EXPORT int ORLOiSCSIFileTruncModeGet(int sparse, int fsType, unsigned int *pMode);

/* Grows path (created when missing) to size bytes in the given mode; never shrinks it.
 * pu64Progress, when not NULL, is increased by the bytes the file grows by as the work
 * proceeds.  Modes 2 and 3 write the progress file of this process.  A failure in
 * modes 2 and 3 sets the file back to its former size. */
ORLO_EXPORT uint32_t ORLOiSCSIFileTrunc(const char *path, uint64_t size, uint64_t *pu64Progress,
                                        unsigned int mode);

/* Appends len bytes of allocated space to path (opened append-only) and adds len to
 * *pu64Progress.  18990002 when the file system is full. */
ORLO_EXPORT uint32_t ORLOiSCSIFileAlloc(const char *path, uint64_t len, uint64_t *pu64Progress);

/* Adds bytes to "done_bytes" of this process's progress file. */
ORLO_EXPORT uint32_t ORLOiSCSIFileProgressWrite(uint64_t bytes);

/* ---- Directories ---- */

/* "<volume>/@iSCSI" into buf; 18990427 when that directory does not exist. */
ORLO_EXPORT uint32_t ORLOiSCSIDirPathGet(const char *volume, char *buf, size_t size);

/* Makes a directory (mode 0700, an existing one is fine) or, with asSubvol, a Btrfs
 * subvolume with copy-on-write off (an existing subvolume is fine, an existing plain
 * directory is 18990012). */
ORLO_EXPORT uint32_t ORLOiSCSIMkdir(const char *path, int asSubvol);

/* Removes a subvolume (with the subvolumes nested in it) or an empty plain directory;
 * a missing path is success. */
ORLO_EXPORT uint32_t ORLOiSCSIRmdir(const char *path);

/* ---- Copying and moving ---- */

/* Flags of ORLOiSCSIFileCopy. */
#define ORLO_ISCSI_FILE_COPY_PRESERVE 0x1u  /* keep mode, owner and times */
#define ORLO_ISCSI_FILE_COPY_SPARSE   0x2u  /* make runs of zeros holes */
#define ORLO_ISCSI_FILE_COPY_REFLINK  0x4u  /* share extents where the file system can */

/* Copies source to destination with "/bin/cp".  18990011 when source is missing,
 * 18990043 when the copy fails, 18990004 for unknown flags. */
ORLO_EXPORT uint32_t ORLOiSCSIFileCopy(const char *source, const char *destination, unsigned int flags);

/* Renames oldPath to newPath.  With acrossFs set, a move between file systems is done by
 * copying and removing the old file, except from Btrfs (18990005). */
ORLO_EXPORT uint32_t ORLOiSCSIFileRename(const char *oldPath, const char *newPath, int acrossFs);

/* ---- UUIDs and checksums ---- */

/* 16 random bytes of a new UUID. */
ORLO_EXPORT uint32_t ORLOiSCSIUuidGen(unsigned char uuid[16]);

/* A new UUID as 36 lower-case characters ("xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx") and
 * NUL into buf, which holds at least 37 bytes. */
ORLO_EXPORT uint32_t ORLOiSCSIUuidStrGen(char *buf);

/* The CRC-32 (IEEE 802.3, as zlib's crc32) of len bytes, continuing from crc: start with
 * 0 and pass each result into the next call to checksum data that arrives in pieces. */
ORLO_EXPORT uint32_t ORLOiSCSIFileCRC32CksumCompute(uint32_t crc, const void *buf, size_t len);

ORLO_EXTERN_C_END

#endif
