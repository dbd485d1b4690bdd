// Asks the iSNS server whether it holds a target in this appliance's entity.  With iSNS
// off the answer is no (0).  A server that cannot be asked gives its code, logged once.
// Asks without registering anything, connected or not.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSIsRegistered(const ORLOiSCSITarget *target, bool *registered) {
    namespace isns = orlo::isns;
    if (target == nullptr || registered == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *registered = false;
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    isns::Settings settings;
    uint32_t ret = isns::LoadSettings(&settings);
    if (ret != ORLO_OK || !settings.enabled) return ret;
    return isns::IsRegistered(settings, target->iqn, registered);
}
