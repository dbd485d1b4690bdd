/*
 * liborloiscsiep foundation: result codes, configuration sections, configfs access and
 * base file utilities.
 *
 * Every function returns 0 or a result code: an unsigned 32-bit number, either a
 * library code (ten blocks from 18990000, each with one message) or an errno value,
 * positive or negated.  A few older-style functions return a count or -1, as noted.
 * Every failure is logged once to syslog at LOG_ERR.
 *
 * Paths are the appliance's own; under ORLO_SYSROOT they are mapped into a sandbox.
 * Threads: functions take no in-process lock.  Configuration-file functions expect the
 * caller to hold the file's lock file (OLIBCFileLockTimeByFile) around them.
 */
#ifndef ORLOISCSI_BASE_H
#define ORLOISCSI_BASE_H

#include <stddef.h>
#include <stdint.h>

#include "olibc.h"
#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* The result codes the foundation returns (the full table has 416). */
enum {
    ORLO_OK = 0,
    ORLO_ERR_DEFAULT = 18990000,            /* Default error code */
    ORLO_ERR_OUT_OF_MEMORY = 18990001,      /* Out of memory */
    ORLO_ERR_OUT_OF_SPACE = 18990002,       /* Out of free space */
    ORLO_ERR_NULL_POINTER = 18990003,       /* Null pointer */
    ORLO_ERR_BAD_PARAMETER = 18990004,      /* Bad parameter */
    ORLO_ERR_BAD_FS_TYPE = 18990005,        /* Bad file system type */
    ORLO_ERR_BAD_FILE_TYPE = 18990006,      /* Bad file type */
    ORLO_ERR_BAD_STRING_LENGTH = 18990008,  /* Bad string length */
    ORLO_ERR_TIMEOUT = 18990010,            /* Timeout */
    ORLO_ERR_FILE_NOT_FOUND = 18990011,     /* File not found */
    ORLO_ERR_FILE_EXISTS = 18990012,        /* File exists */
    ORLO_ERR_LOCK_FILE = 18990015,          /* Failed to lock file */
    ORLO_ERR_UNLOCK_FILE = 18990016,        /* Failed to unlock file */
    ORLO_ERR_STAT_PATH = 18990021,          /* Failed to stat path */
    ORLO_ERR_ACCESS_PATH = 18990022,        /* Failed to access path */
    ORLO_ERR_TOUCH_FILE = 18990023,         /* Failed to touch file */
    ORLO_ERR_CLOSE_FILE = 18990024,         /* Failed to flush or close file */
    ORLO_ERR_OPEN_DIR = 18990026,           /* Failed to open directory */
    ORLO_ERR_MKDIR = 18990028,              /* Failed to cerate directory */
    ORLO_ERR_RMDIR = 18990029,              /* Failed to remove directory */
    ORLO_ERR_INSMOD = 18990030,             /* Failed to insmod kernel module */
    ORLO_ERR_RMMOD = 18990031,              /* Failed to rmmod kernel module */
    ORLO_ERR_LINK_FILE = 18990036,          /* Failed to link file */
    ORLO_ERR_UNLINK_FILE = 18990037,        /* Failed to unlink file */
    ORLO_ERR_OPEN_FILE = 18990038,          /* Failed to open file */
    ORLO_ERR_READ_FILE = 18990039,          /* Failed to read file */
    ORLO_ERR_WRITE_FILE = 18990040,         /* Failed to write file */
    ORLO_ERR_RENAME_FILE = 18990042,        /* Failed to rename file */
    ORLO_ERR_COPY_FILE = 18990043,          /* Failed to copy file */
    ORLO_ERR_ALLOCATE_FILE = 18990048,      /* Failed to allocate file */
    ORLO_ERR_PARSE_STRING = 18990050,       /* Failed to parse string */
    ORLO_ERR_TRUNCATE_FILE = 18990057,      /* Failed to truncate file */
    ORLO_ERR_ENUM_SECTION = 18990301,       /* Failed to enumerate section */
    ORLO_ERR_ENUM_CONF_SECTION = 18990302,  /* Failed to enumerate config section */
    ORLO_ERR_GET_SECTION = 18990303,        /* Failed to get section */
    ORLO_ERR_ADD_SECTION = 18990304,        /* Failed to add section */
    ORLO_ERR_SET_SECTION = 18990305,        /* Failed to set section */
    ORLO_ERR_REMOVE_SECTION = 18990306,     /* Failed to remove section */
    ORLO_ERR_CREATE_SUBVOL = 18990317,      /* Failed to create Btrfs subvolume */
    ORLO_ERR_DELETE_SUBVOL = 18990318,      /* Failed to delete Btrfs subvolume */
    ORLO_ERR_UUID = 18990209,               /* Failed to get uuid */
    ORLO_ERR_ISCSI_DIR_NOT_FOUND = 18990427 /* iSCSI directory not found */
};

/* ---- Configuration sections (the caller holds the file's lock) ---- */

/* Number of sections (0 or more) and a new list of their names in *ppList, freed by the
 * caller with OLIBCSzListFree; 0 without touching *ppList when the file does not exist;
 * -1 on failure. */
ORLO_EXPORT int ORLOiSCSIConfSectionEnum(const char *path, POLIBC_SZLIST *ppList);
/* Writes one section, replacing it when present, appending it when not. */
ORLO_EXPORT uint32_t ORLOiSCSIPutSectionToConfig(const char *path, const char *section,
                                                 const OLIBC_SZHASH *pHash);
/* Removes every listed section with its lines (comments inside them are kept), by
 * rewriting the file through a temporary copy. */
ORLO_EXPORT uint32_t ORLOiSCSIRemoveSectionList(const char *path, const OLIBC_SZLIST *pList);
/* The lock file that guards a configuration file: the appliance's own files have fixed
 * lock files under /tmp/iscsi (a volume's copy of the LUN file shares the global one's);
 * any other file is guarded by /tmp/iscsi/<its name>.lock. */
ORLO_EXPORT uint32_t ORLOiSCSIConfLockPathGet(const char *path, char *buf, size_t size);
/* Makes the runtime directories under /tmp/iscsi and, with a volume, its @iSCSI tree. */
ORLO_EXPORT uint32_t ORLOiSCSIBaseMkdir(const char *volume);

ORLO_EXTERN_C_END

#endif
