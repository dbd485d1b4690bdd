// Removes a module set under the service lock.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIUnloadModules(int module_set) {
    ORLOiSCSIServiceLockGuard guard;
    if (!guard.held()) return ORLO_ERR_LOCK_FILE;
    uint32_t ret = ORLOiSCSIUnloadModulesWithoutLock(module_set);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIUnloadModulesWithoutLock(module_set) failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
