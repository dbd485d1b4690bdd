// Every LUN of the global file; backup objects only when the caller adds 0x400.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfGetAll(ORLOiSCSILunList *list, uint32_t extraFlags) {
    if (list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSILunFilter filter = {};
    filter.flags = extraFlags | ORLO_ISCSI_LUN_FILTER_ALL;
    return ORLOiSCSILunConfLoad(&filter, list);
}
