// Takes the whole kernel target down: the iSCSI service, the loopback and vhost
// fabrics, every backstore, and then the module sets, fabrics before the core (1, 4, 2,
// 3); a set with no module in the kernel is passed over.  Each step runs whatever the one before returned, since a step that failed often
// leaves less for the next to do; the first failure is returned.
//
// The extent pool's journal move needs this stop and reaches it through a hook, which
// is installed here when the library is loaded.
#include <memory>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/kernel_modules.h"
#include "service/lio_version.h"

namespace {

void KeepFirst(uint32_t *first, uint32_t ret) {
    if (*first == ORLO_OK) *first = ret;
}

uint32_t TotallyStopAndUnloadWithoutLock() {
    uint32_t first = ORLO_OK;
    uint32_t ret = ORLOiSCSIStopAllWithoutLock();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIStopAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    if ((ret = ORLOiSCSILoopbackStopAllWithoutLock()) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILoopbackStopAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    if ((ret = ORLOiSCSIVhostStopAllWithoutLock()) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOVHOSTSCSIStopAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    if ((ret = ORLOiSCSILunServiceStopAllWithoutLock()) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunServiceStopAllWithoutLock() failed, err=%s", ORLOiSCSIErrStr(ret));
        KeepFirst(&first, ret);
    }
    for (const orlo::service::ModuleUnloadStep &step : orlo::service::kModuleUnloadOrder) {
        if (!orlo::service::ModuleSetHasModuleIn(step.set)) continue;
        if ((ret = ORLOiSCSIUnloadModulesWithoutLock(step.set)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIUnloadModulesWithoutLock(%s) failed, err=%s", step.name, ORLOiSCSIErrStr(ret));
            KeepFirst(&first, ret);
        }
    }
    return first;
}

// Installs the journal move's hook once, when the library is loaded.
const bool kHookInstalled = [] {
    orlo::ep::SetTotallyStopHook(&ORLOiSCSITotallyStopAndUnload);
    return true;
}();

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITotallyStopAndUnload(void) {
    (void)kHookInstalled;
    ORLOiSCSIServiceLockGuard guard;
    if (!guard.held()) return ORLO_ERR_LOCK_FILE;
    return TotallyStopAndUnloadWithoutLock();
}
