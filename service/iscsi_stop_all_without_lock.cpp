// Stops the iSCSI service from what the kernel holds: every target node under the
// fabric directory is taken out, including nodes that no configuration file knows.
// Stored "enabled" flags are left as they are, so a start brings the same targets back.
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "target/iscsi_lio_unload_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIStopAllWithoutLock(void) {
    uint32_t ret = ORLOiSCSIStopMiscService();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIStopMiscService() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    // A fabric directory that is not there (module out, never started) holds nothing.
    std::vector<std::string> nodes;
    ret = orlo::target::ListConfigfsDir(orlo::target::kIscsiFabricDir, &nodes);
    if (ret != ORLO_OK) return ret;
    uint32_t first = ORLO_OK;
    for (const std::string &name : nodes) {
        std::string node;
        ret = orlo::target::JoinConfigfsPath(orlo::target::kIscsiFabricDir, name, &node);
        if (ret == ORLO_OK) ret = ORLOiSCSITargetUnloadByConfigfsPath(node.c_str());
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetUnloadByConfigfsPath(\"%s\") failed, err=%s", node.c_str(),
                         ORLOiSCSIErrStr(ret));
            if (first == ORLO_OK) first = ret;
        }
    }
    if (first != ORLO_OK) return first;
    OrloLog(LOG_INFO, "%s:%d Successfully stopped iSCSI service.", __FILE_NAME__, __LINE__);
    ORLO_LOG(LOG_INFO, "Successfully stopped iSCSI service.");
    return ORLO_OK;
}
