// The smallest lid that no LUN uses (backup objects included), for a new LUN.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"

extern "C" ORLO_EXPORT int ORLOiSCSILunUnusedLidGet(void) {
    std::vector<orlo::lun::LunIdentity> luns;
    if (orlo::lun::LoadIdentities(&luns) != ORLO_OK) return -1;
    int lid = orlo::lun::UnusedLidIn(luns);
    if (lid < 0) ORLO_LOG_ERR("Every lid from %d to %d is in use", ORLO_ISCSI_LID_MIN, ORLO_ISCSI_LID_MAX);
    return lid;
}
