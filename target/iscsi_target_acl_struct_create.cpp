// Builds an access-list entry from its section's keys; the caller fills tid and
// initiator from the section name.
#include <cstdlib>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetAclStructCreate(const OLIBC_SZHASH *hash, ORLOiSCSIAcl **out) {
    if (hash == nullptr || out == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    const char *authority = OLIBCSzHashGetValue(hash, "authority");
    if (authority == nullptr) {
        ORLO_LOG_ERR("OLIBCSzHashGetValue(%p, \"%s\") failed", static_cast<const void *>(hash), "authority");
        return orlo::target::kErrGetHashValue;
    }
    auto *acl = static_cast<ORLOiSCSIAcl *>(calloc(1, sizeof(ORLOiSCSIAcl)));
    if (acl == nullptr) {
        ORLO_LOG_ERR("calloc(%d, %zu) failed, err=%m", 1, sizeof(ORLOiSCSIAcl));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    acl->authority = static_cast<int32_t>(strtol(authority, nullptr, 10));
    *out = acl;
    return ORLO_OK;
}
