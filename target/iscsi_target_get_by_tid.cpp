// One target by tid, copied into the caller's record.
#include <string>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetGetByTid(int32_t tid, uint32_t extraFlags, ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSITargetList list = {};
    uint32_t ret = ORLOiSCSITargetConfGetByTid(tid, extraFlags, &list);
    return orlo::target::CopyFirst(ret, &list, target, "tid: " + std::to_string(tid));
}
