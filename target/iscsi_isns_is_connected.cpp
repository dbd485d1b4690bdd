// Whether this process is connected to the iSNS server (it reached the server and
// registered the running targets, and nothing has failed since).
#include "orloiscsi_target.h"
#include "target/isns_client.h"

extern "C" ORLO_EXPORT bool ORLOiSCSIiSNSIsConnected(void) { return orlo::isns::gConnected.load(); }
