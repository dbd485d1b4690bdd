// Whether a map file belongs to a virtual object (attribute bit 0x2).
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileIsVirtual(const char *mapPath, bool *out) {
    if (mapPath == nullptr || mapPath[0] == '\0' || out == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char block[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapHeaderGet(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderGet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *out = (orlo::ep::Get32(block, EP_MAP_OFF_ATTR) & EP_MAP_ATTR_VIRTUAL) != 0;
    return ORLO_OK;
}
