// Whether a clone child has all its extents: synced count equal to total count.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpIsCloneDone(const char *mapPath, bool *done) {
    if (mapPath == nullptr || mapPath[0] == '\0' || done == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint64_t synced = 0, total = 0;
    uint32_t ret = ORLOiSCSIEpChildLunSyncProgressGet(mapPath, &synced, &total);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpChildLunSyncProgressGet(\"%s\", %p, %p) failed, err=%s", mapPath,
                     static_cast<void *>(&synced), static_cast<void *>(&total), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *done = synced == total;
    return ORLO_OK;
}
