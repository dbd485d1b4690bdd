// Whether the appliance holds as many LUNs (backup objects included: they take lids too)
// as its "max_iscsiluns" setting allows.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunIsQuantityLimitReached(int *reached) {
    if (reached == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<orlo::lun::LunIdentity> luns;
    uint32_t ret = orlo::lun::LoadIdentities(&luns);
    if (ret != ORLO_OK) return ret;
    *reached = luns.size() >= static_cast<size_t>(orlo::lun::QuantityLimit()) ? 1 : 0;
    return ORLO_OK;
}
