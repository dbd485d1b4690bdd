// Every LUN described in a volume's own copy of the LUN file, backup objects included:
// what a volume moved to this system brings with it.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfInVolumeLoad(const char *volume, ORLOiSCSILunList *list) {
    if (volume == nullptr || volume[0] == '\0' || list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char path[orlo::lun::kConfPathSize];
    uint32_t ret = orlo::lun::VolumeConfPath(volume, path, sizeof(path));
    if (ret == ORLO_OK) {
        ORLOiSCSILunFilter filter = {};
        filter.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
        ret = ORLOiSCSILunConfLoadByPath(&filter, list, path);
    }
    if (ret != ORLO_OK) ORLOiSCSILunListFree(list);
    return ret;
}
