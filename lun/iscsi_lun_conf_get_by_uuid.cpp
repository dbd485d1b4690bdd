// Copies the LUN of one uuid from the global file into the caller's record.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfGetByUuid(const char *uuid, ORLOiSCSILun *lun) {
    if (uuid == nullptr || uuid[0] == '\0' || lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSILunFilter filter = {};
    filter.flags = ORLO_ISCSI_LUN_FILTER_FIRST_ONLY | ORLO_ISCSI_LUN_FILTER_UUID | ORLO_ISCSI_LUN_FILTER_LOAD_LUNS;
    filter.uuid = uuid;
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSILunListFree(&list); });
    uint32_t ret = ORLOiSCSILunConfLoad(&filter, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to load LUN config by UUID: %s failed, err=%s", uuid, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *first = ORLOiSCSIListFirst(&list);
    if (first == nullptr) return orlo::lun::kErrNoSuchLun;
    *lun = *ORLO_ISCSI_LUN_OF(first);
    return ORLO_OK;
}
