// A target's name and IQN belong to it alone: the name is how administrators and the
// command line choose a target, and the IQN names its node in the kernel, where two
// targets could not both live.  Creation and update check both under the target lock,
// so the check and the write that follows are one step.
#include <strings.h>

#include <cstdlib>
#include <cstring>
#include <memory>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_cache.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

namespace {

uint32_t Clash(int32_t tid, const char *what, const char *value) {
    const bool name = strcmp(what, "name") == 0;
    ORLO_LOG_ERR("Target %s is used by tid %d already: %s", what, tid, value);
    return name ? kErrBadName : kErrBadIqn;
}

// The same check on the file's kept parse: the names and IQNs are read where they stand,
// without building a record for every target.  false when the parse cannot serve.
bool CheckOnParse(const ORLOiSCSITarget *t, uint32_t *ret) {
    if (!OLIBCFileExist(kConfPath)) {
        *ret = ORLO_OK;
        return true;
    }
    std::shared_ptr<const olibc::SectionFile> file = olibc::PlainSectionFileLoad(kConfPath);
    if (file == nullptr) return false;
    *ret = olibc::ForEachNamedSection(*file, nullptr, [&](size_t i) -> uint32_t {
        const char *tid = nullptr, *name = nullptr, *iqn = nullptr;
        file->ForEachPair(i, [&](const char *key, const char *value) {
            if (strcmp(key, "tid") == 0) tid = value;
            else if (strcmp(key, "name") == 0) name = value;
            else if (strcmp(key, "iqn") == 0) iqn = value;
        });
        if (tid == nullptr || atoi(tid) == t->tid) return ORLO_OK;
        if (name != nullptr && strcmp(name, t->name) == 0) return Clash(atoi(tid), "name", t->name);
        if (iqn != nullptr && strcasecmp(iqn, t->iqn) == 0) return Clash(atoi(tid), "iqn", t->iqn);
        return ORLO_OK;
    });
    return true;
}

}  // namespace

uint32_t CheckIdentityFree(const ORLOiSCSITarget *t) {
    {
        FileLockGuard lock(kLockPath, false, kLockTimeoutSec);
        if (!lock.held()) {
            ORLO_LOG_LOCK_FAILED(kLockPath);
            return ORLO_ERR_LOCK_FILE;
        }
        uint32_t ret;
        if (CheckOnParse(t, &ret)) return ret;
    }
    ORLOiSCSITargetFilter filter = {};  // flags 0: every target, backup objects too
    ORLOiSCSITargetList list = {};
    auto freeList = MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
    uint32_t ret = ORLOiSCSITargetConfLoad(&filter, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfLoad(%p, %p) failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&list), ORLOiSCSIErrStr(ret));
        return kErrLoadTargetConfig;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *other;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, other) {
        if (other->tid == t->tid) continue;
        if (strcmp(other->name, t->name) == 0) {
            ORLO_LOG_ERR("Target name is used by tid %d already: %s", other->tid, t->name);
            return kErrBadName;
        }
        // iSCSI names compare without case.
        if (strcasecmp(other->iqn, t->iqn) == 0) {
            ORLO_LOG_ERR("Target iqn is used by tid %d already: %s", other->tid, t->iqn);
            return kErrBadIqn;
        }
    }
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo
