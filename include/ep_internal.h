/*
 * The extent pool's private interface, for the library's own code only: file types and
 * the byte layout of the pool files' heads, the path builders (128-byte buffers), the
 * block read and write routines every header accessor shares, UUID conversions, the
 * scope guards of the pool and journal locks, and the hook through which the service
 * code lends the journal move its whole-service stop.
 *
 * Threads: nothing here holds an in-process lock; the lock guards serialise processes.
 */
#ifndef ORLO_INCLUDE_EP_INTERNAL_H
#define ORLO_INCLUDE_EP_INTERNAL_H

#include <stddef.h>
#include <stdint.h>
#include <sys/types.h>

#include "orloiscsi_ep.h"

/* File types of the common header. */
#define EP_FILE_TYPE_TBL 1u
#define EP_FILE_TYPE_FRI 2u
#define EP_FILE_TYPE_DAT 3u
#define EP_FILE_TYPE_MAP 4u
#define EP_FILE_TYPE_JNL 5u

/* Common header. */
#define EP_FILE_VERSION 0x00010000u
#define EP_MAGIC_WORD0 0x18140633u
#define EP_MAGIC_WORD1 0x08862552u
#define EP_HEAD_SIZE 0x00100000u      /* bytes reserved for the head of every pool file */
#define EP_HDR_OFF_CHECKSUM 0
#define EP_HDR_OFF_VERSION 4
#define EP_HDR_OFF_MAGIC 8
#define EP_HDR_OFF_TYPE 16
#define EP_HDR_OFF_UUID 20
#define EP_HDR_OFF_HEAD_SIZE 36
#define EP_HDR_OFF_RESERVED 40
#define EP_HDR_OFF_CTIME 44

/* Block positions in a file. */
#define EP_BLOCK_SIZE 64u
#define EP_OFF_HEADER 0
#define EP_OFF_TYPE_HEADER 64
#define EP_OFF_VAR0 4096
#define EP_OFF_VAR1 4160
#define EP_OFF_VAR2 4224
#define EP_MAP_HEAD_SIZE 4288u

/* Fields inside the blocks (offsets within the block). */
#define EP_TBL_OFF_EXTENT_SIZE 4      /* u32, table type header */
#define EP_FRI_OFF_TOTAL 4            /* u64 extents in the data files, free-index type header */
#define EP_FRI_OFF_FREE 12            /* u64 free extents among them */
#define EP_DAT_OFF_INDEX 4            /* u32 data file number, 0 for EP_DAT */
#define EP_MAP_OFF_ATTR 4             /* u32, map header */
#define EP_MAP_OFF_TOTAL 12           /* u64 */
#define EP_MAP_OFF_PARENT_UUID 20     /* 16 bytes */
#define EP_MAP_OFF_PARENT_TOTAL 36    /* u64 */
#define EP_MAP_VAR0_OFF_MAPPED 4      /* u64, variable block 0 */
#define EP_MAP_VAR2_OFF_SYNCED 4      /* u64, variable block 2 */
#define EP_MAP_VAR2_OFF_CHILD_ATTR 12 /* u32 */
#define EP_MAP_VAR2_OFF_BASE_VER 16   /* 16 bytes */
#define EP_JNL_OFF_SECTORS 4          /* u64 journal area in 512-byte sectors, type header */
#define EP_JNL_VAR0_OFF_COMPRESSION 4 /* u32, variable block 0 */

#define EP_MAP_ATTR_SETTABLE 0x7u
#define EP_MAP_ATTR_VIRTUAL 0x2u
#define EP_CHILD_ATTR_MIRROR 0x2u
#define EP_CHILD_ATTR_PROMOTED 0x4u
#define EP_MAP_ENTRY_SIZE 8u          /* bytes of map per extent after the head */

/* Extent sizes a pool may have. */
#define EP_EXTENT_SIZE_MIN 4096u
#define EP_EXTENT_SIZE_MAX 16777216u

/* Path buffers of the builders below. */
#define EP_PATH_SIZE 128

/* Journal settings. */
#define EP_JNL_FILE_NAME "EP_JNL"
#define EP_JNL_DEFAULT_ROOT "/var/db/iscsi"
#define EP_JNL_DEFAULT_MB 64
#define EP_SECTOR_SIZE 512u
#define SZF_ORLO_INFO "/etc/orloinfo.conf"
#define SZF_ORLO_INFO_DEFAULTS "/etc.defaults/orloinfo.conf"
#define SZK_JOURNAL_ROOTPATH "vaai_journal_rootpath"
#define SZK_JOURNAL_SIZE_MB "vaai_journal_size_in_megabyte"
#define SZK_JOURNAL_COMPRESSION "vaai_journal_compression"
#define EP_JNL_ENABLE_PATH "/config/pool/ext_jnl_enable"

/* Result codes of this subsystem beyond the foundation's (orloiscsi_base.h). */
enum {
    EP_ERR_TRY_AGAIN = 18990013,          /* Try again */
    EP_ERR_STOP_SERVICE = 18990046,       /* Failed to stop service */
    EP_ERR_PARSE_HEADER = 18990310,       /* Failed to parse header */
    EP_ERR_PARSE_VOLUME_ID = 18990311,    /* Failed to parse volume ID */
    EP_ERR_BAD_EP_FILE_TYPE = 18990400,   /* Bad EP file type */
    EP_ERR_FILL_EP_FILE = 18990413,       /* Failed to fill EP file */
    EP_ERR_CREATE_JOURNAL = 18990416,     /* Failed to create EPIO journal */
    EP_ERR_ENABLE_POOL = 18990418,        /* Failed to enable extent pool */
    EP_ERR_DISABLE_POOL = 18990419,       /* Failed to disable extent pool */
    EP_ERR_BAD_LUN_SIZE = 18990502,       /* Bad LUN size */
    EP_ERR_BAD_EXTENT_SIZE = 18990507,    /* Bad LUN extent_size */
    EP_ERR_BAD_NEW_SIZE = 18990523,       /* Bad new_size */
    EP_ERR_GET_EXTENT_SIZE = 18990566     /* Failed to get extent size */
};

/* The pool's configfs directory and its attributes. */
#define EP_CONFIGFS_POOL_FMT "/config/pool/EP_%d"

namespace orlo {
namespace ep {

/* Little-endian fields of a block. */
inline uint32_t Get32(const void *block, size_t off) {
    const unsigned char *p = static_cast<const unsigned char *>(block) + off;
    return static_cast<uint32_t>(p[0]) | static_cast<uint32_t>(p[1]) << 8 | static_cast<uint32_t>(p[2]) << 16 |
           static_cast<uint32_t>(p[3]) << 24;
}
inline uint64_t Get64(const void *block, size_t off) {
    return static_cast<uint64_t>(Get32(block, off)) | static_cast<uint64_t>(Get32(block, off + 4)) << 32;
}
inline void Put32(void *block, size_t off, uint32_t v) {
    unsigned char *p = static_cast<unsigned char *>(block) + off;
    p[0] = static_cast<unsigned char>(v);
    p[1] = static_cast<unsigned char>(v >> 8);
    p[2] = static_cast<unsigned char>(v >> 16);
    p[3] = static_cast<unsigned char>(v >> 24);
}
inline void Put64(void *block, size_t off, uint64_t v) {
    Put32(block, off, static_cast<uint32_t>(v));
    Put32(block, off + 4, static_cast<uint32_t>(v >> 32));
}

/* ---- Paths (each 18990050 when the result does not fit; logged) ---- */
uint32_t PathBuild(char *buf, size_t size, const char *fmt, ...) __attribute__((format(printf, 3, 4)));
uint32_t PoolDirPath(const char *volume, char *buf, size_t size);   /* "%s/@iSCSI/EP" */
uint32_t TblPath(const char *volume, char *buf, size_t size);       /* ".../EP_TBL" */
uint32_t FriPath(const char *volume, char *buf, size_t size);       /* ".../EP_FRI" */
uint32_t DatPath(const char *volume, char *buf, size_t size);       /* ".../EP_DAT" */
uint32_t DatNPath(const char *volume, int n, char *buf, size_t size); /* ".../EP_DAT_%05d" */
uint32_t BufPath(const char *volume, char *buf, size_t size);       /* ".../EP_BUF" */
uint32_t RodPath(const char *volume, char *buf, size_t size);       /* ".../EP_ROD" */
uint32_t TrashDirPath(const char *volume, char *buf, size_t size);  /* "%s/@iSCSI/EP_unmap" */
uint32_t TrashEntryPath(const char *volume, const char *name, char *buf, size_t size);
uint32_t JnlPath(const char *root, char *buf, size_t size);         /* "%s/EP_JNL" */

/* ---- Block read and write (iscsi_ep_file_rw) ---- */
/* Reads exactly len bytes at off: 0, 18990038 (open) or 18990039 (read). */
uint32_t FilePread(const char *path, void *buf, size_t len, off_t off);
/* Writes exactly len bytes at off, with fsync when sync: 0, 18990038, 18990002 (the
 * volume is full) or 18990040. */
uint32_t FilePwrite(const char *path, const void *buf, size_t len, off_t off, bool sync);
/* A block getter: reads len bytes at off, 18990039 on any failure (logged). */
uint32_t BlockGet(const char *path, off_t off, void *buf, size_t len);
/* A block setter: copies the 64-byte block, sets its checksum and writes it. */
uint32_t BlockSet(const char *path, off_t off, const void *block, bool sync);
/* CRC-32 of a 64-byte block with its first word taken as 0. */
uint32_t BlockChecksum(const void *block);

/* ---- UUIDs ---- */
/* 32 hexadecimal digits in the 8-4-4-4-12 pattern and nothing else. */
bool UuidParse(const char *text, unsigned char out[16]);
/* The 36-character form; 18990050 when it does not come out as 36 characters. */
uint32_t UuidFormat(const unsigned char in[16], char out[ORLO_EP_UUID_BUF_SIZE]);

/* ---- Pool helpers ---- */
/* Extent count of a size in bytes (rounded up) for a pool shift. */
inline uint64_t ExtentCount(uint64_t bytes, uint32_t shift) {
    return (bytes >> shift) + ((bytes & ((uint64_t{1} << shift) - 1)) != 0 ? 1 : 0);
}
/* Length of a map file for a LUN of that many extents. */
inline uint64_t MapFileLength(uint64_t extents) {
    uint64_t map = extents * EP_MAP_ENTRY_SIZE;
    return EP_HEAD_SIZE + ((map + 4095) & ~uint64_t{4095});
}
/* Grows (never shrinks) a file, creating it with mode 0600, to length bytes (sparse). */
uint32_t FileGrow(const char *path, uint64_t length);
/* The volume number of a volume path; -1 (logged) when it lies on no volume. */
int VolumeNumber(const char *volume);
/* "/config/pool/EP_%d" and an attribute below it (320-byte buffers). */
uint32_t PoolConfigfsPath(int volumeNumber, const char *attr, char *buf, size_t size);

/* Takes a pool down in the kernel (switches off, then removes /config/pool/EP_<n>); the
 * caller holds the pool lock.  0 when it is down already; 18990419 on failure (logged). */
uint32_t PoolTakeDown(int volumeNumber);

/* The whole-service stop that a journal move needs; installed by the service code. */
typedef uint32_t (*TotallyStopFn)(void);
void SetTotallyStopHook(TotallyStopFn fn);
TotallyStopFn GetTotallyStopHook(void);

}  // namespace ep
}  // namespace orlo

/* Holds the pool lock of one volume for the scope.  Throws std::runtime_error with the
 * text "ORLOiSCSIEpLockGuard()" when the lock cannot be taken (or the volume path lies on
 * no volume); a failed release in the destructor is only logged. */
class ORLOiSCSIEpLockGuard {
  public:
    explicit ORLOiSCSIEpLockGuard(int volumeNumber);
    explicit ORLOiSCSIEpLockGuard(const char *volumePath);
    ORLOiSCSIEpLockGuard(const ORLOiSCSIEpLockGuard &) = delete;
    ORLOiSCSIEpLockGuard &operator=(const ORLOiSCSIEpLockGuard &) = delete;
    ~ORLOiSCSIEpLockGuard();
    int fd() const { return fd_; }

  private:
    void Take(int volumeNumber);
    int32_t fd_ = -1;
};

/* Holds the journal lock for the scope; throws "ORLOiSCSIEpJournalLockGuard()". */
class ORLOiSCSIEpJournalLockGuard {
  public:
    ORLOiSCSIEpJournalLockGuard();
    ORLOiSCSIEpJournalLockGuard(const ORLOiSCSIEpJournalLockGuard &) = delete;
    ORLOiSCSIEpJournalLockGuard &operator=(const ORLOiSCSIEpJournalLockGuard &) = delete;
    ~ORLOiSCSIEpJournalLockGuard();
    int fd() const { return fd_; }

  private:
    int32_t fd_ = -1;
};

#endif
