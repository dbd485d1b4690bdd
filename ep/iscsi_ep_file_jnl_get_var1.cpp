// Reads the variable block 1 of the journal of an extent-pool file as stored, checksum included.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileJnlGetVar1(const char *path, void *block) {
    if (path == nullptr || path[0] == '\0' || block == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return orlo::ep::BlockGet(path, EP_OFF_VAR1, block, EP_BLOCK_SIZE);
}
