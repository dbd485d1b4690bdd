// Whether the iSNS client of this process is connected.
#include "orloiscsi_target.h"
#include "target/isns_client.h"

extern "C" ORLO_EXPORT bool ORLOiSCSIiSNSIsConnected(void) { return orlo::isns::gConnected.load(); }
