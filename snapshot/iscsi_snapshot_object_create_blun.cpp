// Takes a block-family LUN's snapshot: a read-only Btrfs snapshot of the LUN's subvolume,
// "<volume>/@iSCSI/Snapshot/BLUN/<lun uuid>/<uuid>".
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotObjectCreateBLUN(const ORLOiSCSILun *lun,
                                                                  const ORLOiSCSISnapshot *snap) {
    namespace sn = orlo::snap;
    if (lun == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = ORLOiSCSISnapshotMkdir(snap);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotMkdir(%p) failed, err=%s", static_cast<const void *>(snap), ORLOiSCSIErrStr(ret));
        return ret;
    }
    char source[sn::kObjectPathSize], dest[sn::kObjectPathSize];
    if ((ret = sn::BlunSourcePath(lun, source, sizeof(source))) != ORLO_OK) return ret;
    if ((ret = sn::BlunSubvolPath(snap, dest, sizeof(dest))) != ORLO_OK) return ret;
    if (orlo::os::Access(dest, F_OK) == 0) {
        ORLO_LOG_ERR("Child LUN directory exists. path: %s", dest);
        return sn::kErrDirExists;
    }
    if (errno != ENOENT) {
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", dest);
        return sn::kErrStatPath;
    }
    if (ORLOBtrfsSnapshotCreate(source, dest, 1) != 0) {
        ORLO_LOG_PLATFORM("ORLOBtrfsReadOnlySnapshotTake(\"%s\", \"%s\")", source, dest);
        return sn::kErrTakeSnapshot;
    }
    return ORLO_OK;
}
