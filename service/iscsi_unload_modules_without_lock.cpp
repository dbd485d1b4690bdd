// Removes one module set from the kernel, last module first.  Only the set's own
// modules go: the target core stays unless the set is the core itself.  The caller
// holds the service lock.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "service/kernel_modules.h"
#include "service/lio_version.h"

namespace {

struct SetUnload {
    int set;
    const std::vector<std::string> orlo::LioState::*modules;
    const char *logName;
};
const SetUnload kSetUnloads[] = {
    {ISCSI_KERNEL_MODULES, &orlo::LioState::iscsiModules, "getiSCSIModuleSet()"},
    {VHOST_KERNEL_MODULES, &orlo::LioState::vhostModules, "vhost_module_set"},
    {TCM_KERNEL_MODULES, &orlo::LioState::tcmModules, "getTcmModuleSet()"},
    {LOOPBACK_KERNEL_MODULES, &orlo::LioState::loopbackModules, "loopback_module_set"},
};

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIUnloadModulesWithoutLock(int module_set) {
    if (!orlo::service::ModuleSetIsValid(module_set)) return ORLO_ERR_BAD_PARAMETER;
    std::shared_ptr<const orlo::LioState> lio = orlo::Lio();
    for (const SetUnload &unload : kSetUnloads) {
        if (unload.set != module_set) continue;
        uint32_t ret = orlo::service::rmmod_module_set((*lio).*unload.modules);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("rmmod_module_set(%s) failed, err=%s", unload.logName, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}
