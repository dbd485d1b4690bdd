/*
 * Snapshots and clone families.
 *
 * A LUN cloned from another LUN, or from one of its snapshots, keeps a family entry
 * "FAMILY_L<lid>" (its own lid) in /usr/orlo/etc/iscsi_family_lun.conf naming its parent,
 * guarded by /tmp/iscsi/iscsi_family_lun.conf.lock (shared for reading, exclusive for
 * writing, 60 seconds).  Every function returns 0 or a result code (orloiscsi_base.h) and
 * logs each failure once at LOG_ERR.  Threads: no in-process lock is taken; lock files
 * serialise processes and threads alike.
 */
#ifndef ORLOISCSI_SNAPSHOT_H
#define ORLOISCSI_SNAPSHOT_H

#include <stdint.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* Removes the clone relations of LUN lid (1..1024) on either side: its own entry as a
 * clone and the entries that name it as parent (a LUN that is gone is nobody's parent, and
 * its lid may be given to a new LUN).  A missing file, or no such entry, is success and
 * leaves the file as it is. */
ORLO_EXPORT uint32_t ORLOiSCSILunFamilyConfRemove(int32_t lid);

ORLO_EXTERN_C_END

#endif
