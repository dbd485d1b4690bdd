// Removes a LUN from the global configuration: its clone relations, its mappings, then
// its section (the caller holds the LUN files' lock).
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "orloiscsi_snapshot.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunGlobalConfRemove(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    // What refers to the LUN goes first; a failure there is remembered, not fatal.
    uint32_t remembered = ORLO_OK;
    uint32_t ret = ORLOiSCSILunFamilyConfRemove(lun->lid);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunFamilyConfRemove(%d) failed, err=%s", lun->lid, ORLOiSCSIErrStr(ret));
        remembered = ret;
    }
    ret = ORLOiSCSILunMappingRemove(lun->lid);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunMappingRemove(%d) failed, err=%s", lun->lid, ORLOiSCSIErrStr(ret));
        remembered = ret;
    }
    ret = ORLOiSCSILunConfRemoveSection(lun, orlo::lun::kGlobalConfPath);
    return ret != ORLO_OK ? ret : remembered;
}
