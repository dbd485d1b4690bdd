// Removes one access-list entry; a missing file or entry is success.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

using namespace orlo::target;

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclRemove(int32_t tid, const char *initiator) {
    if (initiator == nullptr || initiator[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char section[kSectionNameSize];
    int n = snprintf(section, sizeof(section), kAclSectionFmt, tid, initiator);
    if (n < 0 || n >= static_cast<int>(sizeof(section))) {
        ORLO_LOG_ERR("Bad target acl of tid %d: initiator too long", tid);
        return ORLO_ERR_PARSE_STRING;
    }
    orlo::FileLockGuard lock(kAclLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kAclLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    if (OLIBCFileExist(kAclConfPath) != 1) return ORLO_OK;
    if (OLIBCFileRemoveSection(kAclConfPath, section) < 0) {
        ORLO_LOG_ERR("OLIBCFileRemoveSection(\"%s\", \"%s\") failed", kAclConfPath, section);
        return ORLO_ERR_REMOVE_SECTION;
    }
    return ORLO_OK;
}
