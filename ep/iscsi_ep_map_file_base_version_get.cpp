// The base version of a map file: the version of the snapshot it was taken from or synced to.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileBaseVersionGet(const char *mapPath, char *uuid) {
    if (mapPath == nullptr || mapPath[0] == '\0' || uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char block[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapGetVar2(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapGetVar2(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = orlo::ep::UuidFormat(block + EP_MAP_VAR2_OFF_BASE_VER, uuid);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("UuidFormat(%p, %p) failed, err=%s", static_cast<void *>(block + EP_MAP_VAR2_OFF_BASE_VER), static_cast<void *>(uuid),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
