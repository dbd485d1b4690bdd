// Used space of a volume's pool in bytes: the extents the free index counts in the data
// files less those it counts free, shifted by the pool's extent shift.  A volume without
// a pool uses none.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpUsedSpaceGet(const char *volume, uint64_t *bytes) {
    if (volume == nullptr || volume[0] == '\0' || bytes == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char fri[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::FriPath(volume, fri, sizeof(fri));
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Access(fri, F_OK) != 0) {
        if (errno == ENOENT) {
            *bytes = 0;
            return ORLO_OK;
        }
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", fri);
        return ORLO_ERR_ACCESS_PATH;
    }
    unsigned char block[EP_BLOCK_SIZE];
    ret = ORLOiSCSIEpFileFriHeaderGet(fri, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileFriHeaderGet(\"%s\", %p) failed, err=%s", fri, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t size = 0, shift = 0;
    ret = ORLOiSCSIEpExtentSizeAndShiftGet(volume, &size, &shift);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpExtentSizeAndShiftGet(\"%s\", %p, %p) failed, err=%s", volume,
                     static_cast<void *>(&size), static_cast<void *>(&shift), ORLOiSCSIErrStr(ret));
        return ret;
    }
    const uint64_t total = orlo::ep::Get64(block, EP_FRI_OFF_TOTAL);
    const uint64_t free = orlo::ep::Get64(block, EP_FRI_OFF_FREE);
    // More free than there are, or a count that overflows in bytes: not a header the
    // kernel wrote.
    if (free > total || (shift > 0 && ((total - free) >> (64 - shift)) != 0)) {
        ORLO_LOG_ERR("Bad free-index header in %s: total %llu, free %llu", fri, static_cast<unsigned long long>(total),
                     static_cast<unsigned long long>(free));
        return EP_ERR_PARSE_HEADER;
    }
    *bytes = (total - free) << shift;
    return ORLO_OK;
}
