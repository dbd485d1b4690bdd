// Reads the variable block 2 (clone and mirror state) of a map file of an extent-pool file as stored, checksum included.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapGetVar2(const char *path, void *block) {
    if (path == nullptr || path[0] == '\0' || block == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return orlo::ep::BlockGet(path, EP_OFF_VAR2, block, EP_BLOCK_SIZE);
}
