// The creation time recorded in an extent-pool file's common header.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileCreateTimeGet(const char *path, uint32_t *createTime) {
    if (path == nullptr || path[0] == '\0' || createTime == nullptr) {
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
    *createTime = orlo::ep::Get32(header, EP_HDR_OFF_CTIME);
    return ORLO_OK;
}
