// Gives one initiator a node access list under a portal group's "acls" directory.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"

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
    if (orlo::os::Mkdir(path, S_IRWXU) != 0 && errno != EEXIST) {
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
        return ORLO_ERR_MKDIR;
    }
    return ORLO_OK;
}
