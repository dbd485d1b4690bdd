// Writes a signed integer into a configfs attribute.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPutInteger(const char *path, int value) {
    if (path == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = ORLOiSCSIConfigfsPrintf(path, "%d", value);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIConfigfsPrintf(\"%s\", \"%%d\", %d) failed, err=%s", path, value, ORLOiSCSIErrStr(ret));
    return ret;
}
