// Takes every backstore out of the target-core hosts.  It works from the kernel's tree,
// so LUNs the files no longer know, trash backstores and half-loaded ones go too.  When
// no backstore is left, the extent pools the advanced LUNs used are switched off as
// well: a pool holds the extent-pool module, and with it the target core, in the kernel.
#include <cstdio>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_service.h"
#include "service/stop_util.h"
#include "target/iscsi_lio_unload_util.h"

namespace {

constexpr const char kPoolDir[] = "/config/pool";

// Every pool "EP_<n>" the kernel holds, switched off; the first failure is returned.
uint32_t PoolsTakeDown() {
    std::vector<std::string> names;
    uint32_t ret = orlo::target::ListConfigfsDir(kPoolDir, &names);
    if (ret != ORLO_OK) return ret;
    for (const std::string &name : names) {
        int volume = 0;
        char tail = '\0';
        if (sscanf(name.c_str(), "EP_%d%c", &volume, &tail) != 1 || volume < 1) continue;
        uint32_t r = ORLOiSCSIEpDisable(volume);
        if (r != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpDisable(%d) failed, err=%s", volume, ORLOiSCSIErrStr(r));
            if (ret == ORLO_OK) ret = r;
        }
    }
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunServiceStopAllWithoutLock(void) {
    uint32_t ret = orlo::service::RemoveAllBackstores();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("RemoveAllBackstores() failed, err=%s", ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = PoolsTakeDown();
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("PoolsTakeDown() failed, err=%s", ORLOiSCSIErrStr(ret));
    }
    return ret;
}
