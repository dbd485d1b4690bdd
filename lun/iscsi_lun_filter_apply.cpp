// The LUN filter: decides, from the keys of one section, whether a reader keeps the LUN.
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

namespace {

long NumberOf(const char *value) { return strtol(value, nullptr, 10); }

bool IsBackupObject(const OLIBC_SZHASH *section) {
    const char *v = OLIBCSzHashGetValue(section, "bkp_obj");
    return v != nullptr && NumberOf(v) == 1;
}

// One equality test of step 3: false when the key is missing or differs.
bool KeyEquals(const OLIBC_SZHASH *section, const char *key, const char *wanted) {
    const char *v = OLIBCSzHashGetValue(section, key);
    return v != nullptr && strcmp(v, wanted) == 0;
}

}  // namespace

uint32_t ORLOiSCSILunFilterApply(const ORLOiSCSILunFilter *filter, const OLIBC_SZHASH *section) {
    using orlo::lun::kErrNotAccepted;
    if (filter == nullptr || section == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    const uint32_t flags = filter->flags;

    // Two whole values stand for "everything".
    if (flags == ORLO_ISCSI_LUN_FILTER_ALL) return IsBackupObject(section) ? kErrNotAccepted : static_cast<uint32_t>(ORLO_OK);
    if (flags == ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP) return ORLO_OK;

    if (flags & ORLO_ISCSI_LUN_FILTER_NO_BKP_BLUN_VDISK) {
        if (IsBackupObject(section)) return kErrNotAccepted;
        const char *devtype = OLIBCSzHashGetValue(section, "devtype");
        if (devtype != nullptr) {
            long d = NumberOf(devtype);
            if (d == 5 || d == 6 || d == 7) return kErrNotAccepted;
        }
    }

    // The criteria: each set flag must hold; a flag without its operand rejects.
    bool match = true;
    if (flags & ORLO_ISCSI_LUN_FILTER_VAAI)
        match = match && orlo::lun::IsYes(OLIBCSzHashGetValue(section, "vaai_support"));
    struct StringTest {
        uint32_t flag;
        const char *key;
        const char *operand;
    };
    const StringTest tests[] = {
        {ORLO_ISCSI_LUN_FILTER_ROOT_PATH, "rootpath", filter->rootPath},
        {ORLO_ISCSI_LUN_FILTER_NAME, "name", filter->name},
        {ORLO_ISCSI_LUN_FILTER_UUID, "uuid", filter->uuid},
    };
    for (const StringTest &t : tests) {
        if (!(flags & t.flag)) continue;
        if (t.operand == nullptr) {
            ORLO_LOG_BAD_PARAMS();
            return kErrNotAccepted;
        }
        match = match && KeyEquals(section, t.key, t.operand);
    }

    const char *lid = OLIBCSzHashGetValue(section, "lid");
    if (flags & ORLO_ISCSI_LUN_FILTER_LID) {
        if (lid == nullptr || NumberOf(lid) != filter->lid || !match) return kErrNotAccepted;
        return ORLO_OK;
    }
    if ((flags & ORLO_ISCSI_LUN_FILTER_LID_ARRAY) && filter->lids != nullptr && filter->lidCount > 0) {
        // Decided by the lid alone: the tests above are deliberately not consulted here.
        if (lid == nullptr) return kErrNotAccepted;
        long v = NumberOf(lid);
        for (int32_t i = 0; i < filter->lidCount; ++i)
            if (filter->lids[i] == v) return ORLO_OK;
        return kErrNotAccepted;
    }
    return match ? static_cast<uint32_t>(ORLO_OK) : kErrNotAccepted;
}
