// Unmaps several LUNs from one target: for each of the target's mappings whose lid was
// asked for, the kernel side and then the section.  0, or -1 at the first failure (what
// was removed before it stays removed).
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

namespace {

bool Contains(const int32_t *lids, int count, int32_t lid) {
    for (int i = 0; i < count; ++i)
        if (lids[i] == lid) return true;
    return false;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSITargetMappingsRemove(int32_t tid, const int32_t *lids, int count) {
    namespace life = orlo::target::life;
    if (!life::TidValid(tid) || lids == nullptr || count < 0) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    for (int i = 0; i < count; ++i) {
        if (!life::LidValid(lids[i])) {
            ORLO_LOG_ERR("Bad parameters, lid[%d] is In-Valid[%d]", i, lids[i]);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return -1;
        }
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, -1);
    life::ConfScope conf;
    if (life::QueryConfLids(life::kQueryMappingsOfLids, tid, lids, count, conf.get()) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get config");
        return -1;
    }
    if (life::TargetOfTid(*conf, tid) == nullptr) {
        ORLO_LOG_ERR("Failed to get target tid:%d", tid);
        return -1;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if (m->tid != tid || !Contains(lids, count, m->lid)) continue;
        if (ORLOiSCSITargetMappingUnload(tid, m->lid, conf.get()) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to unload mapping config with tid:%d lid:%d", tid, m->lid);
            return -1;
        }
        if (ORLOiSCSITargetConfMappingRemove(tid, m->lid) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to remove mapping config with tid:%d lid:%d", tid, m->lid);
            return -1;
        }
    }
    return 0;
}
