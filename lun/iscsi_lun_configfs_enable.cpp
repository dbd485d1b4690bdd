// Writes a LUN backstore's "enable" file.  The kernel takes only 1: a backstore is
// switched off by removing its directory (ORLOiSCSILunUnload).
#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsEnable(const ORLOiSCSILun *lun, int enable) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char dir[orlo::lun::kConfigfsPathSize];
    uint32_t ret = ORLOiSCSILunConfigfsDirPath(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ret;
    }
    char path[orlo::lun::kConfigfsPathSize];
    ret = orlo::lun::BackstoreAttrPath(dir, "enable", path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    const int value = enable ? 1 : 0;
    ret = ORLOiSCSIConfigfsPutInteger(path, value);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", path, value, ORLOiSCSIErrStr(ret));
    return ret;
}
