// Takes initiators' access to a target away: their entries are removed and, when the
// target's node is in the kernel, their node access lists go with their LUN entries
// (removing the default entry leaves only listed initiators able to log in).  An
// initiator without an entry is already removed.  When the kernel cannot follow, the
// entries are stored again and applied, so the call changes nothing.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"
#include "orloiscsi_target.h"
#include "target/masking_util.h"

namespace {
constexpr uint32_t kErrRemoveMasking = 18990716;
}  // namespace

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingsRemove(const std::vector<ORLOiSCSIAcl> &records) {
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    namespace masking = orlo::target::masking;
    ORLOiSCSITarget target;
    // The authority a removal carries is not looked at.
    if (!masking::CheckRequest(records, false, &target)) return kErrRemoveMasking;
    const int32_t tid = target.tid;

    masking::StoredMap stored;
    uint32_t ret = masking::LoadStored(tid, &stored);
    if (ret != ORLO_OK) return kErrRemoveMasking;
    const std::vector<masking::Prior> prior = masking::PriorOf(records, stored);
    std::vector<masking::Prior> removed;
    for (size_t i = 0; i < records.size(); ++i) {
        ret = ORLOiSCSITargetConfAclRemove(tid, records[i].initiator);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfAclRemove(%d, \"%s\") failed, err=%s", tid, records[i].initiator,
                         ORLOiSCSIErrStr(ret));
            masking::RestorePrior(tid, removed);
            return kErrRemoveMasking;
        }
        removed.push_back(prior[i]);
    }

    const std::vector<std::string> initiators = masking::InitiatorsOf(records);
    ret = masking::ApplyToKernel(target, initiators);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to delete ACL masking of tid:%d from the kernel, err=%s", tid, ORLOiSCSIErrStr(ret));
        masking::RestorePrior(tid, prior);
        masking::ApplyToKernel(target, initiators);
        return kErrRemoveMasking;
    }
    return ORLO_OK;
}
