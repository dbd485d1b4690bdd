// The target reading of the load filter: which sections a load accepts.
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

namespace {

constexpr uint32_t kFlagIgnored = 0x200000u;

bool TidOf(const OLIBC_SZHASH *section, int32_t *tid) {
    const char *v = OLIBCSzHashGetValue(section, "tid");
    if (v == nullptr) return false;
    *tid = static_cast<int32_t>(strtol(v, nullptr, 10));
    return true;
}

}  // namespace

int FilterAccepts(const ORLOiSCSITargetFilter *filter, const OLIBC_SZHASH *section) {
    const uint32_t flags = filter->flags;
    if (flags == 0) return 1;
    if ((flags & ~kFlagIgnored) == ORLO_ISCSI_TARGET_FILTER_ALL) {
        const char *bkp = OLIBCSzHashGetValue(section, "bkp_obj");
        return (bkp != nullptr && strtol(bkp, nullptr, 10) == 1) ? 0 : 1;
    }
    int32_t tid = 0;
    const bool hasTid = TidOf(section, &tid);
    if ((flags & ORLO_ISCSI_TARGET_FILTER_TID) && (!hasTid || tid != filter->tid)) return 0;
    if (flags & ORLO_ISCSI_TARGET_FILTER_TID_ARRAY) {
        if (!hasTid || filter->tids == nullptr || filter->tidCount <= 0) return 0;
        bool found = false;
        for (int32_t i = 0; i < filter->tidCount && !found; ++i) found = filter->tids[i] == tid;
        if (!found) return 0;
    }
    if (flags & ORLO_ISCSI_TARGET_FILTER_NAME) {
        if (filter->name == nullptr) {
            ORLO_LOG_BAD_PARAMS();
            return 0;
        }
        const char *v = OLIBCSzHashGetValue(section, "name");
        if (v == nullptr || strcmp(v, filter->name) != 0) return 0;
    }
    if (flags & ORLO_ISCSI_TARGET_FILTER_IQN) {
        if (filter->iqn == nullptr) {
            ORLO_LOG_BAD_PARAMS();
            return 0;
        }
        const char *v = OLIBCSzHashGetValue(section, "iqn");
        if (v == nullptr || strcmp(v, filter->iqn) != 0) return 0;
    }
    return 1;
}

}  // namespace target
}  // namespace orlo
