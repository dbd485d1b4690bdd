// Takes a LUN's backstore out of the kernel target.  A backstore that a fabric's LUN
// entry still links to serves initiators: it is refused, and the mapping must go first.
// Removing the directory is what switches the backstore off (the kernel's "enable"
// takes only 1).  A LUN that is not loaded is success.
//
// The check that nothing links to the backstore is the removal itself: the kernel
// refuses to remove a directory that any link leads to (EBUSY), whoever made the link
// and whether or not the mappings file knows of it, and it decides that atomically, so
// no link can slip in between a look and the removal.  Only when it refuses are the
// fabrics' LUN entries searched, to name the link in the log line; an unload of a LUN
// no target uses costs the same however many targets there are.
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
    if (orlo::os::Rmdir(dir) == 0) return ORLO_OK;
    if (errno == ENOENT) return ORLO_OK;  // taken down meanwhile
    if (errno != EBUSY) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        return ORLO_ERR_RMDIR;
    }
    char link[4096];
    if (orlo::lun::FindBackstoreLink(dir, link, sizeof(link)) > 0) {
        ORLO_LOG_ERR("LUN is mapped: %s links to %s. lid: %d, name: %s", link, dir, lun->lid, lun->name);
        return orlo::lun::kErrLunMapped;
    }
    // Held by something outside the fabrics' LUN entries (a virtual LUN, say), or by a
    // link that went while we looked.  A search that could not read the tree has logged
    // why; the refusal stands either way.
    errno = EBUSY;
    ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m. lid: %d, name: %s", dir, lun->lid, lun->name);
    return orlo::lun::kErrLunMapped;
}
