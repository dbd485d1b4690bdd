// Writes a target's section, inserting it or replacing the one of its tid.
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAdd(const ORLOiSCSITarget *target) {
    return orlo::target::WriteTargetSection(target, false);
}
