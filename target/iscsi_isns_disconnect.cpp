// Withdraws this appliance from the iSNS server (its entity, with every target and
// portal registered in it) and forgets the connection: the service stop calls it before
// the targets leave the kernel.  With iSNS off there is nothing to withdraw.  A server
// that cannot be reached is logged once and its code returned; whatever it still holds
// expires there after the registration period.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSDisconnect(void) {
    namespace isns = orlo::isns;
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    isns::Forget();
    isns::Settings settings;
    uint32_t ret = isns::LoadSettings(&settings);
    if (ret != ORLO_OK || !settings.enabled) return ret;
    return isns::WithdrawEntity(settings);
}
