// Takes one initiator's access away (see ORLOiSCSITargetMaskingsRemove).
#include "orloiscsi_target.h"

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingRemove(const ORLOiSCSIAcl &record) {
    return ORLOiSCSITargetMaskingsRemove(std::vector<ORLOiSCSIAcl>{record});
}
