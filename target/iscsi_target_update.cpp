// Changes a target: the stored target of the record's tid is taken out of the kernel,
// the record replaces its section, and the target comes back when the record is
// enabled.  An update always restarts a running target; nothing is rolled back.  An
// unknown tid is reported as success and changes nothing.  A new name or IQN that
// another target has is refused (18990700, 18990701) before anything changes.
#include <strings.h>

#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetUpdate(ORLOiSCSITarget *target) {
    namespace life = orlo::target::life;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTarget, target->tid, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTarget, target->tid,
                     ORLOiSCSIErrStr(ret));
        return life::kErrLoadTargetConfig;
    }
    ORLOiSCSITarget *stored = life::FirstTarget(*conf);
    if (conf->targets.count == 0 || stored == nullptr) {
        ORLO_LOG_ERR("Failed to zero target_cnt %d, pOrgTrg 0x%p", conf->targets.count, static_cast<void *>(stored));
        return ORLO_OK;
    }
    // A new name or IQN must be free, checked before anything changes.
    if ((strcmp(stored->name, target->name) != 0 || strcasecmp(stored->iqn, target->iqn) != 0) &&
        (ret = orlo::target::CheckIdentityFree(target)) != ORLO_OK)
        return ret;
    if (life::InKernel(stored)) {
        if ((ret = ORLOiSCSITargetUnload(stored)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetUnload(%p) failed, err=%s", static_cast<void *>(stored),
                         ORLOiSCSIErrStr(ret));
            ORLO_LOG_ERR("Failed to unload target tid:%d", stored->tid);
            return life::kErrUnloadTarget;
        }
    }
    (void)ORLOiSCSITargetiSNSDeregister(stored);
    if ((ret = ORLOiSCSITargetConfUpdate(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfUpdate(%p) failed, err=%s", static_cast<void *>(target),
                     ORLOiSCSIErrStr(ret));
        ORLO_LOG_ERR("Failed to update target config, tid:%d name:%s", target->tid, target->name);
        return ret;
    }
    if (target->enabled && (ret = ORLOiSCSITargetEnable(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetEnable(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        ORLO_LOG_ERR("Failed to Enable target, tid:%d name:%s", target->tid, target->name);
        return life::kErrEnableTarget;
    }
    return ORLO_OK;
}
