// A target's name and IQN belong to it alone: the name is how administrators and the
// command line choose a target, and the IQN names its node in the kernel, where two
// targets could not both live.  Creation and update check both under the target lock,
// so the check and the write that follows are one step.
#include <strings.h>

#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

uint32_t CheckIdentityFree(const ORLOiSCSITarget *t) {
    ORLOiSCSITargetFilter filter = {};  // flags 0: every target, backup objects too
    ORLOiSCSITargetList list = {};
    auto freeList = MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
    uint32_t ret = ORLOiSCSITargetConfLoad(&filter, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&list), ORLOiSCSIErrStr(ret));
        return kErrLoadTargetConfig;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *other;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, other) {
        if (other->tid == t->tid) continue;
        if (strcmp(other->name, t->name) == 0) {
            ORLO_LOG_ERR("Target name is used by tid %d already: %s", other->tid, t->name);
            return kErrBadName;
        }
        // iSCSI names compare without case.
        if (strcasecmp(other->iqn, t->iqn) == 0) {
            ORLO_LOG_ERR("Target iqn is used by tid %d already: %s", other->tid, t->iqn);
            return kErrBadIqn;
        }
    }
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo
