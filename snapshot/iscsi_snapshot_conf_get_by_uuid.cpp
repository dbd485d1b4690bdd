// The snapshot of a UUID, from the cache file its UUID names: found without knowing its
// LUN.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfGetByUuid(const char *uuid, ORLOiSCSISnapshot *snap) {
    if (uuid == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::snap::IsUuidUsable(uuid, ORLO_ISCSI_UUID_LEN + 1)) {
        ORLO_LOG_ERR("Bad parameters. Invalid snapshot UUID");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return orlo::snap::kErrBadUuid;
    }
    char path[orlo::snap::kConfPathSize];
    char lockPath[orlo::snap::kConfPathSize];
    uint32_t ret = orlo::snap::CachePath(uuid, path, sizeof(path));
    if (ret == ORLO_OK) ret = orlo::snap::CacheLockPath(uuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    ORLOiSCSISnapshotFilter filter = {};
    filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_UUID | ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY;
    filter.uuid = uuid;
    ret = orlo::snap::ReadFirst(&filter, path, lockPath, snap);
    if (ret == orlo::snap::kErrNoSuchSnapshot) ORLO_LOG_ERR("No such snapshot. UUID: %s", uuid);
    return ret;
}
