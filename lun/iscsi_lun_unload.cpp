// Takes a LUN's backstore out of the kernel target.  A backstore that a fabric's LUN
// entry still links to serves initiators: it is refused, and the mapping must go first.
// Removing the directory is what switches the backstore off (the kernel's "enable"
// takes only 1).  A LUN that is not loaded is success.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunUnload(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char dir[orlo::lun::kConfigfsPathSize];
    uint32_t ret = ORLOiSCSILunConfigfsDirPath(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ret;
    }
    struct stat st;
    if (orlo::os::Lstat(dir, &st) != 0) {
        if (errno == ENOENT || errno == ENOTDIR) return ORLO_OK;  // not loaded
        ORLO_LOG_ERR("lstat(\"%s\") failed, err=%m", dir);
        return ORLO_ERR_STAT_PATH;
    }
    char link[4096];
    int linked = orlo::lun::FindBackstoreLink(dir, link, sizeof(link));
    if (linked < 0) {
        ORLO_LOG_ERR("Failed to look for links to %s. lid: %d, name: %s", dir, lun->lid, lun->name);
        return ORLO_ERR_OPEN_DIR;
    }
    if (linked > 0) {
        ORLO_LOG_ERR("LUN is mapped: %s links to %s. lid: %d, name: %s", link, dir, lun->lid, lun->name);
        return orlo::lun::kErrLunMapped;
    }
    if (orlo::os::Rmdir(dir) != 0) {
        if (errno == ENOENT) return ORLO_OK;  // taken down meanwhile
        if (errno == EBUSY) {
            // Held by something outside the fabrics' LUN entries (a virtual LUN, say).
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m. lid: %d, name: %s", dir, lun->lid, lun->name);
            return orlo::lun::kErrLunMapped;
        }
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}
