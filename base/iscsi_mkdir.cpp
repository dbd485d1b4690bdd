// Makes a LUN or object directory: a plain directory, or where asked a Btrfs subvolume
// with copy-on-write off, so that it can be snapshotted and deleted as one.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIMkdir(const char *path, int asSubvol) {
    if (path == nullptr || path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    struct stat st;
    if (asSubvol) {
        if (orlo::os::Lstat(path, &st) == 0) {
            if (ORLOBtrfsIsSubVol(path) == 1) return ORLO_OK;
            ORLO_LOG_ERR("LUN directory exists. path: %s", path);
            return ORLO_ERR_FILE_EXISTS;
        }
        if (ORLOBtrfsCreateSubVol(path) != 0) {
            ORLO_LOG_ERR("Failed to create Btrfs subvolume. path: %s", path);
            return ORLO_ERR_CREATE_SUBVOL;
        }
        if (ORLOFSSetNodatacow(path) != 0) ORLO_LOG_PLATFORM("ORLOFSSetNodatacow(\"%s\")", path);
        return ORLO_OK;
    }
    if (orlo::os::Mkdir(path, S_IRWXU) == 0) return ORLO_OK;
    int err = errno;
    if (err == EEXIST && orlo::os::Stat(path, &st) == 0 && S_ISDIR(st.st_mode)) return ORLO_OK;
    errno = err;
    ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
    return ORLO_ERR_MKDIR;
}
