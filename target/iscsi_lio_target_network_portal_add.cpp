// Makes one network portal of a target's portal group: the directory np/<addr>:<port>
// (IPv6 in brackets).  A portal that is there already is kept.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_portal_util.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetNetworkPortalAdd(const ORLOiSCSITarget *target, const char *addr,
                                                                   int port) {
    namespace lio = orlo::target::lio;
    char path[lio::kPathSize];
    uint32_t ret = lio::PortalPath(target, addr, port, path);
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Mkdir(path, S_IRWXU) != 0 && errno != EEXIST) {
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
        return ORLO_ERR_MKDIR;
    }
    return ORLO_OK;
}
