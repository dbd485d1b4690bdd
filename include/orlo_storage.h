/*
 * The appliance's storage platform library (ORLO*): file-system types, Btrfs subvolumes
 * and read-only snapshots through the kernel's Btrfs ioctls, copy-on-write control,
 * space allocation, volume numbers and file copies.
 *
 * Paths are the appliance's own and are mapped under ORLO_SYSROOT by the OS seam.
 * Every call is thread-safe; failures return -1 (or as stated) and set the per-thread
 * platform error state (olibc.h).
 */
#ifndef ORLO_STORAGE_H
#define ORLO_STORAGE_H

#include <sys/types.h>

#include "olibc.h"
#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* File-system types returned by ORLOGetFSType. */
#define ORLO_FSTYPE_UNKNOWN 0
#define ORLO_FSTYPE_EXT3    1
#define ORLO_FSTYPE_EXT4    2
#define ORLO_FSTYPE_BTRFS   3
#define ORLO_FSTYPE_XFS     4
#define ORLO_FSTYPE_VFAT    5
#define ORLO_FSTYPE_NTFS    6
#define ORLO_FSTYPE_HFSPLUS 7
#define ORLO_FSTYPE_EXFAT   8
#define ORLO_FSTYPE_ISO9660 9
#define ORLO_FSTYPE_UDF     10
#define ORLO_FSTYPE_NFS     11
#define ORLO_FSTYPE_CIFS    12
#define ORLO_FSTYPE_F2FS    13
#define ORLO_FSTYPE_EXT2    14
#define ORLO_FSTYPE_TMPFS   18

/* Type of the file system holding path (one of ORLO_FSTYPE_*), or -1. */
ORLO_EXPORT int ORLOGetFSType(const char *path);
/* Creates path as a new Btrfs subvolume.  0 or -1. */
ORLO_EXPORT int ORLOBtrfsCreateSubVol(const char *path);
/* Deletes the subvolume at path, its nested subvolumes first; a path already gone is
 * success.  0 or -1. */
ORLO_EXPORT int ORLOBtrfsDeleteSubvolFaultTolerant(const char *path);
/* ORLOBtrfsDeleteSubvolFaultTolerant on "<dir>/<name>" for every name of the list; every
 * one is tried.  0, or -1 with the first failure's error. */
ORLO_EXPORT int ORLOBtrfsDeleteSubvolListFaultTolerant(const char *dir, const OLIBC_SZLIST *names);
/* 1 when path is the root of a Btrfs subvolume, 0 when not, -1 on failure. */
ORLO_EXPORT int ORLOBtrfsIsSubVol(const char *path);
/* Snapshots subvolume src as dst, read-only when readOnly is set.  0 or -1. */
ORLO_EXPORT int ORLOBtrfsSnapshotCreate(const char *src, const char *dst, int readOnly);
/* Switches copy-on-write off for path (and what is created in it, for a directory). 0 or -1. */
ORLO_EXPORT int ORLOFSSetNodatacow(const char *path);
/* Allocates len bytes at offset of the open file; 0 or -1 (OLIBC_ERR_NO_SPACE when full). */
ORLO_EXPORT int ORLOFSFallocate(int fd, int mode, off_t offset, off_t len);
/* The number N of the "/volumeN" a path lies on, or -1 when it lies on none. */
ORLO_EXPORT int ORLOVolumeNumGet(const char *path);
/* The numbers of the volumes "/volumeN" at the root, ascending, into out[0..max): the
 * number of volumes there are (more than max when out was too short), or -1. */
ORLO_EXPORT int ORLOVolumeNumsList(int *out, int max);
/* Copies a regular file with its mode, replacing dst atomically.  0 or -1. */
ORLO_EXPORT int ORLOFileCopy(const char *src, const char *dst);

/* The volume number of a "/volumeN..." path (the same rule as ORLOVolumeNumGet);
 * negative when the path lies on no volume. */
ORLO_EXPORT int ORLOVolIDParse(const char *path);

/* What the platform knows of the storage a path lies on. */
typedef struct _tag_ORLO_SPACE_INFO {
    char szDevice[256];      /* the block device ("/dev/sdb1", "/dev/md2", "/dev/loop3") */
    char szMountPoint[4096]; /* where it is mounted ("" for an unmounted device) */
    int fsType;              /* ORLO_FSTYPE_*, -1 for an unmounted device */
    int isBlockDevice;       /* 1 when szDevice is a block device */
    unsigned long long totalBytes;
    unsigned long long freeBytes; /* available to unprivileged writers */
} ORLO_SPACE_INFO;
/* For a "/dev/..." path, the device itself; for any other path, the mounted file system
 * holding it.  1 on success, -1 on failure. */
ORLO_EXPORT int ORLOSpaceInfoGet(const char *path, ORLO_SPACE_INFO *pInfo);
/* 1 when the storage object name may be used (enabled), 0 when an administrator has
 * disabled it: names listed, one a line, in /usr/orlo/etc/space_disabled.conf; -1 when
 * that file cannot be read. */
ORLO_EXPORT int ORLOSpaceCanEnable(const char *name);
/* Tunes the md RAID stripe cache of the array a volume lies on (RAID 5 and 6 have one):
 * 0 when tuned or when there is nothing to tune, -1 on failure. */
ORLO_EXPORT int ORLORAIDStripeCacheTune(const char *volume);
/* Appends an entry to the appliance's event log /var/log/orlo/event.log: time, event id
 * and up to three texts (NULL for none).  0 or -1. */
ORLO_EXPORT int ORLOLogSet1(unsigned int eventId, const char *arg1, const char *arg2, const char *arg3);

ORLO_EXTERN_C_END

#endif
