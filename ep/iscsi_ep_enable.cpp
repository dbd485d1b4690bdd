// Switches a volume's extent pool on in the kernel: makes /config/pool/EP_<n> (the
// kernel finds the pool files of /volume<n> by the number) and, where the pool has them,
// hands it the offloaded-copy file EP_ROD and the unmap buffer EP_BUF, each by writing
// its path and then its switch.  A pool that is on already is left alone.  A failure
// after the directory was made takes it down again, so the pool is either on with all
// its parts or off.  Runs under the pool lock.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

namespace {

// Writes "<attr prefix>_path" and then "<attr prefix>_enable" = 1 when file exists.
uint32_t HandOver(int volumeNumber, const char *file, const char *pathAttr, const char *enableAttr) {
    if (orlo::os::Access(file, F_OK) != 0) return ORLO_OK;
    char attr[320];
    uint32_t ret = orlo::ep::PoolConfigfsPath(volumeNumber, pathAttr, attr, sizeof(attr));
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIConfigfsWrite(attr, file);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", attr, file, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = orlo::ep::PoolConfigfsPath(volumeNumber, enableAttr, attr, sizeof(attr));
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIConfigfsPutInteger(attr, 1);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", attr, 1, ORLOiSCSIErrStr(ret));
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpEnable(int volumeNumber) {
    if (volumeNumber < 1) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    int32_t lockFd = -1;
    uint32_t ret = ORLOiSCSIEpLock(&lockFd, volumeNumber);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpLock(%p, %d) failed, err=%s", static_cast<void *>(&lockFd), volumeNumber,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    auto unlock = orlo::MakeScopeExit([&] {
        uint32_t r = ORLOiSCSIEpUnlock(lockFd);
        if (r != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpUnlock(%d) failed, err=%s", lockFd, ORLOiSCSIErrStr(r));
    });

    bool on = false;
    ret = ORLOiSCSIEpIsEnabled(volumeNumber, &on);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpIsEnabled(%d, %p) failed, err=%s", volumeNumber, static_cast<void *>(&on),
                     ORLOiSCSIErrStr(ret));
        return EP_ERR_ENABLE_POOL;
    }
    if (on) return ORLO_OK;

    char volume[EP_PATH_SIZE];
    char tbl[EP_PATH_SIZE], buf[EP_PATH_SIZE], rod[EP_PATH_SIZE], dir[320];
    if (orlo::ep::PathBuild(volume, sizeof(volume), "/volume%d", volumeNumber) != ORLO_OK ||
        orlo::ep::TblPath(volume, tbl, sizeof(tbl)) != ORLO_OK || orlo::ep::BufPath(volume, buf, sizeof(buf)) != ORLO_OK ||
        orlo::ep::RodPath(volume, rod, sizeof(rod)) != ORLO_OK ||
        orlo::ep::PoolConfigfsPath(volumeNumber, nullptr, dir, sizeof(dir)) != ORLO_OK)
        return ORLO_ERR_PARSE_STRING;
    if (orlo::os::Access(tbl, F_OK) != 0) {
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", tbl);
        return EP_ERR_ENABLE_POOL;
    }
    if (orlo::os::Mkdir(dir, 0700) != 0) {
        if (errno == EEXIST) return ORLO_OK;  // brought up by someone without our lock
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
        return EP_ERR_ENABLE_POOL;
    }
    ret = HandOver(volumeNumber, rod, "rod_path", "rod_enable");
    if (ret == ORLO_OK) ret = HandOver(volumeNumber, buf, "unmap_path", "unmap_enable");
    if (ret == ORLO_OK) return ORLO_OK;
    uint32_t r = orlo::ep::PoolTakeDown(volumeNumber);
    if (r != ORLO_OK) ORLO_LOG_ERR("PoolTakeDown(%d) failed, err=%s", volumeNumber, ORLOiSCSIErrStr(r));
    return EP_ERR_ENABLE_POOL;
}
