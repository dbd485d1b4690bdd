// A fresh snapshot UUID that the cache does not hold yet.
//
// The cache file searched for a conflict is the one named by the first three characters
// the buffer holds when the call begins (its paths are formed once, before the first UUID
// is generated), not the one the new UUID belongs to.  Callers pass a zeroed or reused
// buffer, so the search usually reads a cache file that cannot hold the new UUID and finds
// nothing; that is how callers have always known this call, and it is kept.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotUuidGenerate(char *uuid) {
    if (uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char path[orlo::snap::kConfPathSize];
    char lockPath[orlo::snap::kConfPathSize];
    uint32_t ret = orlo::snap::CachePath(uuid, path, sizeof(path));
    if (ret == ORLO_OK) ret = orlo::snap::CacheLockPath(uuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    for (;;) {
        ret = ORLOiSCSIUuidStrGen(uuid);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIUuidStrGen(%p) failed, err=%s", static_cast<void *>(uuid), ORLOiSCSIErrStr(ret));
            return ret;
        }
        ORLOiSCSISnapshotFilter filter = {};
        filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_UUID | ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY;
        filter.uuid = uuid;
        ORLOiSCSISnapshot found;
        ret = orlo::snap::ReadFirst(&filter, path, lockPath, &found);
        if (ret == orlo::snap::kErrNoSuchSnapshot) return ORLO_OK;
        if (ret != ORLO_OK) return ret;
        ORLO_LOG_ERR("Snapshot UUID conflict! Generate a new one and get a lottery ticket for yourself. UUID: %s", uuid);
    }
}
