// The extents a clone or mirror child has copied from its parent so far.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileSyncedCountGet(const char *mapPath, uint64_t *out) {
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
    *out = orlo::ep::Get64(block, EP_MAP_VAR2_OFF_SYNCED);
    return ORLO_OK;
}
