// Takes every backstore out of the target-core hosts.  It works from the kernel's tree,
// so LUNs the files no longer know, trash backstores and half-loaded ones go too.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "service/stop_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunServiceStopAllWithoutLock(void) {
    uint32_t ret = orlo::service::RemoveAllBackstores();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("RemoveAllBackstores() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
