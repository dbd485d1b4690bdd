// Switches the kernel target core between its two generations (2 "lio", 4 "lio4x").
// Everything the old core holds is taken down (targets, vhost, backstores, and the
// extent pools with them, which pin the core's modules) and its modules removed, the new version is
// made current for this process and written to the platform defaults file for the next
// ones, and the service is started again on the new core.  Extent-pool (advanced) LUNs
// thereby move between the hosts epio_0 (version 4) and fileio_0 (version 2): the start
// loads them under the host of the new version.
//
// The switch relies on the service lock that each stop, unload and start takes; it must
// not overlap other kernel-wide operations.

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/kernel_modules.h"
#include "service/lio_version.h"

namespace {

constexpr const char kDefaultsFile[] = "/etc.defaults/orloinfo.conf";
constexpr const char kTargetTypeKey[] = "iscsi_target_type";
constexpr const char kKeyLineFmt[] = "%s=\"%s\"\n";

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
    for (const orlo::service::ModuleUnloadStep &step : orlo::service::kModuleUnloadOrder) {
        if (!orlo::service::ModuleSetHasModuleIn(step.set)) continue;
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
