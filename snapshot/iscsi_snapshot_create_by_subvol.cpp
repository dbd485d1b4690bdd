// The application-consistent snapshot of a block-family LUN: the applications' plug-ins
// quiesce, the read-only subvolume snapshot is taken, they resume (told how it went), and
// the record is written.  A quiesce that fails aborts before anything is made.  The engine
// handle of the appliance's IPC is not needed: plug-ins are executables (see
// iscsi_snapshot_lun_plug_in_notify.cpp).
#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "orloiscsi_snapshot.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotCreateBySubvol(const ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap,
                                                                void *engine) {
    namespace sn = orlo::snap;
    (void)engine;
    if (lun == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (ORLOiSCSISnapshotLunPlugInNotify(lun, snap, OLIB_PLUGIN_EVENT_PRE, 0) != 0) {
        ORLO_LOG_ERR("Failed to quiesce the applications of LUN %s", lun->name);
        ORLOiSCSISnapshotLunPlugInNotify(lun, snap, OLIB_PLUGIN_EVENT_POST, static_cast<int>(sn::kErrPluginNotify));
        return sn::kErrPluginNotify;
    }
    uint32_t ret = ORLOiSCSISnapshotObjectCreateBLUN(lun, snap);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSISnapshotObjectCreateBLUN(%p, %p) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<const void *>(snap), ORLOiSCSIErrStr(ret));
    // Resumed as soon as the subvolume is there (or is known not to come).
    if (ORLOiSCSISnapshotLunPlugInNotify(lun, snap, OLIB_PLUGIN_EVENT_POST, static_cast<int>(ret)) != 0)
        ORLO_LOG_ERR("Failed to resume the applications of LUN %s", lun->name);
    if (ret != ORLO_OK) return ret;
    if ((ret = ORLOiSCSISnapshotConfAdd(snap)) != ORLO_OK)
        ORLO_LOG_ERR("Failed to add Snapshot config from parent-lid:%d, sid:%d", snap->lid, snap->sid);
    return ret;
}
