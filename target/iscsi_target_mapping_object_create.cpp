// Builds one mapping record from the keys of its section.
#include <cstdlib>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetMappingObjectCreate(const OLIBC_SZHASH *hash, ORLOiSCSIMapping **out) {
    if (hash == nullptr || out == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    static const char *const kKeys[] = {"tid", "lid", "lun"};
    const char *values[3];
    for (int i = 0; i < 3; ++i) {
        values[i] = OLIBCSzHashGetValue(hash, kKeys[i]);
        if (values[i] == nullptr) {
            ORLO_LOG_ERR("OLIBCSzHashGetValue(%p, \"%s\") failed", static_cast<const void *>(hash), kKeys[i]);
            OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
            return orlo::conf::kErrGetHashValue;
        }
    }
    auto *m = static_cast<ORLOiSCSIMapping *>(calloc(1, sizeof(ORLOiSCSIMapping)));
    if (m == nullptr) {
        ORLO_LOG_ERR("calloc(%d, %zu) failed, err=%m", 1, sizeof(ORLOiSCSIMapping));
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    m->tid = static_cast<int32_t>(strtol(values[0], nullptr, 10));
    m->lid = static_cast<int32_t>(strtol(values[1], nullptr, 10));
    m->lun = static_cast<int32_t>(strtol(values[2], nullptr, 10));
    *out = m;
    return ORLO_OK;
}
