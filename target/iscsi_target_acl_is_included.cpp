// Whether any initiator of a request already has an access-list entry of the target.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/masking_util.h"

ORLO_EXPORT uint32_t ORLOiSCSITargetAclIsIncluded(int32_t tid, const std::vector<ORLOiSCSIAcl> &records,
                                                  bool &included) {
    included = false;
    if (tid < ORLO_ISCSI_TID_MIN || tid > ORLO_ISCSI_TID_MAX) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::target::masking::StoredMap stored;
    uint32_t ret = orlo::target::masking::LoadStored(tid, &stored);
    if (ret != ORLO_OK) return ret;
    for (const ORLOiSCSIAcl &r : records) {
        // An unterminated name cannot be stored, so it is not included either.
        if (memchr(r.initiator, '\0', sizeof(r.initiator)) == nullptr) continue;
        if (stored.count(r.initiator) != 0) {
            included = true;
            break;
        }
    }
    return ORLO_OK;
}
