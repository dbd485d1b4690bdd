// Reads the accepted LUNs of the global LUN file.
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfLoad(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list) {
    return ORLOiSCSILunConfLoadByPath(filter, list, orlo::lun::kGlobalConfPath);
}
