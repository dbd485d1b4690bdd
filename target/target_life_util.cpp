// Snapshot queries and look-ups shared by the mapping and life-cycle functions.
#include "target/target_life_util.h"

namespace orlo {
namespace target {
namespace life {

uint32_t QueryConf(uint32_t flags, int32_t tid, int32_t lid, ORLOiSCSIConf *conf) {
    ORLOiSCSILunFilter filter = {};
    filter.flags = flags;
    filter.tid = tid;
    filter.lid = lid;
    return ORLOiSCSIConfGet(&filter, conf);
}

uint32_t QueryConfLids(uint32_t flags, int32_t tid, const int32_t *lids, int32_t count, ORLOiSCSIConf *conf) {
    ORLOiSCSILunFilter filter = {};
    filter.flags = flags;
    filter.tid = tid;
    filter.lids = lids;
    filter.lidCount = count;
    return ORLOiSCSIConfGet(&filter, conf);
}

ORLOiSCSITarget *FirstTarget(const ORLOiSCSIConf &conf) {
    ORLOiSCSIListLink *link = ORLOiSCSIListFirst(&conf.targets);
    return link == nullptr ? nullptr : ORLO_ISCSI_TARGET_OF(link);
}

ORLOiSCSILun *FirstLun(const ORLOiSCSIConf &conf) {
    ORLOiSCSIListLink *link = ORLOiSCSIListFirst(&conf.luns);
    return link == nullptr ? nullptr : ORLO_ISCSI_LUN_OF(link);
}

ORLOiSCSITarget *TargetOfTid(const ORLOiSCSIConf &conf, int32_t tid) {
    if (!ORLOiSCSIListIsInit(&conf.targets)) return nullptr;
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf.targets, link, t) {
        if (t->tid == tid) return t;
    }
    return nullptr;
}

bool InKernel(const ORLOiSCSITarget *target) {
    return (ORLOiSCSITargetStatusGet(target->tid, target) &
            (ORLO_ISCSI_TARGET_STATUS_PRESENT | ORLO_ISCSI_TARGET_STATUS_ENABLED)) != 0;
}

}  // namespace life
}  // namespace target
}  // namespace orlo
