// Takes the pool lock of one volume: every change to that volume's pool, from any
// process, happens under it.  It waits for ever.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpLock(int32_t *fd, int volumeNumber) {
    if (fd == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *fd = -1;
    char path[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::PathBuild(path, sizeof(path), "/tmp/ep_pool_%d_access.lock", volumeNumber);
    if (ret != ORLO_OK) return ret;
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(path, 1, -1, &handle)) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    *fd = handle;
    return ORLO_OK;
}
