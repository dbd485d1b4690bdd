// Gives one initiator its access to a target (see ORLOiSCSITargetMaskingsCreate).
#include "orloiscsi_target.h"

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingCreate(const ORLOiSCSIAcl &record) {
    return ORLOiSCSITargetMaskingsCreate(std::vector<ORLOiSCSIAcl>{record});
}
