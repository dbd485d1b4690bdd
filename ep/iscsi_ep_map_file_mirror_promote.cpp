// Promotes a mirror child: the kernel ends the relation and the child stands alone.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMirrorPromote(const char *mapPath, const char *configfsDir) {
    if (mapPath == nullptr || mapPath[0] == '\0' || configfsDir == nullptr || configfsDir[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char control[320];
    uint32_t ret = orlo::ep::PathBuild(control, sizeof(control), "%s/control", configfsDir);
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIConfigfsWrite(control, "ep_relation_promote=1");
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", control, "ep_relation_proamote=1",
                     ORLOiSCSIErrStr(ret));
    return ret;
}
