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
#include "service/lio_version.h"

namespace {

struct ModuleStep {
    int set;
    const char *name;
    const std::vector<std::string> orlo::LioState::*modules;
};
const ModuleStep kUnloadOrder[] = {
    {ISCSI_KERNEL_MODULES, "ISCSI_KERNEL_MODULES", &orlo::LioState::iscsiModules},
    {LOOPBACK_KERNEL_MODULES, "LOOPBACK_KERNEL_MODULES", &orlo::LioState::loopbackModules},
    {VHOST_KERNEL_MODULES, "VHOST_KERNEL_MODULES", &orlo::LioState::vhostModules},
    {TCM_KERNEL_MODULES, "TCM_KERNEL_MODULES", &orlo::LioState::tcmModules},
};

// A set none of whose modules is in the kernel (never loaded, or taken out by an
// earlier stop) has nothing to remove; removing it would only report the kernel's
// "not loaded" for its first module.  When the module table cannot be read the set is
// removed all the same.
bool SetHasModuleIn(const ModuleStep &step) {
    std::shared_ptr<const orlo::LioState> lio = orlo::Lio();
    for (const std::string &name : (*lio).*step.modules)
        if (orlo::os::ModuleLoaded(name.c_str()) != 0) return true;
    return false;
}

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
    for (const ModuleStep &step : kUnloadOrder) {
        if (!SetHasModuleIn(step)) continue;
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
