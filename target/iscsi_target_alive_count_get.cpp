// How many targets (backup objects aside) have their node in the kernel.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT int ORLOiSCSITargetAliveCountGet(void) {
    namespace life = orlo::target::life;
    life::ConfScope conf;
    if (life::QueryConf(life::kQueryAllTargets, 0, 0, conf.get()) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get config");
        return 0;
    }
    int alive = 0;
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *target;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf->targets, link, target) {
        if (ORLOiSCSITargetStatusGet(target->tid, target) & ORLO_ISCSI_TARGET_STATUS_PRESENT) ++alive;
    }
    return alive;
}
