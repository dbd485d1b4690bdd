// Whether an application holds a snapshot: at least one key is registered on it.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace {
constexpr int kListSize = 512;
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotIsLockedByApp(const ORLOiSCSISnapshot *snap, bool *locked) {
    if (snap == nullptr || locked == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    orlo::SzListGuard keys(OLIBCSzListAlloc(kListSize));
    if (keys.get() == nullptr) {
        ORLO_LOG_ERR("Failed to allocate memory for list.");
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    uint32_t ret = ORLOiSCSISnapshotLockedAppKeysGet(snap, keys.addr());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get locked app key for snapshot: %.*s.", static_cast<int>(sizeof(snap->uuid)),
                     snap->uuid);
        return ret;
    }
    *locked = OLIBCSzListCount(keys.get()) > 0;
    return ORLO_OK;
}
