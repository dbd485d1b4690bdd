/*
 * The configuration snapshot: LUNs, targets and the mappings between them, loaded together
 * from their three files under one filter, with every mapping pointing at the LUN and the
 * target record it joins.
 *
 * The filter is the LUN filter (orloiscsi_lun.h).  Its kind bits choose what is loaded:
 * 0x1000 targets, 0x2000 LUNs, 0x4000 mappings; 0x200 then keeps only mapped objects.
 * Its other bits select records as each family reads them: for LUNs the LUN criteria, for
 * targets 0x0001 tid, 0x0004 name, 0x0008 iqn, 0x0100 tids and 0x0400 backup objects, for
 * mappings 0x0001 tid, 0x0020 lid and 0x0040 LUN number.
 *
 * The files are read one after the other, each under its own lock file held shared for
 * that read only: /usr/orlo/etc/iscsi_target.conf, then /usr/orlo/etc/iscsi_lun.conf,
 * then /usr/orlo/etc/iscsi_mapping.conf.  A snapshot is therefore consistent per file, not
 * across files.  It belongs to one thread at a time; nothing here takes an in-process lock.
 *
 * The snapshot owns every element (one heap block each); ORLOiSCSIConfFree releases them.
 * A snapshot must not be copied by value once loaded (its lists point back at it).
 */
#ifndef ORLOISCSI_CONF_H
#define ORLOISCSI_CONF_H

#include <stdint.h>

#include "orlo_export.h"
#include "orloiscsi_list.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"

ORLO_EXTERN_C_BEGIN

/* The snapshot: three lists, each a count and a circular queue.  luns holds
 * ORLOiSCSILunElem elements, targets ORLOiSCSITarget records, mappings ORLOiSCSIMapping
 * records. */
typedef struct _tag_ORLO_ISCSI_CONF {
    ORLOiSCSILunList luns;
    ORLOiSCSITargetList targets;
    ORLOiSCSIMappingList mappings;
} ORLOiSCSIConf;

/* Loads what filter asks for into *conf (which is first made empty, without freeing
 * anything it held), links the mappings and applies ORLOiSCSIConfFilter.  On failure
 * *conf is left empty: 18990003 for NULL arguments, 18990724 when the targets, 18990550
 * when the LUNs and 18990731 when the mappings could not be loaded. */
ORLO_EXPORT uint32_t ORLOiSCSIConfGet(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf);
/* With filter bit 0x200: drops every LUN and every target no mapping points to, then
 * every mapping that lacks its LUN or its target (in that order, so an object whose only
 * mapping is dropped stays).  Without it, nothing.  18990004 for NULL arguments. */
ORLO_EXPORT uint32_t ORLOiSCSIConfFilter(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf);
/* Frees every element and leaves the three lists empty.  NULL, an empty or an already
 * freed snapshot is harmless. */
ORLO_EXPORT void ORLOiSCSIConfFree(ORLOiSCSIConf *conf);

/* Appends the mappings filter accepts (by tid 0x1, lid 0x20, LUN number 0x40; each only
 * when set, a missing key refusing the section) to conf->mappings in file order, under the
 * mapping file's shared lock.  On failure conf->mappings is left empty. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingLoad(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf);
/* Points each mapping of conf at the target of its tid and the LUN of its lid in conf
 * (NULL where there is none).  0, or -1 with platform error 0x0D00 for a NULL conf. */
ORLO_EXPORT int ORLOiSCSITargetConfMappingMake(ORLOiSCSIConf *conf);

ORLO_EXTERN_C_END

#endif
