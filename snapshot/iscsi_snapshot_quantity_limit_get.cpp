// The most snapshots a LUN may have: the appliance's "max_snapshot_per_lun", never more
// than 256 (the sids there are); 256 when the setting is missing.  A smaller setting, zero
// or negative included, is taken as it is.
#include <cstdlib>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

namespace {
constexpr const char *kKey = "max_snapshot_per_lun";
constexpr size_t kValueSize = 16;
}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSISnapshotQuantityLimitGet(void) {
    char value[kValueSize];
    if (OLIBCFileGetKeyValue(orlo::snap::kOrloInfoDefaults, kKey, value, sizeof(value)) < 0) {
        if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND)
            ORLO_LOG_PLATFORM("OLIBCFileGetKeyValue(\"%s\", \"%s\", %p, %zu)", orlo::snap::kOrloInfoDefaults, kKey,
                              static_cast<void *>(value), sizeof(value));
        return ORLO_ISCSI_SNAPSHOT_QUANTITY_LIMIT;
    }
    long limit = strtol(value, nullptr, 10);
    return limit > ORLO_ISCSI_SNAPSHOT_QUANTITY_LIMIT ? ORLO_ISCSI_SNAPSHOT_QUANTITY_LIMIT : static_cast<int>(limit);
}
