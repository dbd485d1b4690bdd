// Writes a LUN's section into the global LUN file (the caller holds its lock).
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunGlobalConfSetSection(const ORLOiSCSILun *lun) {
    return ORLOiSCSILunConfSetSection(lun, orlo::lun::kGlobalConfPath);
}
