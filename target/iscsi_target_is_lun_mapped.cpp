// Whether a LUN number of a target is taken by one of its stored mappings (whose LUN
// still exists).
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetIsLunMapped(int32_t tid, int32_t n, bool *used) {
    namespace life = orlo::target::life;
    if (!life::TidValid(tid) || n < 0 || n > ORLO_ISCSI_MAPPING_LUN_MAX || used == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    *used = false;
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTargetMappings, tid, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTargetMappings, tid,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if (m->lun < 0 || m->lun > ORLO_ISCSI_MAPPING_LUN_MAX) {
            ORLO_LOG_ERR("Incorrect mapped lun:%d, tid:%d name:%s", m->lun, m->tid,
                         m->pTrg != nullptr ? m->pTrg->name : "");
            continue;
        }
        if (m->lun == n) *used = true;
    }
    return ORLO_OK;
}
