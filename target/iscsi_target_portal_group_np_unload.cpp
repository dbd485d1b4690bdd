// Removes every network portal of a portal group.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/iscsi_lio_unload_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetPortalGroupNpUnload(const char *tpg_path) {
    if (tpg_path == nullptr || tpg_path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::string np;
    uint32_t ret = orlo::target::JoinConfigfsPath(tpg_path, "np", &np);
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> names;
    if ((ret = orlo::target::ListConfigfsDir(np, &names)) != ORLO_OK) return ret;
    for (const std::string &name : names) {
        std::string portal;
        if ((ret = orlo::target::JoinConfigfsPath(np, name, &portal)) != ORLO_OK) return ret;
        if ((ret = orlo::target::RemoveConfigfsDir(portal)) != ORLO_OK) return ret;
    }
    return ORLO_OK;
}
