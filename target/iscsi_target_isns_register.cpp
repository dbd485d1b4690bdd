// Announces a target that is in the kernel to the iSNS server, with the portals of its
// portal group.  Best effort: iSNS off is success; a process that is not connected yet
// connects first (which registers every running target, this one too), unless its last
// attempt failed less than a minute ago; a connection whose registrations are due for
// renewal renews them all.  A failure is logged once, where it happens.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSRegister(const ORLOiSCSITarget *target) {
    namespace isns = orlo::isns;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    bool on = false, synced = false;
    uint32_t ret = isns::Ensure(false, &on, &synced);
    if (ret != ORLO_OK || !on || synced) return ret;
    if (isns::SyncDue()) return isns::Sync();
    return isns::RegisterTarget(target);
}
