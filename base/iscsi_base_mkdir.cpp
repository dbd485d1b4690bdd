// Makes the runtime directories that lock and progress files live in and, for a
// volume, its @iSCSI tree.  On Btrfs, @iSCSI is a subvolume of its own with
// copy-on-write off: LUN data is rewritten in place and must not fragment, and the
// subvolume keeps the iSCSI data out of snapshots of the volume's shares.
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_base.h"
#include "platform/os_seam.h"

namespace {

// The runtime directories, in the order they are made.
constexpr const char *kRuntimeDirs[] = {
    "/tmp/iscsi",
    "/tmp/iscsi/lun_lock",
    "/tmp/iscsi/lun_unsync",
    "/tmp/iscsi/snapshot_conf_lock",
    "/tmp/iscsi/snapshot_cache",
    "/tmp/iscsi/snapshot_lock",
    "/tmp/iscsi/snapshot_cache_lock",
    "/tmp/iscsi/snapshot_app_lock",
    "/tmp/iscsi/snapshot_unsync_lock",
};

// mkdir with mode 0700 where an existing directory counts as made.  False with errno set.
bool MakeDir(const char *path) {
    if (orlo::os::Mkdir(path, S_IRWXU) == 0) return true;
    int err = errno;
    struct stat st;
    if (err == EEXIST && orlo::os::Stat(path, &st) == 0 && S_ISDIR(st.st_mode)) return true;
    errno = err;
    return false;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIBaseMkdir(const char *volume) {
    if (volume != nullptr) {
        char path[4096];
        int n = snprintf(path, sizeof(path), "%s/@iSCSI", volume);
        if (n < 0 || static_cast<size_t>(n) >= sizeof(path)) {
            ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
            return ORLO_ERR_PARSE_STRING;
        }
        if (ORLOBtrfsIsSubVol(path) != 1 && ORLOGetFSType(volume) == ORLO_FSTYPE_BTRFS) {
            if (ORLOBtrfsCreateSubVol(path) != 0 && ORLOBtrfsIsSubVol(path) != 1) {
                ORLO_LOG_ERR("Failed to create Btrfs subvolume. path: %s", path);
                return ORLO_ERR_CREATE_SUBVOL;
            }
            if (orlo::os::Chmod(path, S_IRWXU) != 0)
                ORLO_LOG_ERR("chmod(\"%s\", S_IRWXU) failed, err=%m", path);
            if (ORLOFSSetNodatacow(path) != 0) ORLO_LOG_PLATFORM("ORLOFSSetNodatacow(\"%s\")", path);
        } else if (!MakeDir(path)) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
            return ORLO_ERR_MKDIR;
        }
        n = snprintf(path, sizeof(path), "%s/@iSCSI/tmp", volume);
        if (n < 0 || static_cast<size_t>(n) >= sizeof(path)) {
            ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(path));
            return ORLO_ERR_PARSE_STRING;
        }
        if (!MakeDir(path)) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
            return ORLO_ERR_MKDIR;
        }
    }
    for (const char *dir : kRuntimeDirs) {
        if (!MakeDir(dir)) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
            return ORLO_ERR_MKDIR;
        }
    }
    return ORLO_OK;
}
