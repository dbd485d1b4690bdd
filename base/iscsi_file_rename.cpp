// Moves a file; where asked, also between file systems by copying it and removing the
// old one.  A Btrfs source is never moved that way: its extents may be shared with
// snapshots, and a byte copy would silently multiply the space it takes.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIFileRename(const char *oldPath, const char *newPath, int acrossFs) {
    if (oldPath == nullptr || newPath == nullptr || oldPath[0] == '\0' || newPath[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (orlo::os::Rename(oldPath, newPath) == 0) return ORLO_OK;
    if (!acrossFs || errno != EXDEV) {
        ORLO_LOG_ERR("rename(\"%s\", \"%s\") failed, err=%m", oldPath, newPath);
        return ORLO_ERR_RENAME_FILE;
    }
    int fsType = ORLOGetFSType(oldPath);
    if (fsType < 0) {
        ORLO_LOG_PLATFORM("ORLOGetFSType(\"%s\")", oldPath);
        return ORLO_ERR_RENAME_FILE;
    }
    if (fsType == ORLO_FSTYPE_BTRFS) {
        ORLO_LOG_ERR("Cannot move \"%s\" off Btrfs to \"%s\" by copying", oldPath, newPath);
        return ORLO_ERR_BAD_FS_TYPE;
    }
    if (ORLOFileCopy(oldPath, newPath) != 0) {
        ORLO_LOG_PLATFORM("ORLOFileCopy(\"%s\", \"%s\")", oldPath, newPath);
        return ORLO_ERR_COPY_FILE;
    }
    if (orlo::os::Unlink(oldPath) != 0) {
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", oldPath);
        return ORLO_ERR_UNLINK_FILE;
    }
    return ORLO_OK;
}
