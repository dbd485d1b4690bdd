// Stops what runs beside the kernel target: the LUN-backup daemon (stopped by name;
// finding none running is no failure), the background release of deleted LUNs' space
// that service starts launched, and the iSNS client.  Each failure is logged and the
// next one still stopped; the first failure is returned.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"

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

void KeepFirst(uint32_t *first, uint32_t ret) {
    if (*first == ORLO_OK) *first = ret;
}
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIStopMiscService(void) {
    uint32_t first = ORLO_OK;
    uint32_t ret = ORLOLunBackupStop();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOLunBackupStop() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    ret = ORLOiSCSILunUnmapTrashStop();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunUnmapTrashStop() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    ret = ORLOiSCSIiSNSDisconnect();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIiSNSDisconnect() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    return first;
}
