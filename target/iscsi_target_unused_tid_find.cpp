// The smallest tid no target uses.  Tids stay dense: with n targets the answer lies in
// 1..n+1, so only the tids up to n need marking.
#include <strings.h>

#include <cstdlib>
#include <cstring>
#include <memory>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_cache.h"
#include "target/target_internal.h"

namespace {

const char *const kRequiredKeys[] = {"tid",      "name",          "iqn",             "enabled",     "authen",
                                     "username", "password",      "mutual",          "mutual_username",
                                     "mutual_password", "hdr_chksum", "data_chksum", "send_seg_bytes",
                                     "recv_seg_bytes"};
constexpr size_t kRequiredCount = sizeof(kRequiredKeys) / sizeof(kRequiredKeys[0]);

// With n targets the answer lies in 1..n+1: the first tid of 1..n no target has, else n+1.
uint32_t PickFree(const std::vector<int32_t> &tids, ORLOiSCSITarget *target) {
    const int n = static_cast<int>(tids.size());
    std::vector<char> used(static_cast<size_t>(n), 0);
    for (int32_t t : tids)
        if (t >= 1 && t <= n) used[static_cast<size_t>(t - 1)] = 1;
    int tid = n + 1;
    for (int i = 0; i < n; ++i) {
        if (!used[static_cast<size_t>(i)]) {
            tid = i + 1;
            break;
        }
    }
    if (tid > ORLO_ISCSI_TID_MAX) {
        ORLO_LOG_ERR("No free target ID: %d targets", n);
        return orlo::target::kErrBadTid;
    }
    target->tid = tid;
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetUnusedTidFind(ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // The tids where the file's kept parse holds them (every section, backup objects
    // too), without building a record per target; the full load below when the parse
    // cannot serve (a malformed file reports what it finds there).
    {
        orlo::FileLockGuard lock(orlo::target::kLockPath, false, orlo::target::kLockTimeoutSec);
        if (lock.held()) {
            std::vector<int32_t> tids;
            if (!OLIBCFileExist(orlo::target::kConfPath)) {
                target->tid = 1;
                return ORLO_OK;
            }
            std::shared_ptr<const orlo::olibc::SectionFile> file =
                orlo::olibc::PlainSectionFileLoad(orlo::target::kConfPath);
            bool complete = file != nullptr;
            if (complete) {
                orlo::olibc::ForEachNamedSection(*file, nullptr, [&](size_t i) -> uint32_t {
                    // A section the full load would refuse (a key missing) or must look into
                    // further (secrets to decipher): the full load decides, as it always did.
                    uint32_t present = 0;
                    const char *tid = nullptr;
                    file->ForEachPair(i, [&](const char *key, const char *value) {
                        for (size_t k = 0; k < kRequiredCount; ++k)
                            if (strcmp(key, kRequiredKeys[k]) == 0) present |= 1u << k;
                        if (strcmp(key, "tid") == 0) tid = value;
                        if (strcmp(key, "authen") == 0 && strcasecmp(value, "no") != 0) complete = false;
                    });
                    if (present != (1u << kRequiredCount) - 1 || tid == nullptr) complete = false;
                    if (complete) tids.push_back(atoi(tid));
                    return complete ? ORLO_OK : 1;
                });
            }
            if (complete) return PickFree(tids, target);
        }
    }
    ORLOiSCSITargetFilter filter = {};  // flags 0: backup objects count as used
    ORLOiSCSITargetList list = {};
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
    uint32_t ret = ORLOiSCSITargetConfLoad(&filter, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&list), ORLOiSCSIErrStr(ret));
        return orlo::target::kErrLoadTargetConfig;
    }
    std::vector<int32_t> tids;
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) tids.push_back(t->tid);
    return PickFree(tids, target);
}
