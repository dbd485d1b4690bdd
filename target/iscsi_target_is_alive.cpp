// Whether the target of a tid has its portal group in the kernel.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT bool ORLOiSCSITargetIsAlive(int32_t tid) {
    ORLOiSCSITargetList list = {};
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
    if (ORLOiSCSITargetConfGetByTid(tid, 0, &list) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get config");
        return false;
    }
    ORLOiSCSIListLink *first = ORLOiSCSIListFirst(&list);
    if (first == nullptr) {
        ORLO_LOG_ERR("Failed, get zero target");
        return false;
    }
    return ORLOiSCSILioIsTargetAlive(ORLO_ISCSI_TARGET_OF(first)->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER);
}
