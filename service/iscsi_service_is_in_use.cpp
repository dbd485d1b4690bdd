// Whether the iSCSI service has anything to serve.  The service is in use while the
// configuration holds a LUN or a target (backup objects left out: they are served only
// while a backup task runs, and their task keeps the service up itself).  Either alone
// counts: a LUN without a target still has its backstore loaded at start, and a target
// without LUNs still answers logins.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIServiceIsInUse(bool *in_use) {
    if (in_use == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *in_use = false;
    ORLOiSCSILunList luns;
    memset(&luns, 0, sizeof(luns));
    uint32_t ret = ORLOiSCSILunConfGetAll(&luns, 0);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfGetAll(%p, 0) failed, err=%s", static_cast<void *>(&luns), ORLOiSCSIErrStr(ret));
        return ret;
    }
    const bool anyLun = luns.count > 0;
    ORLOiSCSILunListFree(&luns);
    if (anyLun) {
        *in_use = true;
        return ORLO_OK;
    }

    ORLOiSCSITargetFilter filter;
    memset(&filter, 0, sizeof(filter));
    filter.flags = ORLO_ISCSI_TARGET_FILTER_ALL;
    ORLOiSCSITargetList targets;
    memset(&targets, 0, sizeof(targets));
    ret = ORLOiSCSITargetConfLoad(&filter, &targets);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&targets), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *in_use = targets.count > 0;
    ORLOiSCSITargetListFree(&targets);
    return ORLO_OK;
}
