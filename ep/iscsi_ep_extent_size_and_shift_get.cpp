// The extent size of a volume's pool, from its table file, and its base-2 logarithm.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpExtentSizeAndShiftGet(const char *volume, uint32_t *size,
                                                                 uint32_t *shift) {
    if (volume == nullptr || volume[0] == '\0' || size == nullptr || shift == nullptr) {
        ORLO_LOG_ERR("Invalid input.");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_NULL_POINTER;
    }
    *size = static_cast<uint32_t>(-1);
    *shift = static_cast<uint32_t>(-1);
    char tbl[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::TblPath(volume, tbl, sizeof(tbl));
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Access(tbl, F_OK) != 0) {
        if (errno == ENOENT) {
            *size = 0;  // no pool on this volume yet
            *shift = 0;
            return ORLO_OK;
        }
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", tbl);
        return ORLO_ERR_ACCESS_PATH;
    }
    unsigned char header[EP_BLOCK_SIZE];
    ret = ORLOiSCSIEpFileTblHeaderGet(tbl, header);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileTblHeaderGet(\"%s\", %p) failed, err=%s", tbl, static_cast<void *>(header),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t extent = orlo::ep::Get32(header, EP_TBL_OFF_EXTENT_SIZE);
    if (extent < EP_EXTENT_SIZE_MIN || extent > EP_EXTENT_SIZE_MAX || (extent & (extent - 1)) != 0) {
        ORLO_LOG_ERR("Bad extent size: %u", extent);
        return EP_ERR_BAD_EXTENT_SIZE;
    }
    uint32_t s = 0;
    while ((1u << s) < extent) ++s;
    *size = extent;
    *shift = s;
    return ORLO_OK;
}
