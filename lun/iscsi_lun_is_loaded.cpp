// Whether a LUN is in the kernel target: its backstore directory exists.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunIsLoaded(const ORLOiSCSILun *lun, int *loaded) {
    if (lun == nullptr || loaded == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char dir[orlo::lun::kConfigfsPathSize];
    uint32_t ret = ORLOiSCSILunConfigfsDirPath(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ret;
    }
    struct stat st;
    if (orlo::os::Lstat(dir, &st) != 0) {
        // No host directory (modules out) or no backstore: not loaded.
        if (errno == ENOENT || errno == ENOTDIR) {
            *loaded = 0;
            return ORLO_OK;
        }
        ORLO_LOG_ERR("lstat(\"%s\") failed, err=%m", dir);
        return ORLO_ERR_STAT_PATH;
    }
    *loaded = S_ISDIR(st.st_mode) ? 1 : 0;
    return ORLO_OK;
}
