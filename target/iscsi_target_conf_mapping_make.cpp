// Points every mapping of a snapshot at the target of its tid and the LUN of its lid in
// the same snapshot; no match leaves the pointer NULL.
#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

namespace {

ORLOiSCSITarget *TargetOf(ORLOiSCSIConf *conf, int32_t tid) {
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf->targets, link, t) {
        if (t->tid == tid) return t;
    }
    return nullptr;
}

ORLOiSCSILun *LunOf(ORLOiSCSIConf *conf, int32_t lid) {
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&conf->luns, link, lun) {
        if (lun->lid == lid) return lun;
    }
    return nullptr;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSITargetConfMappingMake(ORLOiSCSIConf *conf) {
    if (conf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    if (!ORLOiSCSIListIsInit(&conf->luns)) ORLOiSCSIListInit(&conf->luns);
    if (!ORLOiSCSIListIsInit(&conf->targets)) ORLOiSCSIListInit(&conf->targets);
    if (!ORLOiSCSIListIsInit(&conf->mappings)) ORLOiSCSIListInit(&conf->mappings);
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        m->pTrg = TargetOf(conf, m->tid);
        m->pLun = LunOf(conf, m->lid);
    }
    return 0;
}
