// Maps one LUN into one target: the number is checked or chosen, the kernel gets the
// mapping first when the target is running, and the section is written last.  A failed
// kernel add leaves the file untouched; a failed file write after a kernel add is not
// undone.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

namespace {

constexpr const char kMappingLockPath[] = "/tmp/iscsi/iscsi_mapping.conf.lock";
constexpr int kMappingLockTimeoutSec = 60;

// The number the LUN has in the target, or -1 when it is not mapped there.
uint32_t MappedNumber(int32_t tid, int32_t lid, int32_t *number) {
    namespace life = orlo::target::life;
    // Read under the mapping file's lock, so that a lock file that cannot be taken is
    // reported as such rather than as a failed query.
    orlo::FileLockGuard lock(kMappingLockPath, false, kMappingLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryOneMapping, tid, lid, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d lid:%d) failed, err=%s", life::kQueryOneMapping, tid, lid,
                     ORLOiSCSIErrStr(ret));
        return life::kErrGetConfig;
    }
    *number = -1;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        if (m->tid == tid && m->lid == lid) *number = m->lun;
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetMappingAdd(int32_t tid, int32_t lid, int32_t lun) {
    namespace life = orlo::target::life;
    if (!life::TidValid(tid) || !life::LidValid(lid)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    uint32_t ret;
    // Mapped already: one LUN has one number in a target.  Mapping it again would put a
    // second LUN entry into the kernel while the file keeps only one.
    int32_t already = -1;
    if ((ret = MappedNumber(tid, lid, &already)) != ORLO_OK) return ret;
    if (already >= 0) {
        ORLO_LOG_ERR("Failed to map lid:%d to tid:%d, mapped already as LUN %d", lid, tid, already);
        return life::kErrLunMapped;
    }
    if (lun <= ORLO_ISCSI_MAPPING_LUN_MAX) {
        bool used = false;
        if ((ret = ORLOiSCSITargetIsLunMapped(tid, lun, &used)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetIsLunMapped(%d, %d, %p) failed, err=%s", tid, lun, static_cast<void *>(&used),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        if (used) {
            ORLO_LOG_ERR("Failed to map lid:%d to tid:%d in mapLun%d which used already", lid, tid, lun);
            return life::kErrLunMapped;
        }
    } else {
        lun = ORLOiSCSILunUnusedMappingNumberGet(tid);
        if (static_cast<uint32_t>(lun) > ORLO_ISCSI_MAPPING_LUN_MAX) {
            ORLO_LOG_ERR("Failed to find a valid lun without mapped in tid:%d for lid:%d", tid, lid);
            return life::kErrGetLunId;
        }
    }

    life::ConfScope conf;
    if ((ret = life::QueryConf(life::kQueryTargetLunPair, tid, lid, conf.get())) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d lid:%d) failed, err=%s", life::kQueryTargetLunPair, tid, lid,
                     ORLOiSCSIErrStr(ret));
        return life::kErrGetConfig;
    }
    if (conf->targets.count == 0 || conf->luns.count == 0) {
        ORLO_LOG_ERR("Failed to zero target_cnt:%d, lun_cnt:%d, mapping_cnt:%d", conf->targets.count,
                     conf->luns.count, conf->mappings.count);
        return life::kErrGetConfig;
    }
    ORLOiSCSITarget *target = life::FirstTarget(*conf);
    if (target == nullptr) {
        ORLO_LOG_ERR("Failed to Get a NULL pTrg");
        return life::kErrLoadTargetConfig;
    }
    const ORLOiSCSILun *lunRecord = life::FirstLun(*conf);
    if (lunRecord == nullptr) {
        ORLO_LOG_ERR("Failed to Get a NULL pLun");
        return life::kErrLoadLunConfig;
    }

    if (life::InKernel(target)) {
        ORLOiSCSIAclList acls = {};
        ORLOiSCSIListInit(&acls);
        auto freeAcls = orlo::MakeScopeExit([&acls] { ORLOiSCSITargetAclListFree(&acls); });
        if ((ret = ORLOiSCSITargetConfAclLoad(tid, &acls)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfAclLoad(%d, %p) failed, err=%s", tid, static_cast<void *>(&acls),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        if ((ret = life::ClearUnnamedLunEntry(target, lun)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to clear LUN entry lun_%d of tid:%d, err=%s", lun, tid, ORLOiSCSIErrStr(ret));
            return ret;
        }
        if ((ret = ORLOiSCSILioMappingAdd(target, lunRecord, lun, &acls)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioMappingAdd(%p, %p, %d, %p) failed, err=%s", static_cast<void *>(target),
                         static_cast<const void *>(lunRecord), lun, static_cast<void *>(&acls), ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    if ((ret = ORLOiSCSITargetConfMappingAdd(tid, lid, lun)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfMappingAdd(%d, %d, %d) failed, err=%s", tid, lid, lun, ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}
