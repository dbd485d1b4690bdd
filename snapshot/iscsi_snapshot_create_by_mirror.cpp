// The application-consistent snapshot of an advanced LUN, through a mirror: the snapshot's
// backstore becomes a mirror child of the LUN's and follows every write while it catches
// up, with the applications running; once it is in step the applications quiesce, the
// mirror is split off (promoted) at that instant, and they resume.  The applications are
// held only for the split, however long the copy takes; the caller waits for the copy
// (the LUN and the snapshot stay locked meanwhile).  On success the record is "Healthy"
// with its version and mapped size, and the snapshot's backstore is out of the kernel.
#include <unistd.h>

#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_snapshot.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

namespace {

namespace sn = orlo::snap;

constexpr unsigned int kPollUs = 200 * 1000;

// Waits until the mirror child has every extent of the parent.
uint32_t WaitInStep(const char *map, const char *dir) {
    for (;;) {
        uint64_t synced = 0, total = 0;
        uint32_t ret = ORLOiSCSIEpChildLunSyncProgressGet(map, &synced, &total);
        if (ret != ORLO_OK) return ret;
        if (total > 0 && synced >= total) return ORLO_OK;
        if (!ORLOiSCSIEpChildLunIsMirror(map) && ORLOiSCSIEpMapFileCloneStatus(map, dir) < 0) {
            ORLO_LOG_ERR("The mirror of %s stopped before it was in step", map);
            return sn::kErrTakeSnapshot;
        }
        usleep(kPollUs);
    }
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotCreateByMirror(const ORLOiSCSILun *lun, ORLOiSCSISnapshot *snap,
                                                                void *engine) {
    (void)engine;
    if (lun == nullptr || snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = ORLOiSCSILunLoad(lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunLoad(%p) failed, err=%s", static_cast<const void *>(lun), ORLOiSCSIErrStr(ret));
        return sn::kErrLoadLun;
    }
    if ((ret = ORLOiSCSISnapshotLoad(snap)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSISnapshotLoad(%p) failed, err=%s", static_cast<void *>(snap), ORLOiSCSIErrStr(ret));
        return sn::kErrLoadSnapshot;
    }
    auto unload = orlo::MakeScopeExit([snap] { ORLOiSCSISnapshotUnload(snap); });
    char lunMap[sn::kObjectPathSize], lunDir[sn::kObjectPathSize], map[sn::kObjectPathSize], dir[sn::kObjectPathSize];
    if (ORLOiSCSILunMapPathGet(lun, lunMap, sizeof(lunMap)) != ORLO_OK ||
        ORLOiSCSILunConfigfsDirPath(lun, lunDir, sizeof(lunDir)) != ORLO_OK ||
        sn::AdvMapPath(snap, map, sizeof(map)) != ORLO_OK || sn::ConfigfsDirPath(snap, dir, sizeof(dir)) != ORLO_OK)
        return ORLO_ERR_PARSE_STRING;
    if ((ret = ORLOiSCSIEpMapFileMirrorStart(lunMap, lunDir, dir)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileMirrorStart(\"%s\", \"%s\", \"%s\") failed, err=%s", lunMap, lunDir, dir,
                     ORLOiSCSIErrStr(ret));
        return sn::kErrTakeSnapshot;
    }
    if ((ret = WaitInStep(map, dir)) != ORLO_OK) return ret;
    if (ORLOiSCSISnapshotLunPlugInNotify(lun, snap, OLIB_PLUGIN_EVENT_PRE, 0) != 0) {
        ORLO_LOG_ERR("Failed to quiesce the applications of LUN %s", lun->name);
        ORLOiSCSISnapshotLunPlugInNotify(lun, snap, OLIB_PLUGIN_EVENT_POST, static_cast<int>(sn::kErrPluginNotify));
        return sn::kErrPluginNotify;
    }
    ret = ORLOiSCSIEpMapFileMirrorPromote(map, dir);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileMirrorPromote(\"%s\", \"%s\") failed, err=%s", map, dir, ORLOiSCSIErrStr(ret));
    if (ORLOiSCSISnapshotLunPlugInNotify(lun, snap, OLIB_PLUGIN_EVENT_POST, static_cast<int>(ret)) != 0)
        ORLO_LOG_ERR("Failed to resume the applications of LUN %s", lun->name);
    if (ret != ORLO_OK) return sn::kErrTakeSnapshot;
    if ((ret = ORLOiSCSIEpMapFileBaseVersionGet(map, snap->version)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileBaseVersionGet(\"%s\", %p) failed, err=%s", map,
                     static_cast<void *>(snap->version), ORLOiSCSIErrStr(ret));
        return sn::kErrBaseVersion;
    }
    if ((ret = ORLOiSCSIEpMapFileMappedSizeGet(map, snap->rootpath, &snap->mappedSize)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileMappedSizeGet(\"%s\", \"%s\", %p) failed, err=%s", map, snap->rootpath,
                     static_cast<void *>(&snap->mappedSize), ORLOiSCSIErrStr(ret));
        return sn::kErrMappedSize;
    }
    snprintf(snap->status, sizeof(snap->status), "%s", "Healthy");
    if ((ret = ORLOiSCSISnapshotConfAdd(snap)) != ORLO_OK)
        ORLO_LOG_ERR("Failed to update status of snapshot LUN to Healthy. lid: %d, sid: %d", snap->lid, snap->sid);
    return ret;
}
