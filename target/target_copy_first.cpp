// Copies the first record of a lookup's list into a caller's record; shared by the
// single-target lookups.
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

uint32_t CopyFirst(uint32_t loadRet, ORLOiSCSITargetList *list, ORLOiSCSITarget *out, const std::string &which) {
    auto freeList = MakeScopeExit([list]() { ORLOiSCSITargetListFree(list); });
    if (loadRet != ORLO_OK) {
        ORLO_LOG_ERR("Failed to load target config, %s, err=%s", which.c_str(), ORLOiSCSIErrStr(loadRet));
        return kErrLoadTargetConfig;
    }
    ORLOiSCSIListLink *first = ORLOiSCSIListFirst(list);
    if (first == nullptr) {
        ORLO_LOG_ERR("No such target, %s", which.c_str());
        return kErrNoSuchTarget;
    }
    memcpy(out, ORLO_ISCSI_TARGET_OF(first), sizeof(*out));
    out->link.next = out->link.prev = nullptr;
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo
