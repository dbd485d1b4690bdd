// Removes a target: out of the kernel, then each of its mappings, then its section and
// access lists.  What was removed before a failure stays removed.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetRemove(ORLOiSCSITarget *target) {
    namespace life = orlo::target::life;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    uint32_t ret;
    if (life::InKernel(target)) {
        if ((ret = ORLOiSCSITargetUnload(target)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetUnload(%p) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
            ORLO_LOG_ERR("Failed to Unload target, tid:%d name:%s", target->tid, target->name);
            return life::kErrUnloadTarget;
        }
        (void)ORLOiSCSITargetiSNSDeregister(target);
    }

    life::ConfScope conf;
    if ((ret = life::QueryConf(life::kQueryTargetMappings, target->tid, 0, conf.get())) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTargetMappings, target->tid,
                     ORLOiSCSIErrStr(ret));
        return life::kErrLoadTargetConfig;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if ((ret = ORLOiSCSITargetMappingRemove(target->tid, m->lid)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetMappingRemove(%d, %d) failed, err=%s", target->tid, m->lid,
                         ORLOiSCSIErrStr(ret));
            ORLO_LOG_ERR("Failed to remove mapping between tid:%d name:%s with lid:%d name:%s", target->tid,
                         target->name, m->lid, m->pLun != nullptr ? m->pLun->name : "");
            return life::kErrRemoveMapping;
        }
    }

    if (ORLOiSCSITargetConfRemove(target) != 0) {
        ORLO_LOG_PLATFORM("ORLOiSCSITargetConfRemove(%p)", static_cast<void *>(target));
        ORLO_LOG_ERR("Failed to remove target config, tid:%d name:%s", target->tid, target->name);
        return life::kErrRemoveTargetConfig;
    }
    return ORLO_OK;
}
