// Stops the daemons that run beside the kernel target.  Today that is the LUN-backup
// daemon; it is stopped by name, and finding none running is no failure.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

namespace {
constexpr const char kKillall[] = "/bin/killall";
constexpr const char kLunBackupDaemon[] = "orlolunbkp";

uint32_t ORLOLunBackupStop() {
    // killall exits 1 when no such process runs; only a run that failed counts.
    int ret = OLIBCExec(kKillall, kLunBackupDaemon, nullptr, nullptr, nullptr);
    if (ret < 0) {
        ORLO_LOG_ERR("OLIBCExec(\"%s\", \"%s\", nullptr, nullptr, nullptr) failed, ret=%d", kKillall,
                     kLunBackupDaemon, ret);
        return ORLO_ERR_DEFAULT;
    }
    return ORLO_OK;
}
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIStopMiscService(void) {
    uint32_t ret = ORLOLunBackupStop();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOLunBackupStop() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
