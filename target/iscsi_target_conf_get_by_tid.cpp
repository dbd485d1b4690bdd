// The targets of one tid.
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfGetByTid(int32_t tid, uint32_t extraFlags,
                                                            ORLOiSCSITargetList *list) {
    ORLOiSCSITargetFilter filter = {};
    filter.flags = ORLO_ISCSI_TARGET_FILTER_KIND | ORLO_ISCSI_TARGET_FILTER_TID | extraFlags;
    filter.tid = tid;
    return ORLOiSCSITargetGetByFilter(&filter, list);
}
