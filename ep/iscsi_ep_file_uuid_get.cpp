// The UUID of an extent-pool file's common header, as a string.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileUuidGet(const char *path, char *uuid) {
    if (path == nullptr || path[0] == '\0' || uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char header[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileHeaderGet(path, header);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderGet(\"%s\", %p) failed, err=%s", path, static_cast<void *>(header),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = orlo::ep::UuidFormat(header + EP_HDR_OFF_UUID, uuid);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("UuidFormat(%p, %p) failed, err=%s", static_cast<void *>(header + EP_HDR_OFF_UUID),
                     static_cast<void *>(uuid), ORLOiSCSIErrStr(ret));
    return ret;
}
