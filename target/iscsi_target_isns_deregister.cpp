// Withdraws a target from the iSNS server.  Best effort, as registering: iSNS off is
// success, a process that is not connected connects first (unless its last attempt
// failed less than a minute ago), and a node the server does not hold counts as
// withdrawn.  A failure is logged once, where it happens.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSDeregister(const ORLOiSCSITarget *target) {
    namespace isns = orlo::isns;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    bool on = false, synced = false;
    uint32_t ret = isns::Ensure(false, &on, &synced);
    if (ret != ORLO_OK || !on) return ret;
    return isns::DeregisterTarget(target->iqn);
}
