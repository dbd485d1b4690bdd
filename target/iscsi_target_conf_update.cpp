// Rewrites a target's existing section.
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfUpdate(const ORLOiSCSITarget *target) {
    return orlo::target::WriteTargetSection(target, true);
}
