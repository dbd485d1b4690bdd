// A new UUID string for a LUN, checked against the UUIDs of every LUN there is.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunUuidGenerate(char *uuid) {
    if (uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uuid[0] = '\0';
    std::vector<orlo::lun::LunIdentity> luns;
    uint32_t ret = orlo::lun::LoadIdentities(&luns);
    if (ret != ORLO_OK) return ret;
    return orlo::lun::UuidGenerateAvoiding(luns, uuid);
}
