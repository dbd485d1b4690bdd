/*
 * Access to the kernel SCSI target's configfs tree (/config/target): one value per
 * attribute file, commands piped into an attribute, idempotent symbolic links, and the
 * paths of LUN backstores under the storage-object host directories.
 *
 * Values are short texts: at most 4095 bytes are written at once, 4096 read.  Every
 * function returns 0 or a result code (orloiscsi_base.h), closes what it opened on
 * every path and holds no lock: callers serialise changes of one object through the
 * object's own lock.
 */
#ifndef ORLOISCSI_CONFIGFS_H
#define ORLOISCSI_CONFIGFS_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* Longest value configfs takes in one write, terminating NUL included. */
#define ORLO_CONFIGFS_BUF_SIZE 4096

ORLO_EXPORT uint32_t ORLOiSCSIConfigfsWrite(const char *path, const char *text);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPrintf(const char *path, const char *format, ...)
    __attribute__((format(printf, 2, 3)));
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPutInteger(const char *path, int value);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsGetInteger(const char *path, int *value);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsGetBool(const char *path, bool *value);
/* Reads the value with its trailing newline; refuses a value that may not fit. */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsGetString(const char *path, char *buf, size_t size);
/* Runs command (a program path and its arguments separated by blanks, no shell) and
 * writes its whole output, which must stay under 1024 bytes, into path. */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPipe(const char *command, const char *path);
/* Makes link lead to target; an existing link that leads to the same object is fine. */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsSymlink(const char *target, const char *link);

/* Backstore paths.  *LunHbaPath: "<host dir>/<name>"; the others
 * "<host dir>/<name>/control", ".../enable" and ".../info".  Block LUNs live under
 * iblock_0, file LUNs under fileio_0, extent-pool LUNs under the version's extent-pool
 * host and LUNs being deleted under its trash host. */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsBlockLunHbaPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsBlockControlPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsBlockEnablePath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsBlockInfoPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileLunHbaPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileControlPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileEnablePath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileInfoPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpLunHbaPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpControlPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpEnablePath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpInfoPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsTrashLunHbaPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsTrashControlPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsTrashEnablePath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsTrashInfoPath(const char *name, char *buf, size_t size);
/* Virtual LUNs and virtual disks live under the extent-pool host too. */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsVlunHbaPath(const char *name, char *buf, size_t size);
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsVdiskHbaPath(const char *name, char *buf, size_t size);

/* The target-core generation in use: 0 (no iSCSI target), 2 or 4. */
ORLO_EXPORT unsigned int ORLOiSCSIGetLioVersion(void);

/* Switches the target-core version (2 "lio" or 4 "lio4x"; else 18990004): stops the
 * service, the vhost fabric and every LUN service, switches the extent pools off,
 * unloads the module sets 1, 4, 2, 3, makes the version current, writes
 * iscsi_target_type to /etc.defaults/orloinfo.conf and starts the service again, which
 * loads advanced LUNs under the new version's extent-pool host.  The same version is
 * success at once. */
ORLO_EXPORT uint32_t ORLOiSCSIConfigfsChangeCurrentVersion(unsigned int version);

ORLO_EXTERN_C_END

#endif
