// The targets of one name.
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfGetByName(const char *name, uint32_t extraFlags,
                                                             ORLOiSCSITargetList *list) {
    ORLOiSCSITargetFilter filter = {};
    filter.flags = ORLO_ISCSI_TARGET_FILTER_KIND | ORLO_ISCSI_TARGET_FILTER_NAME | extraFlags;
    filter.name = name;
    return ORLOiSCSITargetGetByFilter(&filter, list);
}
