// Changes the authority of one initiator (see ORLOiSCSITargetMaskingsUpdate).
#include "orloiscsi_target.h"

ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingUpdate(const ORLOiSCSIAcl &record) {
    return ORLOiSCSITargetMaskingsUpdate(std::vector<ORLOiSCSIAcl>{record});
}
