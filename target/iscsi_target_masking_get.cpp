// A target's stored access list as an ordered vector, in file order.
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingGet(int32_t tid, std::vector<ORLOiSCSIAcl> &out) {
    out.clear();
    ORLOiSCSIAclList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetAclListFree(&list); });
    uint32_t ret = ORLOiSCSITargetConfAclLoad(tid, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfAclLoad(%d, %p) failed, err=%s", tid, static_cast<void *>(&list),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSIAcl *entry;
    ORLO_ISCSI_ACL_LIST_FOREACH(&list, link, entry) {
        out.push_back(*entry);
        out.back().link.next = out.back().link.prev = nullptr;
    }
    return ORLO_OK;
}
