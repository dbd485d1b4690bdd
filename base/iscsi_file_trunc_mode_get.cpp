// Chooses how a new LUN file is grown on a file system: sparse when asked, allocated
// where fallocate is cheap (ext4, Btrfs), zero-filled elsewhere.
#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"

extern "C" ORLO_EXPORT int ORLOiSCSIFileTruncModeGet(int sparse, int fsType, unsigned int *pMode) {
    if (pMode == nullptr || fsType < 0 || (fsType > ORLO_FSTYPE_EXT2 && fsType != ORLO_FSTYPE_TMPFS)) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    if (sparse) {
        *pMode = ORLO_ISCSI_TRUNC_MODE_SPARSE;
    } else if (fsType == ORLO_FSTYPE_EXT4 || fsType == ORLO_FSTYPE_BTRFS) {
        *pMode = ORLO_ISCSI_TRUNC_MODE_ALLOC;
    } else {
        *pMode = ORLO_ISCSI_TRUNC_MODE_ZERO;
    }
    return 0;
}
