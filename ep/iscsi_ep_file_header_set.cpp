// Writes the common header of an extent-pool file with a fresh checksum; a journal's
// header is forced to disk, since the kernel trusts it after a power loss.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderSet(const char *path, const void *block) {
    if (path == nullptr || path[0] == '\0' || block == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    bool sync = orlo::ep::Get32(block, EP_HDR_OFF_TYPE) == EP_FILE_TYPE_JNL;
    return orlo::ep::BlockSet(path, EP_OFF_HEADER, block, sync);
}
