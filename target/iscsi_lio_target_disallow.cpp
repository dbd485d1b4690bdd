// Refuses new logins to a target: its portal group's "enable" is set to 0, which also
// ends the group's sessions.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetDisallow(const ORLOiSCSITarget *target) {
    namespace lio = orlo::target::lio;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = lio::CheckIqn(target->iqn);
    if (ret != ORLO_OK) return ret;
    if ((ret = lio::TpgWrite(target->iqn, "enable", "0")) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to echo 0 to LIO target, tid:%d", target->tid);
        return ret;
    }
    return ORLO_OK;
}
