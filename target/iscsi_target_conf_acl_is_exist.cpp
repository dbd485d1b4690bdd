// Whether one access-list entry is stored.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

using namespace orlo::target;

extern "C" ORLO_EXPORT bool ORLOiSCSITargetConfAclIsExist(int32_t tid, const char *initiator) {
    if (initiator == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return false;
    }
    char section[kSectionNameSize];
    int n = snprintf(section, sizeof(section), kAclSectionFmt, tid, initiator);
    if (n < 0 || n >= static_cast<int>(sizeof(section))) return false;
    orlo::FileLockGuard lock(kAclLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kAclLockPath);
        return false;
    }
    if (OLIBCFileExist(kAclConfPath) != 1) return false;
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) return false;
    return OLIBCFileGetSection(kAclConfPath, section, hash.addr()) > 0;
}
