// Reads the whole head of a map file (common header to variable block 2) in one read.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileMapGetAll(const char *path, void *buf) {
    if (path == nullptr || path[0] == '\0' || buf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return orlo::ep::BlockGet(path, EP_OFF_HEADER, buf, EP_MAP_HEAD_SIZE);
}
