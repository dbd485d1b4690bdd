// Takes a snapshot's backstore out of the kernel target.  Removing the directory is what
// switches it off; a snapshot that is not loaded (or a block snapshot, which has no
// backstore) is success.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnload(const ORLOiSCSISnapshot *snap) {
    namespace sn = orlo::snap;
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (snap->type != ORLO_ISCSI_SNAPSHOT_TYPE_ADV) return ORLO_OK;
    uint32_t ret = sn::CheckPathFields(snap, true);
    if (ret != ORLO_OK) return ret;
    char dir[sn::kObjectPathSize];
    if ((ret = sn::ConfigfsDirPath(snap, dir, sizeof(dir))) != ORLO_OK) return ret;
    if (orlo::os::Rmdir(dir) != 0 && errno != ENOENT && errno != ENOTDIR) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}
