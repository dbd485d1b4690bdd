// The LUNs of a configuration snapshot: the snapshot is taken with the caller's filter
// (so targets and mappings may decide which LUNs remain) and its LUNs handed over.
#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfLoadByFilter(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list) {
    if (filter == nullptr || list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSIConf conf = {};
    auto freeConf = orlo::MakeScopeExit([&conf]() { ORLOiSCSIConfFree(&conf); });
    uint32_t ret = ORLOiSCSIConfGet(filter, &conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<const void *>(filter),
                     static_cast<void *>(&conf), ORLOiSCSIErrStr(ret));
        ORLOiSCSILunListFree(list);
        return ret;
    }
    orlo::conf::ListSplice(list, &conf.luns);
    return ORLO_OK;
}
