// Points the iSNS client at another server: "name", "a.b.c.d" or "[v6]", each with an
// optional ":port" (3205 otherwise), or a bare IPv6 address.  A malformed address is
// refused (18990203 "Bad IP", 18990428 "Bad port") and isns.conf left as it was.  With
// iSNS on, the appliance is first withdrawn from the old server (best effort), and the
// running targets are then registered with the new one (that result is returned).
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSServerSet(const char *server) {
    namespace isns = orlo::isns;
    if (server == nullptr || server[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::string host;
    int port = 0;
    uint32_t ret = isns::ParseServer(server, &host, &port);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Bad iSNS server address \"%s\", err=%s", server, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    bool enabled = ORLOiSCSIiSNSIsEnabled();
    if (enabled) (void)ORLOiSCSIiSNSDisconnect();
    if ((ret = isns::WriteSetting(isns::kServerKey, server)) != ORLO_OK) return ret;
    if (!enabled) return ORLO_OK;
    return ORLOiSCSIiSNSRefresh();
}
