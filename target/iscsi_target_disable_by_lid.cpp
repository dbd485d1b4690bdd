// Takes every running target a LUN is mapped to out of the kernel, for an operation
// that must keep initiators away from the LUN for a while.  state[tid] records what was
// done: 1 taken down, -1 could not be taken down; other entries are left alone.  The
// caller keeps the array for ORLOiSCSITargetEnableByLid.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT int ORLOiSCSITargetDisableByLid(int32_t *state, int32_t lid) {
    namespace life = orlo::target::life;
    if (state == nullptr || !life::LidValid(lid)) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, -1);
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTargetsOfLun, 0, lid, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to load configuration, lid:%d", lid);
        return -1;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *target;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf->targets, link, target) {
        if (!life::TidValid(target->tid)) continue;
        if (!(ORLOiSCSITargetStatusGet(target->tid, target) & ORLO_ISCSI_TARGET_STATUS_ENABLED)) continue;
        state[target->tid] = ORLO_ISCSI_TARGET_STATE_STOPPED;
        if ((ret = ORLOiSCSITargetUnload(target)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetUnload(%p) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
            state[target->tid] = ORLO_ISCSI_TARGET_STATE_STOP_FAILED;
            continue;
        }
        (void)ORLOiSCSITargetiSNSDeregister(target);
    }
    return 0;
}
