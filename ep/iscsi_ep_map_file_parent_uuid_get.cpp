// The UUID of a map file's parent (the parent map file's own UUID).
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileParentUuidGet(const char *mapPath, char *uuid) {
    if (mapPath == nullptr || mapPath[0] == '\0' || uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char block[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapHeaderGet(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderGet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = orlo::ep::UuidFormat(block + EP_MAP_OFF_PARENT_UUID, uuid);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("UuidFormat(%p, %p) failed, err=%s", static_cast<void *>(block + EP_MAP_OFF_PARENT_UUID), static_cast<void *>(uuid),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
