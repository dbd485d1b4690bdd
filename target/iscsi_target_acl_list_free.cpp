// Frees an access list's entries.
#include <cstddef>

#include "orloiscsi_target.h"

extern "C" ORLO_EXPORT void ORLOiSCSITargetAclListFree(ORLOiSCSIAclList *list) {
    ORLOiSCSIListFree(list, offsetof(ORLOiSCSIAcl, link));
}
