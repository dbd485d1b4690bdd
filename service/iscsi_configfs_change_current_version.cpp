// Switches the kernel target core between its two generations (2 "lio", 4 "lio4x").
// Everything the old core holds is taken down (targets, vhost, backstores, and the
// extent pools, which pin the core's modules) and its modules removed, the new version is
// made current for this process and written to the platform defaults file for the next
// ones, and the service is started again on the new core.  Extent-pool (advanced) LUNs
// thereby move between the hosts epio_0 (version 4) and fileio_0 (version 2): the start
// loads them under the host of the new version.
//
// The switch relies on the service lock that each stop, unload and start takes; it must
// not overlap other kernel-wide operations.
#include <dirent.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/lio_version.h"

namespace {

constexpr const char kDefaultsFile[] = "/etc.defaults/orloinfo.conf";
constexpr const char kTargetTypeKey[] = "iscsi_target_type";
constexpr const char kKeyLineFmt[] = "%s=\"%s\"\n";
constexpr const char kPoolDir[] = "/config/pool";

// The module sets in the order they come out: fabrics before the core.
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

// A set none of whose modules is in (never loaded, as vhost and loopback often are) has
// nothing to remove; removing it would only fail at its first module.  When the module
// table cannot be read the set is removed all the same.
bool SetHasModuleIn(const ModuleStep &step) {
    std::shared_ptr<const orlo::LioState> lio = orlo::Lio();
    for (const std::string &name : (*lio).*step.modules)
        if (orlo::os::ModuleLoaded(name.c_str()) != 0) return true;
    return false;
}

// Every extent pool the kernel holds goes off: a pool pins the core's extent-pool module.
// The start on the new core switches each pool on again as it loads the pool's LUNs.
uint32_t DisablePools() {
    std::vector<int> pools;
    {
        orlo::DirGuard dir(orlo::os::Opendir(kPoolDir));
        if (dir.get() == nullptr) {
            if (errno == ENOENT) return ORLO_OK;  // no extent-pool module in
            ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", kPoolDir);
            return ORLO_ERR_OPEN_DIR;
        }
        while (struct dirent *e = readdir(dir.get())) {
            int n = 0, end = 0;
            if (sscanf(e->d_name, "EP_%d%n", &n, &end) == 1 && e->d_name[end] == '\0' && n > 0) pools.push_back(n);
        }
    }
    for (int n : pools) {
        uint32_t ret = ORLOiSCSIEpDisable(n);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpDisable(%d) failed, err=%s", n, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

const char *TargetTypeOf(unsigned int version) { return version == 4 ? "lio4x" : "lio"; }

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsChangeCurrentVersion(unsigned int version) {
    if (version != 2 && version != 4) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (version == ORLOiSCSIGetLioVersion()) return ORLO_OK;

    uint32_t ret = ORLOiSCSIStopAll();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIStopAll() failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIVhostStopAll();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIVhostStopAll() failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSILunServiceStopAll();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunServiceStopAll() failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = DisablePools()) != ORLO_OK) return ret;
    for (const ModuleStep &step : kUnloadOrder) {
        if (!SetHasModuleIn(step)) continue;
        ret = ORLOiSCSIUnloadModules(step.set);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIUnloadModules(%s) failed, err=%s", step.name, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }

    orlo::LioSetVersion(version);
    if (OLIBCFileSetKeyValue(kDefaultsFile, kTargetTypeKey, TargetTypeOf(version), kKeyLineFmt) < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileSetKeyValue(\"%s\", \"%s\", \"%s\", \"%s\")", kDefaultsFile, kTargetTypeKey,
                          TargetTypeOf(version), "%s=\\\"%s\\\"\\n");
        return ORLO_ERR_WRITE_FILE;
    }

    ret = ORLOiSCSIStartAll();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIStartAll() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
