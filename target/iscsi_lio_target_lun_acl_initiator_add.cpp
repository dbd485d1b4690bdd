// Shows one of the portal group's LUN entries to one initiator: the entry lun_<n> in the
// initiator's node access list, linked as "lio_lun" to the group's lun/lun_<n>.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetLunAclInitiatorAdd(const char *iqn, int tpgt, const char *initiator,
                                                                     int lun) {
    namespace acl = orlo::target::acl;
    uint32_t ret = acl::CheckArgs(iqn, tpgt, initiator, lun);
    if (ret != ORLO_OK) return ret;
    if (lun < 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char dir[acl::kPathSize], link[acl::kPathSize], tpgLun[acl::kPathSize];
    if ((ret = acl::FormatPath(dir, acl::kAclLunFmt, iqn, tpgt, initiator, lun)) != ORLO_OK ||
        (ret = acl::FormatPath(link, acl::kAclLunLinkFmt, dir)) != ORLO_OK ||
        (ret = acl::FormatPath(tpgLun, acl::kTpgLunFmt, iqn, tpgt, lun)) != ORLO_OK)
        return ret;

    bool made = true;
    if (orlo::os::Mkdir(dir, S_IRWXU) != 0) {
        if (errno != EEXIST) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
            return ORLO_ERR_MKDIR;
        }
        made = false;
    }
    if ((ret = ORLOiSCSIConfigfsSymlink(tpgLun, link)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsSymlink(\"%s\", \"%s\") failed, err=%s", tpgLun, link, ORLOiSCSIErrStr(ret));
        // An entry made here and left without its link would only stand in the way.
        if (made && orlo::os::Rmdir(dir) != 0 && errno != ENOENT)
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
        return ret;
    }
    return ORLO_OK;
}
