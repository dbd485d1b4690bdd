// One target by name, copied into the caller's record.
#include <string>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetGetByName(const char *name, uint32_t extraFlags,
                                                         ORLOiSCSITarget *target) {
    if (name == nullptr || target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSITargetList list = {};
    uint32_t ret = ORLOiSCSITargetConfGetByName(name, extraFlags, &list);
    return orlo::target::CopyFirst(ret, &list, target, std::string("name: ") + name);
}
