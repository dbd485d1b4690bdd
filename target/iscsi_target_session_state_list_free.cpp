// Frees the session list of a target (ORLOiSCSITargetSessionStateListGet).
#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT void ORLOiSCSITargetSessionStateListFree(ORLOiSCSISessionStateList *list) {
    ORLOiSCSIStateListFree(list);
}
