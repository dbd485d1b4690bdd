// Takes every vhost target the kernel holds out of /config/target/vhost.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "service/stop_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIVhostStopAllWithoutLock(void) {
    uint32_t ret = orlo::service::DismantleFabric(orlo::service::kVhostFabricDir);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("DismantleFabric(\"%s\") failed, err=%s", orlo::service::kVhostFabricDir, ORLOiSCSIErrStr(ret));
    }
    return ret;
}
