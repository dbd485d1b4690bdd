// Writes a LUN's section into the global LUN file and, for a LUN whose data is a file on
// a volume, into that volume's copy, under the LUN files' lock.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfSet(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    const bool fileBacked = ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type);
    char volumeConf[orlo::lun::kConfPathSize];
    // The volume copy's path is checked before the global file is touched, so that a root
    // path too long for it leaves both files as they were.
    if (fileBacked) {
        if (strnlen(lun->rootPath, sizeof(lun->rootPath)) == sizeof(lun->rootPath)) {
            ORLO_LOG_ERR("invalid LUN root path: longer than %zu characters. lid: %d", sizeof(lun->rootPath) - 1,
                         lun->lid);
            return ORLO_ERR_BAD_PARAMETER;
        }
        uint32_t ret = orlo::lun::VolumeConfPath(lun->rootPath, volumeConf, sizeof(volumeConf));
        if (ret != ORLO_OK) return ret;
    }

    orlo::FileLockGuard lock(orlo::lun::kConfLockPath, true, orlo::lun::kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(orlo::lun::kConfLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = ORLOiSCSILunConfSetSection(lun, orlo::lun::kGlobalConfPath);
    if (ret != ORLO_OK) return ret;
    if (fileBacked) ret = ORLOiSCSILunConfSetSection(lun, volumeConf);
    return ret;
}
