// Whether a target's portal group exists in the kernel's iSCSI fabric.
#include <unistd.h>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_target_util.h"

extern "C" ORLO_EXPORT bool ORLOiSCSILioIsTargetAlive(const char *iqn, int tpgt) {
    namespace lio = orlo::target::lio;
    if (lio::CheckIqn(iqn) != ORLO_OK) return false;
    if (tpgt < 1 || tpgt > 65535) {
        ORLO_LOG_BAD_PARAMS();
        return false;
    }
    char path[lio::kPathSize];
    if (lio::FormatPath(path, lio::kTpgFmt, iqn, tpgt) != ORLO_OK) return false;
    return orlo::os::Access(path, F_OK) == 0;
}
