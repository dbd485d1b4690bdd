// Reads a 0/1 flag from a configfs attribute.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsGetBool(const char *path, bool *value) {
    if (path == nullptr || value == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    int v = 0;
    uint32_t ret = ORLOiSCSIConfigfsGetInteger(path, &v);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetInteger(\"%s\", %p) failed, err=%s", path, static_cast<void *>(&v),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (v != 0 && v != 1) {
        ORLO_LOG_ERR("Expected value to be zero or one: %d", v);
        return ORLO_ERR_PARSE_STRING;
    }
    *value = v == 1;
    return ORLO_OK;
}
