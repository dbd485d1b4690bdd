// The target query every lookup goes through: a fresh list, loaded by the filter.
#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetGetByFilter(const ORLOiSCSITargetFilter *filter,
                                                           ORLOiSCSITargetList *list) {
    if (list == nullptr || filter == nullptr) {
        ORLO_LOG_ERR("Bad parameter");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSIListInit(list);
    uint32_t ret = ORLOiSCSITargetConfLoad(filter, list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<const void *>(filter),
                     static_cast<void *>(list), ORLOiSCSIErrStr(ret));
        return orlo::target::kErrGetConfig;
    }
    return ORLO_OK;
}
