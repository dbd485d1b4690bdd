// Frees a target list's records.
#include <cstddef>

#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT void ORLOiSCSITargetListFree(ORLOiSCSITargetList *list) {
    ORLOiSCSIListFree(list, offsetof(ORLOiSCSITarget, link));
}
