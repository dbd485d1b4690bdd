/*
 * Targets: the iSCSI target records, their access lists and the mappings that make LUNs
 * visible through them.
 *
 * Mappings are the sections "iSCSI_MAP_T<tid>_L<lid>" of /usr/orlo/etc/iscsi_mapping.conf,
 * guarded by /tmp/iscsi/iscsi_mapping.conf.lock (shared for reading, exclusive for
 * writing, 60 seconds).  Every function returns 0 or a result code (orloiscsi_base.h) and
 * logs each failure once at LOG_ERR.  Threads: no in-process lock is taken; lock files
 * serialise processes and threads alike.
 */
#ifndef ORLOISCSI_TARGET_H
#define ORLOISCSI_TARGET_H

#include <stdint.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* Removes every mapping section of LUN lid (1..1024), whatever its target, from the
 * mapping file under the file's lock.  The kernel side is not touched.  A missing file,
 * or a LUN without mappings, is success and leaves the file as it is. */
ORLO_EXPORT uint32_t ORLOiSCSILunMappingRemove(int32_t lid);

ORLO_EXTERN_C_END

#endif
