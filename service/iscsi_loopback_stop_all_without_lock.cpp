// Takes every loopback LUN the kernel holds out of /config/target/loopback.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "service/stop_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILoopbackStopAllWithoutLock(void) {
    uint32_t ret = orlo::service::DismantleFabric(orlo::service::kLoopbackFabricDir);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("DismantleFabric(\"%s\") failed, err=%s", orlo::service::kLoopbackFabricDir,
                     ORLOiSCSIErrStr(ret));
    }
    return ret;
}
