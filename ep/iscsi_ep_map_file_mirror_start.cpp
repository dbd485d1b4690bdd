// Starts a kernel mirror: the child backstore follows its parent's writes until promoted.
#include "base/iscsi_base_internal.h"
#include "ep/iscsi_ep_relation.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileMirrorStart(const char *parentMapPath, const char *parentConfigfsDir,
                                                 const char *childConfigfsDir) {
    orlo::ep::RelationArgs args;
    uint32_t ret = orlo::ep::RelationPrepare(parentMapPath, parentConfigfsDir, childConfigfsDir, &args);
    if (ret != ORLO_OK) return ret;
    // The parent's name first: the kernel looks the parent up by it when the second
    // command arrives.
    ret = ORLOiSCSIConfigfsPrintf(args.control, "ep_parent_name=%s", args.parentName);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPrintf(\"%s\", \"%s\", \"%s\") failed, err=%s", args.control, "ep_parent_name=%s",
                     args.parentName, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIConfigfsPrintf(args.control, "ep_mirror_parent=%s", args.parentUuid);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPrintf(\"%s\", \"%s\", \"%s\") failed, err=%s", args.control, "ep_mirror_parent=%s",
                     args.parentUuid, ORLOiSCSIErrStr(ret));
    return ret;
}
