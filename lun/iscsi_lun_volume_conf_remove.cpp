// Removes a LUN's section from its volume's copy of the LUN file (the caller holds the
// LUN files' lock).  A volume without the file is success.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunVolumeConfRemove(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char path[orlo::lun::kConfPathSize];
    uint32_t ret = orlo::lun::VolumeConfPath(lun->rootPath, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    return ORLOiSCSILunConfRemoveSection(lun, path);
}
