// Frees a snapshot list: every record is one heap block with its link at its end.
#include <cstddef>

#include "orloiscsi_snapshot.h"

extern "C" ORLO_EXPORT void ORLOiSCSISnapshotListFree(ORLOiSCSISnapshotList *list) {
    ORLOiSCSIListFree(list, offsetof(ORLOiSCSISnapshot, link));
}
