// Changes the authority of a stored access-list entry.
#include "target/target_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclUpdate(int32_t tid, const char *initiator,
                                                             ISCSI_TARGET_AUTHORITY authority) {
    return orlo::target::WriteAclSection(tid, initiator, static_cast<int32_t>(authority), true);
}
