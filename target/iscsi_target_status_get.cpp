// The status word of a target: bit 0 when its portal group is in the kernel, bit 1 when
// that group's "enable" reads true.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT int ORLOiSCSITargetStatusGet(int32_t tid, const ORLOiSCSITarget *target) {
    namespace lio = orlo::target::lio;
    ORLOiSCSITarget stored;
    if (target == nullptr) {
        ORLOiSCSITargetList list = {};
        auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
        if (ORLOiSCSITargetConfGetByTid(tid, 0, &list) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to get config");
            return 0;
        }
        ORLOiSCSIListLink *first = ORLOiSCSIListFirst(&list);
        if (first == nullptr) {
            ORLO_LOG_ERR("Failed, get zero target");
            return 0;
        }
        memcpy(&stored, ORLO_ISCSI_TARGET_OF(first), sizeof(stored));
        target = &stored;
    }
    if (!ORLOiSCSILioIsTargetAlive(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER)) return 0;
    int status = ORLO_ISCSI_TARGET_STATUS_PRESENT;
    char path[lio::kPathSize];
    if (lio::TpgFilePath(target->iqn, "enable", path) != ORLO_OK) return status;
    bool enabled = false;
    uint32_t ret = ORLOiSCSIConfigfsGetBool(path, &enabled);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetBool(\"%s\", %p) failed, err=%s", path, static_cast<void *>(&enabled),
                     ORLOiSCSIErrStr(ret));
        return status;
    }
    if (enabled) status |= ORLO_ISCSI_TARGET_STATUS_ENABLED;
    return status;
}
