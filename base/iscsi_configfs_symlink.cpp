// Makes a configfs symbolic link, accepting one that already leads to the same object.
#include <sys/stat.h>

#include <cerrno>
#include <climits>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsSymlink(const char *target, const char *link) {
    if (target == nullptr || link == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (orlo::os::Symlink(target, link) == 0) return ORLO_OK;
    if (errno != EEXIST) {
        ORLO_LOG_ERR("symlink(\"%s\", \"%s\") failed, err=%m", target, link);
        return ORLO_ERR_LINK_FILE;
    }
    // Something is there already: fine when it leads to the same object.
    char existing[ORLO_CONFIGFS_BUF_SIZE];
    ssize_t n = orlo::os::Readlink(link, existing, sizeof(existing) - 1);
    if (n < 0) {
        ORLO_LOG_ERR("readlink(\"%s\", %p, %zu) failed, err=%m", link, static_cast<void *>(existing),
                     sizeof(existing) - 1);
        return ORLO_ERR_READ_FILE;
    }
    existing[n] = '\0';
    struct stat want, have;
    if (orlo::os::Stat(target, &want) != 0) {
        ORLO_LOG_ERR("stat(\"%s\", %p) failed, err=%m", target, static_cast<void *>(&want));
        return ORLO_ERR_STAT_PATH;
    }
    if (orlo::os::Stat(link, &have) != 0) {
        ORLO_LOG_ERR("stat(\"%s\", %p) failed, err=%m", link, static_cast<void *>(&have));
        return ORLO_ERR_STAT_PATH;
    }
    if (want.st_dev == have.st_dev && want.st_ino == have.st_ino) return ORLO_OK;
    ORLO_LOG_ERR("symlink(\"%s\", \"%s\") failed, err=%s", target, link, ORLOiSCSIErrStr(EEXIST));
    return ORLO_ERR_LINK_FILE;
}
