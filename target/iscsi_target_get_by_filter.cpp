// The target query every lookup goes through: a fresh list, filled from a configuration
// snapshot taken with the target filter.  The snapshot always loads the target kind
// (0x1000); a filter that names other kinds too loads them as well, and with 0x200 only
// the targets that a loaded mapping points to remain.
#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetGetByFilter(const ORLOiSCSITargetFilter *filter,
                                                           ORLOiSCSITargetList *list) {
    if (list == nullptr || filter == nullptr) {
        ORLO_LOG_ERR("Bad parameter");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSIListInit(list);
    ORLOiSCSILunFilter query = {};
    query.flags = filter->flags | ORLO_ISCSI_TARGET_FILTER_KIND;
    query.tid = filter->tid;
    query.name = filter->name;
    query.iqn = filter->iqn;
    query.tids = filter->tids;
    query.tidCount = filter->tidCount;

    ORLOiSCSIConf conf = {};
    auto freeConf = orlo::MakeScopeExit([&conf]() { ORLOiSCSIConfFree(&conf); });
    uint32_t ret = ORLOiSCSIConfGet(&query, &conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<void *>(&query),
                     static_cast<void *>(&conf), ORLOiSCSIErrStr(ret));
        return orlo::target::kErrGetConfig;
    }
    orlo::conf::ListSplice(list, &conf.targets);
    return ORLO_OK;
}
