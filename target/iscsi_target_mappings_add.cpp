// Maps several LUNs into one target, each with the smallest free LUN number.  Every
// requested lid is checked before anything changes: the LUN must exist and must not be
// mapped into the target yet (nor be asked for twice), and the target's stored
// mappings must make a sane table.  Then each LUN goes into the kernel (when the target
// is running) and into the mapping file, in the order given.
#include <bitset>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

namespace {

namespace life = orlo::target::life;

// Which LUN numbers and which lids a target's mappings use.
struct MappingTable {
    std::bitset<ORLO_ISCSI_MAPPING_LUN_MAX + 1> numbers;
    std::bitset<ORLO_ISCSI_LID_MAX> lids;  // lid l at l - 1

    // The smallest free number, or -1.
    int FreeNumber() const {
        for (int n = 0; n <= ORLO_ISCSI_MAPPING_LUN_MAX; ++n)
            if (!numbers.test(static_cast<size_t>(n))) return n;
        return -1;
    }
};

uint32_t InitTable(int32_t tid, const ORLOiSCSIConf &conf, MappingTable *table) {
    if (conf.mappings.count > ORLO_ISCSI_MAPPINGS_PER_TARGET_MAX) {
        ORLO_LOG_ERR("Failed to Init mapping table entry, mapping_cnt[%d] exceed %d", conf.mappings.count,
                     ORLO_ISCSI_MAPPINGS_PER_TARGET_MAX);
        return life::kErrLoadMappingConfig;
    }
    if (!ORLOiSCSIListIsInit(&conf.mappings)) return ORLO_OK;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
        if (m->tid != tid) continue;
        if (m->lid < ORLO_ISCSI_LID_MIN || m->lid > ORLO_ISCSI_LID_MAX - 1 || m->lun < 0 ||
            m->lun > ORLO_ISCSI_MAPPING_LUN_MAX) {
            ORLO_LOG_ERR("Failed to Init mapping table entry, tid:%d lid:%d lun:%d", m->tid, m->lid, m->lun);
            return life::kErrLoadMappingConfig;
        }
        if (table->lids.test(static_cast<size_t>(m->lid - 1))) {
            ORLO_LOG_ERR("Repeated mapping lun of lid: %d", m->lid);
            return life::kErrLoadMappingConfig;
        }
        table->lids.set(static_cast<size_t>(m->lid - 1));
        table->numbers.set(static_cast<size_t>(m->lun));
    }
    return ORLO_OK;
}

const ORLOiSCSILun *LunOfLid(const ORLOiSCSIConf &conf, int32_t lid) {
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&conf.luns, link, lun) {
        if (lun->lid == lid) return lun;
    }
    return nullptr;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetMappingsAdd(int32_t tid, const int32_t *lids, int count) {
    if (!life::TidValid(tid) || lids == nullptr || count < 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    for (int i = 0; i < count; ++i) {
        if (!life::LidValid(lids[i])) {
            ORLO_LOG_ERR("Bad parameters, lid[%d] is In-Valid[%d]", i, lids[i]);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return ORLO_ERR_BAD_PARAMETER;
        }
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);

    // The target with its mappings; a target without any is looked up alone.
    life::ConfScope mapped;
    uint32_t ret = life::QueryConf(life::kQueryTargetMappings, tid, 0, mapped.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTargetMappings, tid,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    life::ConfScope alone;
    ORLOiSCSITarget *target = life::TargetOfTid(*mapped, tid);
    if (target == nullptr) {
        if ((ret = life::QueryConf(life::kQueryTarget, tid, 0, alone.get())) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTarget, tid,
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        target = life::TargetOfTid(*alone, tid);
    }
    if (target == nullptr) {
        ORLO_LOG_ERR("Failed to mapping all lids, No such tid:%d", tid);
        return life::kErrNoSuchTarget;
    }

    life::ConfScope all;
    if ((ret = life::QueryConf(life::kQueryAllLuns, 0, 0, all.get())) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get all lun, lun_cnt:%d", all->luns.count);
        return ret;
    }

    MappingTable table;
    if ((ret = InitTable(tid, *mapped, &table)) != ORLO_OK) return ret;
    // The requests, checked against the table before the first change.
    MappingTable wanted = table;
    for (int i = 0; i < count; ++i) {
        if (LunOfLid(*all, lids[i]) == nullptr) {
            ORLO_LOG_ERR("Failed to find LUN of lid:%d to map into tid:%d", lids[i], tid);
            return life::kErrNoSuchLun;
        }
        if (wanted.lids.test(static_cast<size_t>(lids[i] - 1))) {
            ORLO_LOG_ERR("Repeated mapping lun of lid: %d", lids[i]);
            return life::kErrLunMapped;
        }
        wanted.lids.set(static_cast<size_t>(lids[i] - 1));
    }

    const bool inKernel = life::InKernel(target);
    ORLOiSCSIAclList acls = {};
    ORLOiSCSIListInit(&acls);
    auto freeAcls = orlo::MakeScopeExit([&acls] { ORLOiSCSITargetAclListFree(&acls); });
    if (inKernel && (ret = ORLOiSCSITargetConfAclLoad(tid, &acls)) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to load ACL list of tid:%d iqn:%s", tid, target->iqn);
        return ret;
    }

    for (int i = 0; i < count; ++i) {
        const int32_t lid = lids[i];
        const int n = table.FreeNumber();
        if (n < 0) {
            ORLO_LOG_ERR("Failed to mapped lid:%d into tid:%d with INVALID lun:%d", lid, tid, n);
            return life::kErrGetLunId;
        }
        if (inKernel && (ret = life::ClearUnnamedLunEntry(target, n)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to clear LUN entry lun_%d of tid:%d, err=%s", n, tid, ORLOiSCSIErrStr(ret));
            return ret;
        }
        if (inKernel && (ret = ORLOiSCSILioMappingAdd(target, LunOfLid(*all, lid), n, &acls)) != ORLO_OK) {
            ORLO_LOG_ERR("Failed to Map lid:%d to tid:%d As lun:%d", lid, tid, n);
            return ret;
        }
        if ((ret = ORLOiSCSITargetConfMappingAdd(tid, lid, n)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfMappingAdd(%d, %d, %d) failed, err=%s", tid, lid, n,
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        table.numbers.set(static_cast<size_t>(n));
    }
    return ORLO_OK;
}
