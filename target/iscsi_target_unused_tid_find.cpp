// The smallest tid no target uses.  Tids stay dense: with n targets the answer lies in
// 1..n+1, so only the tids up to n need marking.
#include <cstdlib>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetUnusedTidFind(ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSITargetFilter filter = {};  // flags 0: backup objects count as used
    ORLOiSCSITargetList list = {};
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
    uint32_t ret = ORLOiSCSITargetConfLoad(&filter, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&list), ORLOiSCSIErrStr(ret));
        return orlo::target::kErrLoadTargetConfig;
    }
    const int n = list.count;
    int tid = 1;
    if (n > 0) {
        auto *used = static_cast<char *>(calloc(static_cast<size_t>(n), sizeof(char)));
        if (used == nullptr) {
            ORLO_LOG_ERR("calloc(%d, %zu) failed, err=%m", n, sizeof(char));
            return ORLO_ERR_OUT_OF_MEMORY;
        }
        ORLOiSCSIListLink *link;
        ORLOiSCSITarget *t;
        ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) {
            if (t->tid >= 1 && t->tid <= n) used[t->tid - 1] = 1;
        }
        tid = n + 1;
        for (int i = 0; i < n; ++i) {
            if (!used[i]) {
                tid = i + 1;
                break;
            }
        }
        free(used);
    }
    if (tid > ORLO_ISCSI_TID_MAX) {
        ORLO_LOG_ERR("No free target ID: %d targets", n);
        return orlo::target::kErrBadTid;
    }
    target->tid = tid;
    return ORLO_OK;
}
