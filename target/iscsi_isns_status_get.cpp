// What the iSNS client is set to and what the server holds now: the settings of
// /usr/orlo/etc/isns.conf and, with iSNS on, the answer of the server to a query for this
// appliance's entity (made without registering anything).  Settings that cannot be used
// and a server that cannot be asked are reported in status->error (and logged once);
// the call itself fails only on a null argument or the target lock.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

namespace {
void Copy(char *dst, size_t size, const std::string &src) {
    size_t n = std::min(src.size(), size - 1);
    memcpy(dst, src.data(), n);
    dst[n] = '\0';
}
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSStatusGet(ORLOiSCSIiSNSStatus *status) {
    namespace isns = orlo::isns;
    if (status == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    memset(status, 0, sizeof(*status));
    status->registered = -1;
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    isns::Settings settings;
    uint32_t ret = isns::LoadSettings(&settings);
    status->enabled = settings.enabled;
    status->connected = ORLOiSCSIiSNSIsConnected();
    status->port = settings.port;
    status->timeout = settings.timeout;
    status->registration_period = settings.period;
    status->granted_period = static_cast<int32_t>(isns::GrantedPeriod());
    Copy(status->server, sizeof(status->server), settings.server);
    Copy(status->entity, sizeof(status->entity), settings.entity);
    status->error = ret;
    if (ret != ORLO_OK || !settings.enabled) return ORLO_OK;
    std::vector<std::string> iqns;
    if ((status->error = isns::RegisteredTargets(settings, &iqns)) == ORLO_OK) {
        status->reachable = true;
        status->registered = static_cast<int32_t>(iqns.size());
    }
    return ORLO_OK;
}
