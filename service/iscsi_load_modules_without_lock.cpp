// Inserts the target core and one module set into the kernel.  The caller holds the
// service lock.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/kernel_modules.h"
#include "service/lio_version.h"

namespace {

// Where the kernel target keeps crash dumps, lock files and its persistent
// reservation and ALUA metadata; parents before children.
const char *const kVarDirs[] = {"/var/crash", "/var/lock", "/var/lock/subsys",
                                "/var/target", "/var/target/pr", "/var/target/alua"};

// What each set inserts after the target core, and the name its failure is logged under.
struct SetLoad {
    int set;
    const std::vector<std::string> orlo::LioState::*modules;  // null: the core only
    const char *logName;
};
const SetLoad kSetLoads[] = {
    {ISCSI_KERNEL_MODULES, &orlo::LioState::iscsiModules, "getiSCSIModuleSet()"},
    {VHOST_KERNEL_MODULES, &orlo::LioState::vhostModules, "vhost_module_set"},
    {TCM_KERNEL_MODULES, nullptr, nullptr},
    {LOOPBACK_KERNEL_MODULES, &orlo::LioState::loopbackModules, "loopback_module_set"},
};

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILoadModulesWithoutLock(int module_set) {
    if (!orlo::service::ModuleSetIsValid(module_set)) return ORLO_ERR_BAD_PARAMETER;
    for (const char *dir : kVarDirs) {
        // Only logged: a module runs without them and reports its own trouble.
        if (orlo::os::Mkdir(dir, S_IRWXU) != 0 && errno != EEXIST) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
        }
    }
    // Held for the whole load: the lists stay valid even if the version changes.
    std::shared_ptr<const orlo::LioState> lio = orlo::Lio();
    uint32_t ret = orlo::service::insmod_module_set(lio->tcmModules);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("insmod_module_set(getTcmModuleSet()) failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    for (const SetLoad &load : kSetLoads) {
        if (load.set != module_set || load.modules == nullptr) continue;
        ret = orlo::service::insmod_module_set((*lio).*load.modules);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("insmod_module_set(%s) failed, err=%s", load.logName, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}
