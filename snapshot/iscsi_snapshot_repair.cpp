// Brings a LUN's snapshot objects and records back into agreement after a process was
// killed half-way through a creation or deletion.  A creation makes the object (an
// advanced snapshot's map file, a block snapshot's subvolume) before it writes the record,
// and a deletion removes the object before the record, so a killed one leaves
//   - an object whose record is missing (in the LUN's snapshot file; the cache may hold a
//     copy): the object and any cache copy go;
//   - a record whose object is missing: the record goes.
// Snapshots whose operation lock is held are left alone (their operation is under way);
// the caller holds the LUN's lock, so no creation of this LUN is under way.  Each repair is
// logged.  The number of repairs, or -1 when the LUN's snapshots cannot be read.
#include <dirent.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <set>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_snapshot.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

namespace {

namespace sn = orlo::snap;

std::vector<std::string> Entries(const char *dir) {
    std::vector<std::string> out;
    orlo::DirGuard d(orlo::os::Opendir(dir));
    if (d.get() == nullptr) return out;
    while (struct dirent *e = readdir(d.get()))
        if (e->d_name[0] != '.') out.push_back(e->d_name);
    return out;
}

bool Busy(const ORLOiSCSISnapshot *snap) {
    ORLOiSCSISnapshotProgress p;
    return ORLOiSCSISnapshotProgressGet(snap, &p) == ORLO_OK && p.isLocked;
}

bool Exists(const char *path) {
    struct stat st;
    return orlo::os::Lstat(path, &st) == 0;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSISnapshotRepair(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    if (sn::CheckLun(lun) != ORLO_OK) return -1;
    const bool adv = sn::IsAdvFamily(lun->type);
    if (!adv && !sn::IsBlockFamily(lun->type)) return 0;
    ORLOiSCSISnapshotList list = {};
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list] { ORLOiSCSISnapshotListFree(&list); });
    ORLOiSCSISnapshotFilter all = {};
    if (ORLOiSCSISnapshotConfLoadByParentLun(lun, &all, &list) != ORLO_OK) return -1;

    int repaired = 0;
    std::set<std::string> recorded;
    ORLOiSCSIListLink *link;
    ORLOiSCSISnapshot *snap;
    ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, snap) {
        recorded.insert(snap->uuid);
        char object[sn::kObjectPathSize];
        const bool found = snap->type == ORLO_ISCSI_SNAPSHOT_TYPE_ADV
                               ? sn::AdvMapPath(snap, object, sizeof(object)) == ORLO_OK && Exists(object)
                               : sn::BlunSubvolPath(snap, object, sizeof(object)) == ORLO_OK && Exists(object);
        if (found || Busy(snap)) continue;
        ORLO_LOG_ERR("Snapshot %s (uuid %s, lid %d, sid %d) has no object at %s: its record goes", snap->name,
                     snap->uuid, snap->lid, snap->sid, object);
        if (ORLOiSCSISnapshotConfDelete(snap) == ORLO_OK) ++repaired;
    }

    char dir[sn::kObjectPathSize];
    const int32_t type = adv ? ORLO_ISCSI_SNAPSHOT_TYPE_ADV : ORLO_ISCSI_SNAPSHOT_TYPE_BLUN;
    if (sn::LunSnapshotDir(lun->rootPath, type, lun->uuid, dir, sizeof(dir)) != ORLO_OK) return repaired;
    for (const std::string &uuid : Entries(dir)) {
        if (recorded.count(uuid) != 0 || !sn::IsUuidUsable(uuid.c_str(), uuid.size() + 1)) continue;
        ORLOiSCSISnapshot orphan;
        memset(&orphan, 0, sizeof(orphan));
        orphan.lock_fd = -1;
        orphan.lid = lun->lid;
        orphan.type = type;
        snprintf(orphan.uuid, sizeof(orphan.uuid), "%s", uuid.c_str());
        snprintf(orphan.parent_uuid, sizeof(orphan.parent_uuid), "%s", lun->uuid);
        snprintf(orphan.rootpath, sizeof(orphan.rootpath), "%s", lun->rootPath);
        if (Busy(&orphan)) continue;
        const std::string path = std::string(dir) + "/" + uuid;
        ORLO_LOG_ERR("Snapshot object %s has no record: it goes", path.c_str());
        bool removed;
        if (adv) {
            char map[sn::kObjectPathSize];
            // A map file whose record was never written was never cloned into: no extents.
            removed = sn::AdvMapPath(&orphan, map, sizeof(map)) == ORLO_OK &&
                      (orlo::os::Unlink(map) == 0 || errno == ENOENT) &&
                      (orlo::os::Rmdir(path.c_str()) == 0 || errno == ENOENT);
        } else {
            removed = ORLOBtrfsDeleteSubvolFaultTolerant(path.c_str()) == 0;
        }
        if (!removed) {
            ORLO_LOG_ERR("Failed to remove snapshot object %s, err=%m", path.c_str());
            continue;
        }
        ORLOiSCSISnapshotConfDelete(&orphan);  // a copy in the cache, if it got there
        ++repaired;
    }
    return repaired;
}
