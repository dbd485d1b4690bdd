// Removes a LUN or object directory: a Btrfs subvolume with everything in it, or an
// empty plain directory.  A directory that is already gone is success.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIRmdir(const char *path) {
    if (path == nullptr || path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (ORLOBtrfsIsSubVol(path) == 1) {
        if (ORLOBtrfsDeleteSubvolFaultTolerant(path) != 0) {
            ORLO_LOG_PLATFORM("ORLOBtrfsDeleteSubvolFaultTolerant(\"%s\")", path);
            return ORLO_ERR_DELETE_SUBVOL;
        }
        return ORLO_OK;
    }
    if (orlo::os::Rmdir(path) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", path);
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}
