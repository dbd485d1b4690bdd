// Gives one initiator a node access list under a portal group's "acls" directory, with
// the appliance's command window.  The kernel copies the portal group's default window
// into a node access list when it is made; setting it here keeps the window the same
// whether the list was made before or after the group's default was written.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetNodeAclAdd(const char *iqn, int tpgt, const char *initiator) {
    namespace acl = orlo::target::acl;
    uint32_t ret = acl::CheckArgs(iqn, tpgt, initiator, -1);
    if (ret != ORLO_OK) return ret;
    if (acl::IsDefaultInitiator(initiator) && !acl::DefaultEntryIsNodeAcl()) {
        // The portal group's demo-mode attributes stand for the default entry.
        ORLO_LOG(LOG_NOTICE, "Default ACL of lio is deprecated.");
        return ORLO_OK;
    }
    char path[acl::kPathSize];
    if ((ret = acl::FormatPath(path, acl::kAclDirFmt, iqn, tpgt, initiator)) != ORLO_OK) return ret;
    if (orlo::os::Mkdir(path, S_IRWXU) != 0) {
        if (errno == EEXIST) return ORLO_OK;  // an existing list is kept as it is
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
        return ORLO_ERR_MKDIR;
    }
    char depthPath[acl::kPathSize];
    if ((ret = acl::FormatPath(depthPath, "%s/cmdsn_depth", path)) != ORLO_OK) return ret;
    const int depth = orlo::target::lio::CmdsnDepth();
    if ((ret = ORLOiSCSIConfigfsPutInteger(depthPath, depth)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", depthPath, depth, ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
