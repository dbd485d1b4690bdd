// The control string of an extent-pool LUN: the kernel maps the LUN through its map
// file, which must lie on a volume (the pool is found by the volume's number).
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "orlo_storage.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpControlInitString(const ORLOiSCSILun *lun, char *buf, size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char dataPath[orlo::lun::kDataPathSize];
    uint32_t ret = orlo::lun::KernelDataPath(lun, dataPath, sizeof(dataPath));
    if (ret != ORLO_OK) return ret;
    if (ORLOVolIDParse(dataPath) < 0) {
        ORLO_LOG_ERR("ORLOVolIDParse(\"%s\") failed", dataPath);
        return orlo::lun::kErrParseVolumeId;
    }
    int n = snprintf(buf, size, "ep_map_table=1,ep_dev_name=%s", dataPath);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
