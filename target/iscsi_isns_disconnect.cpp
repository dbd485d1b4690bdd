// Disconnects the iSNS client; a client that is not connected has nothing to do.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSDisconnect(void) {
    orlo::isns::gConnected.store(false);
    return ORLO_OK;
}
