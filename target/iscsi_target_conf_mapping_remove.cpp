// Removes one mapping section from the mapping file; nothing to remove is success.
#include <cstdio>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

using namespace orlo::conf;

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingRemove(int32_t tid, int32_t lid) {
    if (tid < ORLO_ISCSI_TID_MIN || tid > ORLO_ISCSI_TID_MAX || lid < 1 || lid > 1024) {
        ORLO_LOG_ERR("Bad parameter, tid:%d lid:%d", tid, lid);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::FileLockGuard lock(kMappingLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    if (OLIBCFileExist(kMappingConfPath) != 1) return ORLO_OK;
    char section[kSectionNameSize];
    snprintf(section, sizeof(section), kMappingSectionFmt, tid, lid);
    if (OLIBCFileRemoveSection(kMappingConfPath, section) < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileRemoveSection(\"%s\", \"%s\")", kMappingConfPath, section);
        return ORLO_ERR_REMOVE_SECTION;
    }
    return ORLO_OK;
}
