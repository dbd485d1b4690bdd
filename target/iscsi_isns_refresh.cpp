// Renews this appliance's registrations: connects when needed, registers every running
// target again (which restarts the server's registration period) and withdraws the nodes
// of the entity that no longer run.  A server that lost its registrations (restarted
// without a database, expired them) holds the running targets again afterwards.  Meant
// to run periodically (`orloiscsi isns refresh`), more often than half the server's
// registration period.  iSNS off: nothing to do.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSRefresh(void) {
    namespace isns = orlo::isns;
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    bool on = false, synced = false;
    uint32_t ret = isns::Ensure(true, &on, &synced);
    if (ret != ORLO_OK || !on || synced) return ret;
    return isns::Sync();
}
