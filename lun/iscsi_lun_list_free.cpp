// Frees a LUN list: every element is one block, the record followed by its link.
#include <cstddef>

#include "orloiscsi_lun.h"

extern "C" ORLO_EXPORT void ORLOiSCSILunListFree(ORLOiSCSILunList *list) {
    ORLOiSCSIListFree(list, offsetof(ORLOiSCSILunElem, link));
}
