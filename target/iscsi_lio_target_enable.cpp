// Brings a target fully into the kernel: the node is loaded when absent, every stored
// mapping is added with its LUN, the portal group is switched on, and the record is
// stored.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_target.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetEnable(ORLOiSCSITarget *target, const ORLOiSCSIAclList *acls) {
    namespace lio = orlo::target::lio;
    if (target == nullptr || acls == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // 1. The target's mappings with their LUNs.
    ORLOiSCSILunFilter filter = {};
    filter.flags = ORLO_ISCSI_LUN_FILTER_LOAD_TARGETS | ORLO_ISCSI_LUN_FILTER_LOAD_LUNS |
                   ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS | ORLO_ISCSI_LUN_FILTER_MAPPED_ONLY |
                   ORLO_ISCSI_TARGET_FILTER_TID;  // 0x7201
    filter.tid = target->tid;
    ORLOiSCSIConf conf = {};
    auto freeConf = orlo::MakeScopeExit([&conf]() { ORLOiSCSIConfFree(&conf); });
    uint32_t ret = ORLOiSCSIConfGet(&filter, &conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&conf), ORLOiSCSIErrStr(ret));
        return ret;
    }

    // 2. The node.
    int status = ORLOiSCSITargetStatusGet(target->tid, target);
    if (!(status & ORLO_ISCSI_TARGET_STATUS_PRESENT)) {
        if ((ret = ORLOiSCSILioTargetLoad(target, false)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetLoad(%p, 0) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        status = ORLOiSCSITargetStatusGet(target->tid, target);
    }

    // 3. Its LUNs.
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *mapping;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, mapping) {
        if (mapping->pLun == nullptr) continue;
        if ((ret = ORLOiSCSILioMappingAdd(target, mapping->pLun, mapping->lun, acls)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioMappingAdd(%p, %p, %d, %p) failed, err=%s", static_cast<void *>(target),
                         static_cast<void *>(mapping->pLun), mapping->lun, static_cast<const void *>(acls),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
    }

    // 4. Logins allowed.
    if (!(status & ORLO_ISCSI_TARGET_STATUS_ENABLED) && (ret = lio::TpgWrite(target->iqn, "enable", "1")) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to echo 1 to LIO target, tid:%d", target->tid);
        return ret;
    }

    // 5. The record.
    if ((ret = ORLOiSCSITargetConfUpdate(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfUpdate(%p) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
