// Removes a target's section and then its access-list sections, holding the target
// file's lock throughout: target file first, access-list file second.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

using namespace orlo::target;

extern "C" ORLO_EXPORT int ORLOiSCSITargetConfRemove(const ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    orlo::FileLockGuard lock(kLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kLockPath);
        return -1;
    }
    char section[kSectionNameSize];
    snprintf(section, sizeof(section), kSectionFmt, target->tid);
    if (OLIBCFileExist(kConfPath) == 1 && OLIBCFileRemoveSection(kConfPath, section) < 0) {
        ORLO_LOG_ERR("Failed to remove section: %s from %s, errno=0x%X", section, kConfPath,
                     static_cast<unsigned>(OLIBCErrGet()));
        return -1;
    }
    uint32_t ret = ORLOiSCSITargetConfAclsRemove(target->tid);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfAclsRemove(%d) failed, err=%s", target->tid, ORLOiSCSIErrStr(ret));
        return -1;
    }
    return 0;
}
