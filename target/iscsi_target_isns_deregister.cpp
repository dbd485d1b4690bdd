// Withdraws a target from the iSNS server, when connected to one.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSDeregister(const ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIiSNSIsConnected()) return ORLO_OK;
    return 18990213;
}
