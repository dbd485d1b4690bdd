// Takes a target node out of the kernel's iSCSI fabric from what configfs holds: each
// portal group is dismantled bottom-up, then the node's directory goes.  A node that no
// configuration file describes any more, or that a failed load left half-built, is
// removed all the same; what a failed unload removed stays removed, so repeating it
// carries on where it stopped.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/iscsi_lio_unload_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetUnloadByConfigfsPath(const char *node_path) {
    if (node_path == nullptr || node_path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    std::vector<std::string> names;
    uint32_t ret = orlo::target::ListConfigfsDir(node_path, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        if (name == "fabric_statistics") continue;  // the node's own default group
        std::string tpg;
        if ((ret = orlo::target::JoinConfigfsPath(node_path, name, &tpg)) != ORLO_OK) return ret;
        if ((ret = orlo::target::ORLOiSCSIConfigfsTargetPortalGroupUnload(tpg)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIConfigfsTargetPortalGroupUnload(\"%s\") failed, err=%s", tpg.c_str(),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return orlo::target::RemoveConfigfsDir(node_path);
}
