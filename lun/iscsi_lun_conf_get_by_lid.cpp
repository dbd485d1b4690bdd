// The LUN of one lid, from the global file.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfGetByLid(int32_t lid, uint32_t extraFlags, ORLOiSCSILunList *list) {
    if (list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSILunFilter filter = {};
    filter.flags = extraFlags | ORLO_ISCSI_LUN_FILTER_LOAD_LUNS | ORLO_ISCSI_LUN_FILTER_LID;
    filter.lid = lid;
    return ORLOiSCSILunConfLoad(&filter, list);
}
