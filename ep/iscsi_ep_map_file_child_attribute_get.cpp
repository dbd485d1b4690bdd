// The child attribute word of a clone or mirror child (variable block 2).
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileChildAttributeGet(const char *mapPath, uint32_t *out) {
    if (mapPath == nullptr || mapPath[0] == '\0' || out == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char block[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapGetVar2(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapGetVar2(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *out = orlo::ep::Get32(block, EP_MAP_VAR2_OFF_CHILD_ATTR);
    return ORLO_OK;
}
