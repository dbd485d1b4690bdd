// Whether the iSCSI service has anything to serve.  The service is in use while the
// configuration holds a LUN or a target (backup objects left out: they are served only
// while a backup task runs, and their task keeps the service up itself).  Either alone
// counts: a LUN without a target still has its backstore loaded at start, and a target
// without LUNs still answers logins.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_service.h"

namespace {
// Targets, LUNs and mappings, every one but backup objects.
constexpr uint32_t kEveryObject = ORLO_ISCSI_LUN_FILTER_ALL;
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIServiceIsInUse(bool *in_use) {
    if (in_use == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *in_use = false;
    ORLOiSCSILunFilter filter;
    memset(&filter, 0, sizeof(filter));
    filter.flags = kEveryObject;
    ORLOiSCSIConf conf;
    memset(&conf, 0, sizeof(conf));
    auto freeConf = orlo::MakeScopeExit([&conf] { ORLOiSCSIConfFree(&conf); });
    uint32_t ret = ORLOiSCSIConfGet(&filter, &conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&conf), ORLOiSCSIErrStr(ret));
        return ret;
    }
    *in_use = conf.luns.count > 0 || conf.targets.count > 0;
    return ORLO_OK;
}
