// Loads a configuration snapshot: targets, LUNs and mappings as the filter's kind bits
// ask, in that order, each file under its own lock and released before the next is
// read; then links the mappings and keeps only mapped objects when asked.  A snapshot is
// returned whole or not at all.  A snapshot of mapped objects only reads just the LUNs
// that the mapping file names (a quick look at it first), with the same result.
#include <algorithm>
#include <new>
#include <vector>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

namespace {

using namespace orlo::conf;

// The target reading of the snapshot's filter.
ORLOiSCSITargetFilter TargetFilterOf(const ORLOiSCSILunFilter *filter) {
    ORLOiSCSITargetFilter t = {};
    t.flags = filter->flags;
    t.tid = filter->tid;
    t.name = filter->name;
    t.iqn = filter->iqn;
    t.tids = filter->tids;
    t.tidCount = filter->tidCount;
    return t;
}

// Whether every mapping of the list names one of lids (sorted).
bool NamesOnly(ORLOiSCSIMappingList &mappings, const std::vector<int32_t> &lids) {
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&mappings, link, m) {
        if (!std::binary_search(lids.begin(), lids.end(), m->lid)) return false;
    }
    return true;
}

uint32_t Load(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf) {
    const uint32_t flags = filter->flags;
    if (flags & ORLO_ISCSI_LUN_FILTER_LOAD_TARGETS) {
        const ORLOiSCSITargetFilter targetFilter = TargetFilterOf(filter);
        uint32_t ret = ORLOiSCSITargetConfLoad(&targetFilter, &conf->targets);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<const void *>(&targetFilter),
                         static_cast<void *>(&conf->targets), ORLOiSCSIErrStr(ret));
            return kErrLoadTargetConfig;
        }
    }
    // A snapshot that keeps only mapped objects needs only the LUNs its mappings name:
    // their lids are looked up first, and the LUN reader may leave the others unread.
    const bool mappedOnly = (flags & ORLO_ISCSI_LUN_FILTER_LOAD_LUNS) && (flags & ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS) &&
                            (flags & ORLO_ISCSI_LUN_FILTER_MAPPED_ONLY);
    std::vector<int32_t> mappedLids;
    bool narrowed = false;
    if (mappedOnly) {
        try {
            narrowed = MappedLids(filter, &mappedLids);
        } catch (const std::bad_alloc &) {
            narrowed = false;
        }
    }
    if (flags & ORLO_ISCSI_LUN_FILTER_LOAD_LUNS) {
        uint32_t ret = narrowed ? LunConfLoadOfLids(filter, &conf->luns, mappedLids)
                                : ORLOiSCSILunConfLoad(filter, &conf->luns);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILunConfLoad(%p, %p) failed, err=%s", static_cast<const void *>(filter),
                         static_cast<void *>(&conf->luns), ORLOiSCSIErrStr(ret));
            return kErrLoadLunConfig;
        }
    }
    if (flags & ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS) {
        uint32_t ret = ORLOiSCSITargetConfMappingLoad(filter, conf);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfMappingLoad(%p, %p) failed, err=%s", static_cast<const void *>(filter),
                         static_cast<void *>(conf), ORLOiSCSIErrStr(ret));
            return kErrLoadMappingConfig;
        }
    }
    if (narrowed && !NamesOnly(conf->mappings, mappedLids)) {
        // The mapping file changed between the two reads and names a LUN left unread:
        // read the LUNs again, all of them, as a snapshot without the shortcut would.
        ORLOiSCSILunListFree(&conf->luns);
        uint32_t ret = ORLOiSCSILunConfLoad(filter, &conf->luns);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILunConfLoad(%p, %p) failed, err=%s", static_cast<const void *>(filter),
                         static_cast<void *>(&conf->luns), ORLOiSCSIErrStr(ret));
            return kErrLoadLunConfig;
        }
    }
    if (ORLOiSCSITargetConfMappingMake(conf) != 0) {
        ORLO_LOG_PLATFORM("ORLOiSCSITargetConfMappingMake(%p)", static_cast<void *>(conf));
        return kErrLoadMappingConfig;
    }
    uint32_t ret = ORLOiSCSIConfFilter(filter, conf);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfFilter(%p, %p) failed, err=%s", static_cast<const void *>(filter),
                     static_cast<void *>(conf), ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfGet(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf) {
    if (filter == nullptr || conf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSIListInit(&conf->luns);
    ORLOiSCSIListInit(&conf->targets);
    ORLOiSCSIListInit(&conf->mappings);
    uint32_t ret = Load(filter, conf);
    if (ret != ORLO_OK) ORLOiSCSIConfFree(conf);
    return ret;
}
