// Connects the iSNS client when iSNS is on.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSConnect(void) {
    if (!ORLOiSCSIiSNSIsEnabled()) return ORLO_OK;
    // Registration with a server needs the iSNS protocol, which this library does not
    // speak yet: say so instead of pretending to be connected.
    ORLO_LOG_ERR("iSNS is enabled in %s, but the iSNS client is not available, err=%s", orlo::isns::kConfFile,
                 ORLOiSCSIErrStr(18990213));
    orlo::isns::gConnected.store(false);
    return 18990213;
}
