// Connects this process to the iSNS server that /usr/orlo/etc/isns.conf names, when iSNS
// is on, and brings the server in line with the kernel: every running target registered,
// every other node of this appliance's entity withdrawn.  Always tries, also soon after
// a failed attempt.  Gives up after isns_timeout seconds (5 unless set) when the server
// does not accept the connection or does not answer; the failure is logged once.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIiSNSConnect(void) {
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    bool on = false, synced = false;
    return orlo::isns::Ensure(true, &on, &synced);
}
