// Stores an access-list entry, replacing that initiator's entry of the target.
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclAdd(int32_t tid, const char *initiator, int32_t authority) {
    return orlo::target::WriteAclSection(tid, initiator, authority, false);
}
