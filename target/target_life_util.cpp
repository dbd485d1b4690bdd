// Snapshot queries and look-ups shared by the mapping and life-cycle functions, and the
// removal of one LUN entry from a portal group.
#include <string>
#include <vector>

#include "target/iscsi_lio_unload_util.h"
#include "target/lio_acl_util.h"
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

uint32_t LunAclInitiatorsRemove(const char *iqn, int tpgt, int n) {
    namespace acl = orlo::target::acl;
    char acls[acl::kPathSize];
    uint32_t ret = acl::FormatPath(acls, "/config/target/iscsi/%s/tpgt_%d/acls", iqn, tpgt);
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> initiators;
    if ((ret = orlo::target::ListConfigfsDir(acls, &initiators)) != ORLO_OK) return ret;
    for (const std::string &initiator : initiators) {
        if ((ret = ORLOiSCSILioTargetLunAclInitiatorRemove(iqn, tpgt, initiator.c_str(), n)) != ORLO_OK) return ret;
    }
    return ORLO_OK;
}

uint32_t LunEntryUnlink(const ORLOiSCSITarget *target, int n) {
    namespace acl = orlo::target::acl;
    char lun[acl::kPathSize];
    uint32_t ret = acl::FormatPath(lun, acl::kTpgLunFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, n);
    if (ret != ORLO_OK) return ret;
    return ORLOiSCSITargetPortalGroupLunRemoveEntry(lun);
}

uint32_t ClearUnnamedLunEntry(const ORLOiSCSITarget *target, int n) {
    ORLOiSCSIMapping probe = {};
    probe.tid = target->tid;
    probe.lun = n;
    bool present = false;
    uint32_t ret = ORLOiSCSITargetLunIsMapped(&probe, &present);
    if (ret != ORLO_OK || !present) return ret;
    ORLO_LOG_ERR("Removing LUN entry lun_%d of target %s that no mapping names (left by an interrupted mapping)", n,
                 target->iqn);
    if ((ret = LunAclInitiatorsRemove(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, n)) != ORLO_OK) return ret;
    return LunEntryUnlink(target, n);
}

}  // namespace life
}  // namespace target
}  // namespace orlo
