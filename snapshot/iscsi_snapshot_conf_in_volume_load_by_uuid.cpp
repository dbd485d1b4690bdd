// The snapshot of a UUID from its LUN's snapshot file on a volume: the authority, read
// when the cache cannot be trusted (after a reboot, or for a volume just attached).
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfInVolumeLoadByUuid(const char *volume, const char *lunUuid,
                                                                        const char *uuid, ORLOiSCSISnapshot *snap) {
    if (volume == nullptr || volume[0] == '\0' || lunUuid == nullptr || uuid == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::snap::IsUuidUsable(lunUuid, ORLO_ISCSI_UUID_LEN + 1)) {
        ORLO_LOG_ERR("Bad parameters. Invalid parent LUN UUID");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return orlo::snap::kErrBadParentUuid;
    }
    char path[orlo::snap::kConfPathSize];
    char lockPath[orlo::snap::kConfPathSize];
    uint32_t ret = orlo::snap::ConfPath(volume, lunUuid, path, sizeof(path));
    if (ret == ORLO_OK) ret = orlo::snap::ConfLockPath(lunUuid, lockPath, sizeof(lockPath));
    if (ret != ORLO_OK) return ret;
    ORLOiSCSISnapshotFilter filter = {};
    filter.flags = ORLO_ISCSI_SNAPSHOT_FILTER_UUID | ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY;
    filter.uuid = uuid;
    return orlo::snap::ReadFirst(&filter, path, lockPath, snap);
}
