// Removes one network portal of a target's portal group; a portal already gone counts as
// removed.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_portal_util.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetNetworkPortalRemove(const ORLOiSCSITarget *target, const char *addr,
                                                                      int port) {
    namespace lio = orlo::target::lio;
    char path[lio::kPathSize];
    uint32_t ret = lio::PortalPath(target, addr, port, path);
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Rmdir(path) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", path);
        return ORLO_ERR_RMDIR;
    }
    return ORLO_OK;
}
