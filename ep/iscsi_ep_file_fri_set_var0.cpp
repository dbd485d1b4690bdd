// Writes the variable block 0 of the free index of an extent-pool file with a fresh checksum.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileFriSetVar0(const char *path, const void *block) {
    if (path == nullptr || path[0] == '\0' || block == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return orlo::ep::BlockSet(path, EP_OFF_VAR0, block, false);
}
