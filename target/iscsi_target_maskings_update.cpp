// Changes the authority of initiators that have an entry: the entries are rewritten and,
// when the target's node is in the kernel, each initiator's LUN entries get the write
// protection of the new authority (a missing node access list or LUN entry is made, and
// CHAP written, on the way).  When the kernel cannot follow, the former authorities are
// stored again and applied, so the call changes nothing.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"
#include "orloiscsi_target.h"
#include "target/masking_util.h"

namespace {
constexpr uint32_t kErrUpdateMasking = 18990717;
}  // namespace

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingsUpdate(const std::vector<ORLOiSCSIAcl> &records) {
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    namespace masking = orlo::target::masking;
    ORLOiSCSITarget target;
    if (!masking::CheckRequest(records, true, &target)) return kErrUpdateMasking;
    const int32_t tid = target.tid;

    masking::StoredMap stored;
    uint32_t ret = masking::LoadStored(tid, &stored);
    if (ret != ORLO_OK) return kErrUpdateMasking;
    for (const ORLOiSCSIAcl &r : records) {
        if (stored.count(r.initiator) == 0) {
            ORLO_LOG_ERR("Non-existent iSCSI ACL, tid:%d initiator:%s", tid, r.initiator);
            return kErrUpdateMasking;
        }
    }

    const std::vector<masking::Prior> prior = masking::PriorOf(records, stored);
    std::vector<masking::Prior> changed;
    for (size_t i = 0; i < records.size(); ++i) {
        const ORLOiSCSIAcl &r = records[i];
        ret = ORLOiSCSITargetConfAclUpdate(tid, r.initiator, static_cast<ISCSI_TARGET_AUTHORITY>(r.authority));
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfAclUpdate(%d, \"%s\", %d) failed, err=%s", tid, r.initiator, r.authority,
                         ORLOiSCSIErrStr(ret));
            masking::RestorePrior(tid, changed);
            return kErrUpdateMasking;
        }
        changed.push_back(prior[i]);
    }

    const std::vector<std::string> initiators = masking::InitiatorsOf(records);
    ret = masking::ApplyToKernel(target, initiators);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to update ACL masking of tid:%d in the kernel, err=%s", tid, ORLOiSCSIErrStr(ret));
        masking::RestorePrior(tid, prior);
        masking::ApplyToKernel(target, initiators);
        return kErrUpdateMasking;
    }
    return ORLO_OK;
}
