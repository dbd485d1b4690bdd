// The smallest LUN number 0..255 that no stored mapping of a target uses.  Every mapping
// section of the target counts, whether or not its LUN still exists, so a number is
// never handed out twice in the mapping file.
#include <bitset>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_conf.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT int ORLOiSCSILunUnusedMappingNumberGet(int32_t tid) {
    namespace life = orlo::target::life;
    if (!life::TidValid(tid)) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTargetNumbers, tid, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTargetNumbers, tid,
                     ORLOiSCSIErrStr(ret));
        return -1;
    }
    std::bitset<ORLO_ISCSI_MAPPING_LUN_MAX + 1> used;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if (m->tid != tid) continue;
        if (m->lun < 0 || m->lun > ORLO_ISCSI_MAPPING_LUN_MAX) {
            ORLO_LOG_ERR("INCORRECT mapped lun:%d, tid:%d name:%s", m->lun, m->tid,
                         m->pTrg != nullptr ? m->pTrg->name : "");
            continue;
        }
        used.set(static_cast<size_t>(m->lun));
    }
    for (int n = 0; n <= ORLO_ISCSI_MAPPING_LUN_MAX; ++n) {
        if (!used.test(static_cast<size_t>(n))) return n;
    }
    return -1;
}
