// Takes the trash lock of a volume: the background release of every extent in the
// volume's trash runs under it.  The lock file is named after the volume path without
// its leading slash ("/volume2" -> "/tmp/ep_trash_volume2_unmap_all.lock").
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpTrashLock(int32_t *fd, const char *volume) {
    // The name must be one path component, or the lock file would land elsewhere.
    if (fd == nullptr || volume == nullptr || volume[0] != '/' || volume[1] == '\0' ||
        strchr(volume + 1, '/') != nullptr || strcmp(volume + 1, "..") == 0 || strcmp(volume + 1, ".") == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    *fd = -1;
    char path[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::PathBuild(path, sizeof(path), "/tmp/ep_trash_%s_unmap_all.lock", volume + 1);
    if (ret != ORLO_OK) return ret;
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(path, 1, -1, &handle)) {
        ORLO_LOG_LOCK_FAILED(path);
        return ORLO_ERR_LOCK_FILE;
    }
    *fd = handle;
    return ORLO_OK;
}
