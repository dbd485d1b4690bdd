// Access-list section names and the entry writer behind ORLOiSCSITargetConfAclAdd and
// ORLOiSCSITargetConfAclUpdate.
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

bool ScanAclSection(const char *section, int32_t *tid, const char **initiator) {
    int t = 0;
    int off = 0;
    if (sscanf(section, "iSCSI_ACL_T%d_%n", &t, &off) != 1 || off == 0 || section[off] == '\0') return false;
    *tid = t;
    *initiator = section + off;
    return true;
}

namespace {

uint32_t CheckEntry(int32_t tid, const char *initiator, int32_t authority) {
    if (initiator == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (tid < ORLO_ISCSI_TID_MIN || tid > ORLO_ISCSI_TID_MAX) {
        ORLO_LOG_ERR("Bad target ID: %d, not in %d..%d", tid, ORLO_ISCSI_TID_MIN, ORLO_ISCSI_TID_MAX);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadTid;
    }
    if (!ORLOiSCSIIsValidIscsiName(initiator)) {
        ORLO_LOG_ERR("Bad target acl of tid %d: initiator is not an iSCSI name", tid);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadAcl;
    }
    if (authority < ISCSI_TARGET_AUTHORITY_NONE || authority > ISCSI_TARGET_AUTHORITY_RW) {
        ORLO_LOG_ERR("Bad target acl authority of tid %d, %s: %d", tid, initiator, authority);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadAclAuthority;
    }
    return ORLO_OK;
}

}  // namespace

uint32_t WriteAclSection(int32_t tid, const char *initiator, int32_t authority, bool update) {
    uint32_t ret = CheckEntry(tid, initiator, authority);
    if (ret != ORLO_OK) return ret;
    FileLockGuard lock(kAclLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kAclLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzHashAlloc(%d) failed", kHashSize);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    char section[kSectionNameSize];
    snprintf(section, sizeof(section), kAclSectionFmt, tid, initiator);  // fits: name <= 223

    const bool fileExists = OLIBCFileExist(kAclConfPath) == 1;
    bool present = false;
    if (fileExists) {
        int got = OLIBCFileGetSection(kAclConfPath, section, hash.addr());
        if (got < 0) {
            ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kAclConfPath, section,
                         static_cast<void *>(hash.addr()), got);
            return ORLO_ERR_GET_SECTION;
        }
        present = got > 0;
        OLIBCSzHashRemoveAll(hash.get());
    }
    if (update && !present) {
        ORLO_LOG_ERR("Failed to get old section: %s from %s", section, kAclConfPath);
        return ORLO_ERR_DEFAULT;
    }
    char value[16];
    snprintf(value, sizeof(value), "%d", authority);
    if (OLIBCSzHashSetValue(hash.addr(), "authority", value) != 0) {
        ORLO_LOG_PLATFORM("OLIBCSzHashSetValue(%p, \"%s\", \"%s\")", static_cast<void *>(hash.addr()), "authority",
                          value);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    if (present) {
        if (OLIBCFileSetSection(kAclConfPath, section, section, hash.get(), kLineFmt) < 1) {
            ORLO_LOG_PLATFORM("OLIBCFileSetSection(\"%s\", \"%s\", \"%s\", %p)", kAclConfPath, section, section,
                              static_cast<void *>(hash.get()));
            return ORLO_ERR_SET_SECTION;
        }
        return ORLO_OK;
    }
    if (!fileExists && OLIBCFileTouch(kAclConfPath) < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileTouch(\"%s\")", kAclConfPath);
        return ORLO_ERR_TOUCH_FILE;
    }
    if (OLIBCFileAddSection(kAclConfPath, section, hash.get(), kLineFmt) < 1) {
        ORLO_LOG_PLATFORM("OLIBCFileAddSection(\"%s\", \"%s\", %p)", kAclConfPath, section,
                          static_cast<void *>(hash.get()));
        return ORLO_ERR_ADD_SECTION;
    }
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo
