// Gives every stored access-list entry of a target a node access list in its portal
// group.  The default entry is passed to ORLOiSCSILioTargetNodeAclAdd too, which makes
// a list for it only under the older target core; elsewhere the demo mode stands for it.
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetAclAdd(const ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(target->tid, entries);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetMaskingGet(%d, %p) failed, err=%s", target->tid, static_cast<void *>(&entries),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    for (const ORLOiSCSIAcl &entry : entries) {
        ret = ORLOiSCSILioTargetNodeAclAdd(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, entry.initiator);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetNodeAclAdd(\"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, \"%s\") failed, "
                         "err=%s",
                         target->iqn, entry.initiator, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}
