// Removes a LUN from the global LUN file (with its clone relations and mappings) and, for
// a LUN whose data is a file on a volume, from that volume's copy, under the LUN files'
// lock.  State flag 0x2 leaves the volume's copy alone (a volume about to leave the
// system keeps the description of its LUNs).
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfRemove(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::FileLockGuard lock(orlo::lun::kConfLockPath, true, orlo::lun::kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(orlo::lun::kConfLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = ORLOiSCSILunGlobalConfRemove(lun);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunGlobalConfRemove(%p) failed, err=%s", static_cast<const void *>(lun),
                     ORLOiSCSIErrStr(ret));
    if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type) && !(lun->stateFlags & ORLO_ISCSI_LUN_STATE_KEEP_VOLUME_CONF)) {
        uint32_t vret = ORLOiSCSILunVolumeConfRemove(lun);
        if (vret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILunVolumeConfRemove(%p) failed, err=%s", static_cast<const void *>(lun),
                         ORLOiSCSIErrStr(vret));
            ret = vret;
        }
    }
    return ret;
}
