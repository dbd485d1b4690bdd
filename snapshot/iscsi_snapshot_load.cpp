// Makes a snapshot present in the kernel target as a backstore of the extent pool's host:
// "LUN_<lun uuid>_SN_<uuid>" (or its trash / unsynchronised form), controlled by the
// snapshot's map file, identified by the snapshot's UUID and name, and switched on.  This
// is the child a kernel clone or mirror of the LUN fills.  A backstore that is there
// already is left as it is; a failed load removes the directory it made.
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_ep.h"
#include "platform/os_seam.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

namespace {

namespace sn = orlo::snap;

uint32_t Write(const char *dir, const char *leaf, const char *value) {
    char path[sn::kObjectPathSize];
    int n = snprintf(path, sizeof(path), "%s/%s", dir, leaf);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(path)) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
        return ORLO_ERR_PARSE_STRING;
    }
    uint32_t ret = ORLOiSCSIConfigfsWrite(path, value);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, value, ORLOiSCSIErrStr(ret));
    return ret;
}

uint32_t Configure(const ORLOiSCSISnapshot *snap, const char *dir) {
    char map[sn::kObjectPathSize];
    uint32_t ret = sn::AdvMapPath(snap, map, sizeof(map));
    if (ret != ORLO_OK) return ret;
    char control[sn::kObjectPathSize + 32];
    snprintf(control, sizeof(control), "ep_map_table=1,ep_dev_name=%s", map);
    if ((ret = Write(dir, "control", control)) != ORLO_OK) return ret;
    if ((ret = Write(dir, "wwn/vpd_unit_serial", snap->uuid)) != ORLO_OK) return ret;
    if ((ret = Write(dir, "attrib/uuid", snap->uuid)) != ORLO_OK) return ret;
    if ((ret = Write(dir, "attrib/lun_name", snap->name)) != ORLO_OK) return ret;
    return Write(dir, "enable", "1");
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotLoad(const ORLOiSCSISnapshot *snap) {
    if (snap == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = sn::CheckPathFields(snap, true);
    if (ret != ORLO_OK) return ret;
    if (snap->type != ORLO_ISCSI_SNAPSHOT_TYPE_ADV) {
        ORLO_LOG_ERR("Only advanced snapshots have a backstore. sid: %d, type: %d", snap->sid, snap->type);
        return sn::kErrBadType;
    }
    const int volume = ORLOVolIDParse(snap->rootpath);
    if (volume < 0) {
        ORLO_LOG_ERR("ORLOVolIDParse(\"%s\") failed", snap->rootpath);
        return ORLO_ERR_BAD_PARAMETER;
    }
    if ((ret = ORLOiSCSIEpEnable(volume)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpEnable(%d) failed, err=%s", volume, ORLOiSCSIErrStr(ret));
        return ret;
    }
    char dir[sn::kObjectPathSize];
    if ((ret = sn::ConfigfsDirPath(snap, dir, sizeof(dir))) != ORLO_OK) return ret;
    if (orlo::os::Mkdir(dir, S_IRWXU) != 0) {
        if (errno == EEXIST) return ORLO_OK;  // loaded already
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
        return ORLO_ERR_MKDIR;
    }
    ret = Configure(snap, dir);
    if (ret != ORLO_OK && orlo::os::Rmdir(dir) != 0 && errno != ENOENT) ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
    return ret;
}
