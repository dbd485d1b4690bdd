// How far a clone or mirror child has come: extents synced from the parent, of its total.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpChildLunSyncProgressGet(const char *mapPath, uint64_t *synced,
                                                                   uint64_t *total) {
    if (mapPath == nullptr || mapPath[0] == '\0' || synced == nullptr || total == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint64_t s = 0, t = 0;
    uint32_t ret = ORLOiSCSIEpMapFileSyncedCountGet(mapPath, &s);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileSyncedCountGet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(&s),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIEpMapFileTotalCountGet(mapPath, &t);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileTotalCountGet(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(&t),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    *synced = s;
    *total = t;
    return ORLO_OK;
}
