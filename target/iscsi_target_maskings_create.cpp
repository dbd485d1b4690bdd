// Gives initiators that have no entry yet their access to a target: the entries are
// stored and, when the target's node is in the kernel, each initiator gets its node
// access list, its LUN entries with their write protection and the target's CHAP
// credentials (the default entry switches the portal group's demo mode instead).  When
// the kernel cannot follow, the new entries are taken out of the file and the kernel
// again, so the call changes nothing.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"
#include "orloiscsi_target.h"
#include "target/masking_util.h"

namespace {
constexpr uint32_t kErrCreateMasking = 18990715;
}  // namespace

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingsCreate(const std::vector<ORLOiSCSIAcl> &records) {
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    namespace masking = orlo::target::masking;
    ORLOiSCSITarget target;
    if (!masking::CheckRequest(records, true, &target)) return kErrCreateMasking;
    const int32_t tid = target.tid;

    bool included = false;
    uint32_t ret = ORLOiSCSITargetAclIsIncluded(tid, records, included);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetAclIsIncluded(%d, %p, %p) failed, err=%s", tid,
                     static_cast<const void *>(&records), static_cast<void *>(&included), ORLOiSCSIErrStr(ret));
        return kErrCreateMasking;
    }
    if (included) {
        ORLO_LOG_ERR("Existent iSCSI ACL");
        return kErrCreateMasking;
    }

    // None of the initiators had an entry: undoing means removing what was stored.
    std::vector<masking::Prior> stored;
    for (const ORLOiSCSIAcl &r : records) {
        ret = ORLOiSCSITargetConfAclAdd(tid, r.initiator, r.authority);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfAclAdd(%d, \"%s\", %d) failed, err=%s", tid, r.initiator, r.authority,
                         ORLOiSCSIErrStr(ret));
            masking::RestorePrior(tid, stored);
            return kErrCreateMasking;
        }
        stored.push_back(masking::Prior{r.initiator, false, 0});
    }

    const std::vector<std::string> initiators = masking::InitiatorsOf(records);
    ret = masking::ApplyToKernel(target, initiators);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to add ACL masking of tid:%d to the kernel, err=%s", tid, ORLOiSCSIErrStr(ret));
        masking::RestorePrior(tid, stored);
        masking::ApplyToKernel(target, initiators);
        return kErrCreateMasking;
    }
    return ORLO_OK;
}
