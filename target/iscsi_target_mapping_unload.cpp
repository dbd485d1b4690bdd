// Takes one mapping out of the kernel, working from what configfs holds: every
// initiator's LUN entry lun_<n> under the portal group's acls, then the group's own
// lun/lun_<n> with its backstore link.  The mapping file is not touched.  A target that
// is not in the kernel has nothing to remove, which is success.
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "target/iscsi_lio_unload_util.h"
#include "target/lio_acl_util.h"
#include "target/target_life_util.h"

namespace {

namespace life = orlo::target::life;
namespace acl = orlo::target::acl;

const ORLOiSCSIMapping *FindMapping(const ORLOiSCSIConf &conf, int32_t tid, int32_t lid) {
    if (!ORLOiSCSIListIsInit(&conf.mappings)) return nullptr;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
        if (m->tid == tid && m->lid == lid) return m;
    }
    return nullptr;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetMappingUnload(int32_t tid, int32_t lid, const ORLOiSCSIConf *given) {
    if (!life::TidValid(tid) || !life::LidValid(lid)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    life::ConfScope queried;
    const ORLOiSCSIConf *conf = given;
    if (conf == nullptr) {
        uint32_t ret = life::QueryConf(life::kQueryOneMapping, tid, lid, queried.get());
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d lid:%d) failed, err=%s", life::kQueryOneMapping, tid, lid,
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        conf = queried.get();
    }
    const ORLOiSCSIMapping *mapping = FindMapping(*conf, tid, lid);
    if (mapping == nullptr) {
        ORLO_LOG_ERR("Failed to zero mapping_cnt:%d", conf->mappings.count);
        return life::kErrLoadMappingConfig;
    }
    if (mapping->pTrg == nullptr) {
        ORLO_LOG_ERR("Failed to Get a NULL pTrg");
        return life::kErrLoadTargetConfig;
    }
    const ORLOiSCSITarget *target = mapping->pTrg;
    uint32_t ret = life::LunAclInitiatorsRemove(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, mapping->lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetLunACLInitiatorsRemove(\"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, %d) failed, "
                     "err=%s",
                     target->iqn, mapping->lun, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = life::LunEntryUnlink(target, mapping->lun)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioMappingUnlink(%p, %d) failed, err=%s", static_cast<const void *>(target),
                     mapping->lun, ORLOiSCSIErrStr(ret));
        return life::kErrRemoveMapping;
    }
    return ORLO_OK;
}
