// Brings back the targets of a LUN that ORLOiSCSITargetDisableByLid took down (state
// entry 1).  Targets it could not take down (-1) or did not touch (0) are left alone; a
// target that fails to come back is logged and the others are still enabled.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetEnableByLid(int32_t *state, int32_t lid) {
    namespace life = orlo::target::life;
    if (state == nullptr || !life::LidValid(lid)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    life::ConfScope conf;
    ORLOiSCSILunFilter filter = {};
    filter.flags = life::kQueryTargetsOfLun;
    filter.lid = lid;
    uint32_t ret = ORLOiSCSIConfGet(&filter, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(conf.get()), ORLOiSCSIErrStr(ret));
        return life::kErrLoadLunConfig;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *target;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf->targets, link, target) {
        if (!life::TidValid(target->tid) || state[target->tid] != ORLO_ISCSI_TARGET_STATE_STOPPED) continue;
        if ((ret = ORLOiSCSITargetEnable(target)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetEnable(%p) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
            ORLO_LOG_ERR("Failed to re-enable tid:%d", target->tid);
        }
    }
    return 0;
}
