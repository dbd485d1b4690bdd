// A new UUID in its 36-character string form.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIUuidStrGen(char *buf) {
    if (buf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char u[16];
    uint32_t ret = ORLOiSCSIUuidGen(u);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIUuidGen(%p) failed, err=%s", static_cast<void *>(u), ORLOiSCSIErrStr(ret));
        buf[0] = '\0';
        return ORLO_ERR_UUID;
    }
    int n = snprintf(buf, 37, "%02x%02x%02x%02x-%02x%02x-%02x%02x-%02x%02x-%02x%02x%02x%02x%02x%02x", u[0], u[1],
                     u[2], u[3], u[4], u[5], u[6], u[7], u[8], u[9], u[10], u[11], u[12], u[13], u[14], u[15]);
    if (n != 36) {
        ORLO_LOG_ERR("snprintf() of the UUID gave %d characters", n);
        buf[0] = '\0';
        return ORLO_ERR_UUID;
    }
    return ORLO_OK;
}
