// Whether a file is an extent-pool map file: the pool's magic, file type 4 and a common
// header whose checksum holds.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpIsMapFile(const char *path, bool *isMap) {
    if (path == nullptr || path[0] == '\0' || isMap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    using orlo::ep::Get32;
    unsigned char header[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileHeaderGet(path, header);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderGet(\"%s\", %p) failed, err=%s", path, static_cast<void *>(header),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    *isMap = Get32(header, EP_HDR_OFF_MAGIC) == EP_MAGIC_WORD0 && Get32(header, EP_HDR_OFF_MAGIC + 4) == EP_MAGIC_WORD1 &&
             Get32(header, EP_HDR_OFF_TYPE) == EP_FILE_TYPE_MAP &&
             Get32(header, EP_HDR_OFF_CHECKSUM) == orlo::ep::BlockChecksum(header);
    return ORLO_OK;
}
