// At start-up: every volume (/volume<n>) whose pool has an unmap buffer (EP_BUF) gets its
// pool on and the buffer handed to the kernel, so the background release of extents can
// run.  Volumes are found by their mount points at the root; one volume's failure does
// not keep the others from being enabled, and the first failure is returned.
#include <dirent.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <cstring>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

namespace {

// Hands the buffer to a pool that is on but was brought up without it.
uint32_t UnmapOn(int n, const char *buf) {
    char enableAttr[320], pathAttr[320];
    if (orlo::ep::PoolConfigfsPath(n, "unmap_enable", enableAttr, sizeof(enableAttr)) != ORLO_OK ||
        orlo::ep::PoolConfigfsPath(n, "unmap_path", pathAttr, sizeof(pathAttr)) != ORLO_OK)
        return ORLO_ERR_PARSE_STRING;
    int v = 0;
    if (ORLOiSCSIConfigfsGetInteger(enableAttr, &v) == ORLO_OK && v == 1) return ORLO_OK;
    uint32_t ret = ORLOiSCSIConfigfsWrite(pathAttr, buf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", pathAttr, buf, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIConfigfsPutInteger(enableAttr, 1);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", enableAttr, 1, ORLOiSCSIErrStr(ret));
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpUnmapBufferCheckAndEnable(void) {
    std::vector<int> volumes;
    if (orlo::VolumeNumbers(&volumes) != ORLO_OK) return ORLO_ERR_OPEN_DIR;
    uint32_t first = ORLO_OK;
    for (int n : volumes) {
        char volume[EP_PATH_SIZE], buf[EP_PATH_SIZE];
        if (orlo::ep::PathBuild(volume, sizeof(volume), "/volume%d", n) != ORLO_OK ||
            orlo::ep::BufPath(volume, buf, sizeof(buf)) != ORLO_OK)
            continue;
        if (orlo::os::Access(buf, F_OK) != 0) continue;
        uint32_t ret = ORLOiSCSIEpEnable(n);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpEnable(%d) failed, err=%s", n, ORLOiSCSIErrStr(ret));
        } else {
            int32_t lockFd = -1;
            ret = ORLOiSCSIEpLock(&lockFd, n);
            if (ret == ORLO_OK) {
                ret = UnmapOn(n, buf);
                uint32_t r = ORLOiSCSIEpUnlock(lockFd);
                if (r != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpUnlock(%d) failed, err=%s", lockFd, ORLOiSCSIErrStr(r));
            } else {
                ORLO_LOG_ERR("ORLOiSCSIEpLock(%p, %d) failed, err=%s", static_cast<void *>(&lockFd), n,
                             ORLOiSCSIErrStr(ret));
            }
        }
        if (ret != ORLO_OK && first == ORLO_OK) first = ret;
    }
    return first;
}
