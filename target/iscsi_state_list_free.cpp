// Frees a session state list's records.
#include <cstddef>

#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT void ORLOiSCSIStateListFree(ORLOiSCSISessionStateList *list) {
    ORLOiSCSIListFree(list, offsetof(ORLOiSCSISessionState, link));
}
