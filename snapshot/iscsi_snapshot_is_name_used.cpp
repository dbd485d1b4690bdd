// Whether a record of a list has exactly a name.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotIsNameUsed(const ORLOiSCSISnapshotList *list, const char *name,
                                                            bool *used) {
    if (list == nullptr || name == nullptr || used == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *used = false;
    if (!ORLOiSCSIListIsInit(list)) return ORLO_OK;
    const ORLOiSCSIListLink *link;
    for (link = list->head.next; link != &list->head; link = link->next) {
        const ORLOiSCSISnapshot *snap = ORLO_ISCSI_SNAPSHOT_OF(link);
        if (strncmp(snap->name, name, sizeof(snap->name)) == 0 && strlen(name) < sizeof(snap->name)) {
            *used = true;
            break;
        }
    }
    return ORLO_OK;
}
