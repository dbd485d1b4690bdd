// Announces a target to the iSNS server, when connected to one.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSRegister(const ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // Not connected (iSNS off, or no client): nobody to tell.
    if (!ORLOiSCSIiSNSIsConnected()) return ORLO_OK;
    return 18990213;
}
