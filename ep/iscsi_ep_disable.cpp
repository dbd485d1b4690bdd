// Switches a volume's extent pool off in the kernel: the offloaded-copy and unmap
// switches first (so the kernel lets go of those files), then /config/pool/EP_<n> is
// removed.  The kernel refuses while LUNs of the pool are loaded; the pool then stays
// on.  A pool that is off already is left alone.  Runs under the pool lock.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

namespace orlo {
namespace ep {

uint32_t PoolTakeDown(int volumeNumber) {
    char dir[320];
    if (PoolConfigfsPath(volumeNumber, nullptr, dir, sizeof(dir)) != ORLO_OK) return EP_ERR_DISABLE_POOL;
    if (os::Access(dir, F_OK) != 0 && errno == ENOENT) return ORLO_OK;
    for (const char *name : {"rod_enable", "unmap_enable"}) {
        char attr[320];
        if (PoolConfigfsPath(volumeNumber, name, attr, sizeof(attr)) != ORLO_OK) return EP_ERR_DISABLE_POOL;
        int v = 0;
        if (os::Access(attr, F_OK) != 0 || ORLOiSCSIConfigfsGetInteger(attr, &v) != ORLO_OK || v == 0) continue;
        uint32_t ret = ORLOiSCSIConfigfsPutInteger(attr, 0);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", attr, 0, ORLOiSCSIErrStr(ret));
            return EP_ERR_DISABLE_POOL;
        }
    }
    if (os::Rmdir(dir) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        return EP_ERR_DISABLE_POOL;
    }
    return ORLO_OK;
}

}  // namespace ep
}  // namespace orlo

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpDisable(int volumeNumber) {
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
    return orlo::ep::PoolTakeDown(volumeNumber);
}
