// The control string of a file LUN (FILE, THIN, BLUN, VDISK_BLUN and the other file
// kinds outside the extent pool): the data file, its size, thin provisioning, block
// size, the sink name (the uuid) and direct I/O, which only virtual-disk BLUNs use.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileControlInitString(const ORLOiSCSILun *lun, char *buf,
                                                                        size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char dataPath[orlo::lun::kDataPathSize];
    uint32_t ret = orlo::lun::KernelDataPath(lun, dataPath, sizeof(dataPath));
    if (ret != ORLO_OK) return ret;
    const int thin = ORLO_ISCSI_LUN_TYPE_HAS(lun->type, 0x7u) ? 1 : 0;
    const int dio = lun->type == ORLO_ISCSI_LUN_TYPE_VDISK_BLUN ? 1 : 0;
    int n = snprintf(buf, size, "fd_dev_name=%s,fd_dev_size=%llu,thin_provision=%d,block_size=%d,enable_sink=%s,fd_dio=%d",
                     dataPath, static_cast<unsigned long long>(lun->size), thin, static_cast<int>(lun->blockSize),
                     lun->uuid, dio);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
