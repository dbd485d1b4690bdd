// Makes the directories a LUN's snapshots live in: "<volume>/@iSCSI/Snapshot",
// "<volume>/@iSCSI/Snapshot/<ADV|BLUN>" and the LUN's own "<...>/<lun uuid>" (mode 0700;
// directories that exist are fine).  Block snapshots are subvolumes made inside the last
// one, so on Btrfs it stays a plain directory of the volume's top subvolume.
#include <cerrno>
#include <string>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotMkdir(const ORLOiSCSISnapshot *snap) {
    namespace sn = orlo::snap;
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = sn::CheckPathFields(snap, true);
    if (ret != ORLO_OK) return ret;
    char lunDir[sn::kObjectPathSize];
    if ((ret = sn::LunSnapshotDir(snap->rootpath, snap->type, snap->parent_uuid, lunDir, sizeof(lunDir))) != ORLO_OK)
        return ret;
    const std::string top = std::string(snap->rootpath) + "/@iSCSI/Snapshot";
    const std::string kind = top + "/" + sn::TypeWord(snap->type);
    for (const std::string &dir : {std::string(snap->rootpath) + "/@iSCSI", top, kind, std::string(lunDir)}) {
        if (orlo::os::Mkdir(dir.c_str(), S_IRWXU) != 0 && errno != EEXIST) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir.c_str());
            return ORLO_ERR_MKDIR;
        }
    }
    return ORLO_OK;
}
