// Unmaps one LUN from one target: the kernel side first, then the section.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetMappingRemove(int32_t tid, int32_t lid) {
    namespace life = orlo::target::life;
    if (!life::TidValid(tid) || !life::LidValid(lid)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    uint32_t ret = ORLOiSCSITargetMappingUnload(tid, lid, nullptr);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetMappingUnload(%d, %d, NULL) failed, err=%s", tid, lid, ORLOiSCSIErrStr(ret));
        return life::kErrUnloadMapping;
    }
    if ((ret = ORLOiSCSITargetConfMappingRemove(tid, lid)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfMappingRemove(%d, %d) failed, err=%s", tid, lid, ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
