// Whether some LUN (backup objects included) already has a name.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunIsNameExist(const char *name, int *exists) {
    if (name == nullptr || exists == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<orlo::lun::LunIdentity> luns;
    uint32_t ret = orlo::lun::LoadIdentities(&luns);
    if (ret != ORLO_OK) return ret;
    *exists = orlo::lun::NameIn(luns, name) ? 1 : 0;
    return ORLO_OK;
}
