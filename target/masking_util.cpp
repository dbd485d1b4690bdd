// Checking masking requests and bringing a running target's access lists into line with
// the stored ones.
#include "target/masking_util.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <set>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_conf.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"

namespace orlo {
namespace target {
namespace masking {

namespace {

namespace acl = orlo::target::acl;

constexpr uint32_t kMappingsOfTid = ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS | 0x0001u;

bool InKernel(const char *path) {
    struct stat st;
    return orlo::os::Lstat(path, &st) == 0;
}

// The LUN numbers of the target's stored mappings whose portal-group entry is in the
// kernel.  A mapping the kernel does not hold (its LUN failed to load) has nothing an
// initiator's entry could link to; enabling the target adds it with its entries.
uint32_t LoadedLunNumbers(const ORLOiSCSITarget &target, std::vector<int> *numbers) {
    ORLOiSCSILunFilter filter;
    memset(&filter, 0, sizeof(filter));
    filter.flags = kMappingsOfTid;
    filter.tid = target.tid;
    ORLOiSCSIConf conf;
    memset(&conf, 0, sizeof(conf));
    auto freeConf = MakeScopeExit([&conf] { ORLOiSCSIConfFree(&conf); });
    uint32_t ret = ORLOiSCSIConfGet(&filter, &conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&conf), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *mapping;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, mapping) {
        char path[acl::kPathSize];
        if ((ret = acl::FormatPath(path, acl::kTpgLunFmt, target.iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER,
                                   mapping->lun)) != ORLO_OK)
            return ret;
        if (InKernel(path)) numbers->push_back(mapping->lun);
    }
    return ORLO_OK;
}

// A stored initiator: its node access list and an entry per loaded LUN.
uint32_t AddInitiator(const ORLOiSCSITarget &target, const ORLOiSCSIAcl &entry, const std::vector<int> &numbers) {
    const int tpgt = ISCSI_TARGET_DEFAULT_TPGT_NUMBER;
    uint32_t ret = ORLOiSCSILioTargetNodeAclAdd(target.iqn, tpgt, entry.initiator);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetNodeAclAdd(\"%s\", %d, \"%s\") failed, err=%s", target.iqn, tpgt,
                     entry.initiator, ORLOiSCSIErrStr(ret));
        return ret;
    }
    for (int n : numbers) {
        ret = ORLOiSCSILioTargetLunAclInitiatorAdd(target.iqn, tpgt, entry.initiator, n);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetLunAclInitiatorAdd(\"%s\", %d, \"%s\", %d) failed, err=%s", target.iqn,
                         tpgt, entry.initiator, n, ORLOiSCSIErrStr(ret));
            return ret;
        }
        ret = ORLOiSCSILioTargetLunInitiatorRw(target.iqn, tpgt, &entry, n);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetLunInitiatorRw(\"%s\", %d, %p, %d) failed, err=%s", target.iqn, tpgt,
                         static_cast<const void *>(&entry), n, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

// An initiator no longer stored: its node access list goes with its LUN entries.
uint32_t RemoveInitiator(const ORLOiSCSITarget &target, const char *initiator) {
    char path[acl::kPathSize];
    uint32_t ret = acl::FormatPath(path, acl::kAclDirFmt, target.iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, initiator);
    if (ret != ORLO_OK) return ret;
    if (!InKernel(path)) return ORLO_OK;
    ret = ORLOiSCSITargetPortalGroupNodeAclRemove(path);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetPortalGroupNodeAclRemove(\"%s\") failed, err=%s", path, ORLOiSCSIErrStr(ret));
    }
    return ret;
}

ORLOiSCSIAcl Entry(int32_t tid, const std::string &initiator, int32_t authority) {
    ORLOiSCSIAcl e;
    memset(&e, 0, sizeof(e));
    e.tid = tid;
    snprintf(e.initiator, sizeof(e.initiator), "%s", initiator.c_str());
    e.authority = authority;
    return e;
}

}  // namespace

bool CheckRequest(const std::vector<ORLOiSCSIAcl> &records, bool checkAuthority, ORLOiSCSITarget *target) {
    if (records.empty()) {
        ORLO_LOG_ERR("Empty ACL array");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return false;
    }
    const int32_t tid = records.front().tid;
    for (const ORLOiSCSIAcl &r : records) {
        if (r.tid != tid) {
            ORLO_LOG_ERR("NOT All tid the same in ACL array");
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return false;
        }
    }
    std::set<std::string> seen;
    for (const ORLOiSCSIAcl &r : records) {
        if (memchr(r.initiator, '\0', sizeof(r.initiator)) == nullptr) {
            ORLO_LOG_BAD_PARAMS();
            return false;
        }
        if (!ORLOiSCSIIsValidIscsiName(r.initiator)) {
            ORLO_LOG_ERR("Bad iSCSI Initiator name in ACL array of tid:%d: %s", tid, r.initiator);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return false;
        }
        if (checkAuthority && (r.authority < ISCSI_TARGET_AUTHORITY_NONE || r.authority > ISCSI_TARGET_AUTHORITY_RW)) {
            ORLO_LOG_ERR("Bad authority %d of iSCSI Initiator %s in ACL array", r.authority, r.initiator);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return false;
        }
        if (!seen.insert(r.initiator).second) {
            ORLO_LOG_ERR("iSCSI Initiator %s twice in ACL array", r.initiator);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return false;
        }
    }
    memset(target, 0, sizeof(*target));
    if (tid < ORLO_ISCSI_TID_MIN || tid > ORLO_ISCSI_TID_MAX || ORLOiSCSITargetGetByTid(tid, 0, target) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get target config of tid:%d", tid);
        return false;
    }
    return true;
}

uint32_t LoadStored(int32_t tid, StoredMap *stored) {
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(tid, entries);
    if (ret != ORLO_OK) return ret;
    for (const ORLOiSCSIAcl &e : entries) (*stored)[e.initiator] = e.authority;
    return ORLO_OK;
}

std::vector<Prior> PriorOf(const std::vector<ORLOiSCSIAcl> &records, const StoredMap &stored) {
    std::vector<Prior> out;
    for (const ORLOiSCSIAcl &r : records) {
        auto it = stored.find(r.initiator);
        out.push_back(Prior{r.initiator, it != stored.end(), it != stored.end() ? it->second : 0});
    }
    return out;
}

uint32_t RestorePrior(int32_t tid, const std::vector<Prior> &prior) {
    uint32_t first = ORLO_OK;
    for (const Prior &p : prior) {
        uint32_t ret;
        if (p.stored) {
            ret = ORLOiSCSITargetConfAclAdd(tid, p.initiator.c_str(), p.authority);
            if (ret != ORLO_OK) {
                ORLO_LOG_ERR("ORLOiSCSITargetConfAclAdd(%d, \"%s\", %d) failed, err=%s", tid, p.initiator.c_str(),
                             p.authority, ORLOiSCSIErrStr(ret));
            }
        } else {
            ret = ORLOiSCSITargetConfAclRemove(tid, p.initiator.c_str());
            if (ret != ORLO_OK) {
                ORLO_LOG_ERR("ORLOiSCSITargetConfAclRemove(%d, \"%s\") failed, err=%s", tid, p.initiator.c_str(),
                             ORLOiSCSIErrStr(ret));
            }
        }
        if (ret != ORLO_OK && first == ORLO_OK) first = ret;
    }
    return first;
}

uint32_t ApplyToKernel(const ORLOiSCSITarget &target, const std::vector<std::string> &initiators) {
    if ((ORLOiSCSITargetStatusGet(target.tid, &target) & ORLO_ISCSI_TARGET_STATUS_PRESENT) == 0) return ORLO_OK;
    StoredMap stored;
    uint32_t ret = LoadStored(target.tid, &stored);
    if (ret != ORLO_OK) return ret;
    std::vector<int> numbers;
    if ((ret = LoadedLunNumbers(target, &numbers)) != ORLO_OK) return ret;

    bool nodeAclKept = false;
    for (const std::string &initiator : initiators) {
        auto it = stored.find(initiator);
        const bool isStored = it != stored.end();
        if (acl::IsDefaultInitiator(initiator.c_str())) {
            // No default entry means only listed initiators may log in.
            const int32_t authority = isStored ? it->second : ISCSI_TARGET_AUTHORITY_NONE;
            ret = ORLOiSCSITargetDefaultAclEnable(&target, authority);
            if (ret != ORLO_OK) {
                ORLO_LOG_ERR("ORLOiSCSITargetDefaultAclEnable(%p, %d) failed, err=%s",
                             static_cast<const void *>(&target), authority, ORLOiSCSIErrStr(ret));
                return ret;
            }
            if (!acl::DefaultEntryIsNodeAcl()) continue;
        }
        if (isStored) {
            ret = AddInitiator(target, Entry(target.tid, initiator, it->second), numbers);
            nodeAclKept = true;
        } else {
            ret = RemoveInitiator(target, initiator.c_str());
        }
        if (ret != ORLO_OK) return ret;
    }
    // A node access list made here starts without credentials.
    if (nodeAclKept && (target.auth_type == ORLO_ISCSI_AUTH_CHAP || target.auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP)) {
        ret = ORLOiSCSILioTargetMaskingsChapAuthAdd(&target, target.auth_type);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetMaskingsChapAuthAdd(%p, %d) failed, err=%s",
                         static_cast<const void *>(&target), target.auth_type, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

std::vector<std::string> InitiatorsOf(const std::vector<ORLOiSCSIAcl> &records) {
    std::vector<std::string> out;
    for (const ORLOiSCSIAcl &r : records) out.push_back(r.initiator);
    return out;
}

}  // namespace masking
}  // namespace target
}  // namespace orlo
