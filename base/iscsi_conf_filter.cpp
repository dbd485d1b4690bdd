// Keeps only mapped objects in a configuration snapshot.  LUNs and targets are judged by
// whether any mapping points at them before the half-resolved mappings are dropped, so a
// target whose only mapping lacks its LUN stays although that mapping goes (and likewise
// a LUN whose only mapping lacks its target).
#include <cstdlib>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

namespace {

bool IsLunPointedTo(const ORLOiSCSIConf *conf, const ORLOiSCSILun *lun) {
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if (m->pLun == lun) return true;
    }
    return false;
}

bool IsTargetPointedTo(const ORLOiSCSIConf *conf, const ORLOiSCSITarget *target) {
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if (m->pTrg == target) return true;
    }
    return false;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfFilter(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf) {
    if (filter == nullptr || conf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if ((filter->flags & ORLO_ISCSI_LUN_FILTER_MAPPED_ONLY) == 0) return ORLO_OK;
    if (!ORLOiSCSIListIsInit(&conf->luns)) ORLOiSCSIListInit(&conf->luns);
    if (!ORLOiSCSIListIsInit(&conf->targets)) ORLOiSCSIListInit(&conf->targets);
    if (!ORLOiSCSIListIsInit(&conf->mappings)) ORLOiSCSIListInit(&conf->mappings);

    ORLOiSCSIListLink *link;
    ORLOiSCSIListLink *next;
    ORLO_ISCSI_LIST_FOREACH_SAFE(&conf->luns, link, next) {
        ORLOiSCSILunElem *elem = ORLO_ISCSI_LIST_ENTRY(link, ORLOiSCSILunElem, link);
        if (IsLunPointedTo(conf, &elem->lun)) continue;
        ORLOiSCSIListRemove(&conf->luns, link);
        free(elem);
    }
    ORLO_ISCSI_LIST_FOREACH_SAFE(&conf->targets, link, next) {
        ORLOiSCSITarget *target = ORLO_ISCSI_TARGET_OF(link);
        if (IsTargetPointedTo(conf, target)) continue;
        ORLOiSCSIListRemove(&conf->targets, link);
        free(target);
    }
    ORLO_ISCSI_LIST_FOREACH_SAFE(&conf->mappings, link, next) {
        ORLOiSCSIMapping *m = ORLO_ISCSI_MAPPING_OF(link);
        if (m->pLun != nullptr && m->pTrg != nullptr) continue;
        ORLOiSCSIListRemove(&conf->mappings, link);
        free(m);
    }
    return ORLO_OK;
}
