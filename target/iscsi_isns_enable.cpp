// Turns iSNS on: writes isns_enable=yes into /usr/orlo/etc/isns.conf and registers every
// running target with the server.  Settings that could not be used (no isns_server, a
// malformed one, a bad number) are refused before anything is written.  The setting
// stays on when the server cannot be reached: that failure is logged once and returned,
// and the next service start or refresh tries again.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSEnable(void) {
    namespace isns = orlo::isns;
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    isns::Settings settings;
    uint32_t ret = isns::LoadSettings(&settings, true);
    if (ret != ORLO_OK) return ret;
    if ((ret = isns::WriteSetting(isns::kEnableKey, "yes")) != ORLO_OK) return ret;
    return ORLOiSCSIiSNSRefresh();
}
