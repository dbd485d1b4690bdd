// Turns iSNS off: withdraws this appliance from the server (best effort: a server that
// cannot be reached is logged once, and what it holds expires there after the
// registration period), then writes isns_enable=no into /usr/orlo/etc/isns.conf.  The
// result is the write's.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSDisable(void) {
    namespace isns = orlo::isns;
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    (void)ORLOiSCSIiSNSDisconnect();
    return isns::WriteSetting(isns::kEnableKey, "no");
}
