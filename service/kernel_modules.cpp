// Module insertion and removal.  A module whose file the appliance does not ship is
// not part of this model's kernel and is skipped in both directions.
#include "service/kernel_modules.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/lio_version.h"

namespace orlo {
namespace service {

namespace {

const char kInsmod[] = "/sbin/insmod";

// Whether the module's file is there; an existence test that fails for another reason
// than absence is logged and counts as absent, since nothing can be inserted from it.
bool ModuleFileExists(const std::string &file) {
    if (os::Access(file.c_str(), F_OK) == 0) return true;
    if (errno != ENOENT)
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", file.c_str());
    return false;
}

}  // namespace

std::string ModuleFile(const std::string &name) { return "/lib/modules/" + name + ".ko"; }

bool ModuleSetIsValid(int moduleSet) {
    if (moduleSet >= ISCSI_KERNEL_MODULES && moduleSet <= LOOPBACK_KERNEL_MODULES) return true;
    ORLO_LOG_ERR("invalid kernel module set: %d", moduleSet);
    return false;
}

uint32_t insmod_if_module_file_exist(const std::string &name) {
    std::string file = ModuleFile(name);
    if (!ModuleFileExists(file)) return ORLO_OK;
    // A second start finds the modules in already; insmod would refuse them.
    if (os::ModuleLoaded(name.c_str()) == 1) return ORLO_OK;
    ORLO_LOG(LOG_INFO, "Loading module '%s'", name.c_str());
    int ret = OLIBCExec(kInsmod, file.c_str(), nullptr, nullptr, nullptr);
    if (ret != 0) {
        ORLO_LOG_ERR("OLIBCExec(\"%s\", \"%s\", nullptr, nullptr, nullptr), ret=%d", kInsmod, file.c_str(), ret);
        return ORLO_ERR_INSMOD;
    }
    ORLO_LOG(LOG_INFO, "OLIBCExec(\"%s\", \"%s\", nullptr, nullptr, nullptr), ret=%d", kInsmod, file.c_str(), ret);
    return ORLO_OK;
}

uint32_t insmod_module_set(const std::vector<std::string> &modules) {
    for (const std::string &name : modules) {
        uint32_t ret = insmod_if_module_file_exist(name);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("insmod_if_module_file_exist(\"%s\") failed, err=%s", name.c_str(), ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

uint32_t rmmod_if_module_file_exist(const std::string &name) {
    if (!ModuleFileExists(ModuleFile(name))) return ORLO_OK;
    ORLO_LOG(LOG_INFO, "Unloading module '%s'", name.c_str());
    // O_NONBLOCK: a module in use is refused at once instead of waiting for its users.
    if (os::DeleteModule(name.c_str(), O_NONBLOCK) != 0) {
        ORLO_LOG_ERR("syscall(__NR_delete_module, \"%s\", O_NONBLOCK) failed, err=%m", name.c_str());
        return ORLO_ERR_RMMOD;
    }
    return ORLO_OK;
}

uint32_t rmmod_module_set(const std::vector<std::string> &modules) {
    for (auto it = modules.rbegin(); it != modules.rend(); ++it) {
        uint32_t ret = rmmod_if_module_file_exist(*it);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("rmmod_if_module_file_exist(\"%s\") failed, err=%s", it->c_str(), ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

const ModuleUnloadStep kModuleUnloadOrder[4] = {
    {ISCSI_KERNEL_MODULES, "ISCSI_KERNEL_MODULES"},
    {LOOPBACK_KERNEL_MODULES, "LOOPBACK_KERNEL_MODULES"},
    {VHOST_KERNEL_MODULES, "VHOST_KERNEL_MODULES"},
    {TCM_KERNEL_MODULES, "TCM_KERNEL_MODULES"},
};

bool ModuleSetHasModuleIn(int moduleSet) {
    std::shared_ptr<const LioState> lio = Lio();
    const std::vector<std::string> *modules = nullptr;
    switch (moduleSet) {
        case ISCSI_KERNEL_MODULES: modules = &lio->iscsiModules; break;
        case VHOST_KERNEL_MODULES: modules = &lio->vhostModules; break;
        case TCM_KERNEL_MODULES: modules = &lio->tcmModules; break;
        case LOOPBACK_KERNEL_MODULES: modules = &lio->loopbackModules; break;
        default: return false;
    }
    for (const std::string &name : *modules)
        if (os::ModuleLoaded(name.c_str()) != 0) return true;
    return false;
}

}  // namespace service
}  // namespace orlo
