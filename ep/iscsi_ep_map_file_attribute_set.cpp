// Sets the settable low three bits of a map file's attribute word, keeping the others,
// and rewrites the map header with a new checksum.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileAttributeSet(const char *mapPath, uint32_t value) {
    if (mapPath == nullptr || mapPath[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    unsigned char block[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapHeaderGet(mapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderGet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t attr = orlo::ep::Get32(block, EP_MAP_OFF_ATTR);
    attr = (attr & ~EP_MAP_ATTR_SETTABLE) | (value & EP_MAP_ATTR_SETTABLE);
    orlo::ep::Put32(block, EP_MAP_OFF_ATTR, attr);
    ret = ORLOiSCSIEpFileMapHeaderSet(mapPath, block);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderSet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
