// The first part of a service start, under the caller's service lock: the iSCSI module
// set (with the target core before it) and the plug-in daemon.  The daemon is started
// through the init system; when that cannot be run the start goes on without it.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

namespace {
constexpr const char kInitctl[] = "/sbin/initctl";
constexpr const char kInitctlStart[] = "start";
constexpr const char kPluginDaemon[] = "is_plugind";
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIStartBasicWithoutLock(void) {
    uint32_t ret = ORLOiSCSILoadModulesWithoutLock(ISCSI_KERNEL_MODULES);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILoadModulesWithoutLock(ISCSI_KERNEL_MODULES) failed, err=%s", ORLOiSCSIErrStr(ret));
        return ORLO_ERR_INSMOD;
    }
    // initctl exits non-zero when the daemon runs already; only a run that failed is
    // worth a line.
    int rc = OLIBCExec(kInitctl, kInitctlStart, kPluginDaemon, nullptr, nullptr);
    if (rc < 0) {
        ORLO_LOG_ERR("OLIBCExec(\"%s\", \"%s\", \"%s\", nullptr, nullptr) failed, ret=%d", kInitctl, kInitctlStart,
                     kPluginDaemon, rc);
    }
    return ORLO_OK;
}
