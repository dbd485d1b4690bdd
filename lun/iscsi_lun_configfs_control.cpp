// Writes a text into a LUN backstore's "control" file: the control string that tells
// the kernel where the data lies, or a later command (clone, mirror, promote).
#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsControl(const ORLOiSCSILun *lun, const char *control) {
    if (lun == nullptr || control == nullptr) {
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
    ret = orlo::lun::BackstoreAttrPath(dir, "control", path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIConfigfsWrite(path, control);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, control, ORLOiSCSIErrStr(ret));
    return ret;
}
