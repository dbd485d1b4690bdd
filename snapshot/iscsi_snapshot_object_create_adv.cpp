// Makes an advanced snapshot's map file: the snapshot's own directory and, in it, a map
// file the length of the LUN's, stamped as a clone of the LUN's map file (a new UUID, the
// LUN's as parent, nothing mapped or synced yet).  The kernel fills it when the clone runs.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_lun.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotObjectCreateADV(const ORLOiSCSILun *lun,
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
    char lunMap[sn::kObjectPathSize], dir[sn::kObjectPathSize], map[sn::kObjectPathSize];
    if ((ret = ORLOiSCSILunMapPathGet(lun, lunMap, sizeof(lunMap))) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunMapPathGet(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(lunMap), sizeof(lunMap), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = sn::AdvMapPath(snap, map, sizeof(map))) != ORLO_OK) return ret;
    if ((snap->conf_flags & sn::kConfTrash) == 0) {
        if ((ret = sn::AdvSnapshotDir(snap, dir, sizeof(dir))) != ORLO_OK) return ret;
        if (orlo::os::Mkdir(dir, S_IRWXU) != 0) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
            return errno == EEXIST ? sn::kErrDirExists : static_cast<uint32_t>(ORLO_ERR_MKDIR);
        }
    }
    if ((ret = ORLOiSCSIEpCloneFileTrunc(map, lunMap)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpCloneFileTrunc(\"%s\", \"%s\") failed, err=%s", map, lunMap, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = ORLOiSCSIEpCloneMapMetaDataFillUp(map, lunMap)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpCloneMapMetaDataFillUp(\"%s\", \"%s\") failed, err=%s", map, lunMap,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
