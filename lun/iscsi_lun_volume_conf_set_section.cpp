// Writes a LUN's section into its volume's copy of the LUN file (the caller holds the
// LUN files' lock).
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunVolumeConfSetSection(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char path[orlo::lun::kConfPathSize];
    uint32_t ret = orlo::lun::VolumeConfPath(lun->rootPath, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    return ORLOiSCSILunConfSetSection(lun, path);
}
