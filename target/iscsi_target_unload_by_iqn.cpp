// Takes the target node of an IQN out of the kernel's iSCSI fabric.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/iscsi_lio_unload_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetUnloadByIqn(const char *iqn) {
    if (iqn == nullptr || iqn[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // A node is one directory of the fabric: a name that would lead elsewhere is refused.
    if (strchr(iqn, '/') != nullptr || strcmp(iqn, ".") == 0 || strcmp(iqn, "..") == 0) {
        ORLO_LOG_ERR("invalid IQN \"%s\"", iqn);
        return ORLO_ERR_BAD_PARAMETER;
    }
    std::string node;
    uint32_t ret = orlo::target::JoinConfigfsPath(orlo::target::kIscsiFabricDir, iqn, &node);
    if (ret != ORLO_OK) return ret;
    if ((ret = ORLOiSCSITargetUnloadByConfigfsPath(node.c_str())) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetUnloadByConfigfsPath(\"%s\") failed, err=%s", node.c_str(), ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
