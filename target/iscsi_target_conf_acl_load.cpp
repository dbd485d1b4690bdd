// Loads one target's access list in file order under the access-list file's shared lock.
// A failure leaves the list empty.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace {

using namespace orlo::target;

uint32_t LoadEntries(int32_t tid, ORLOiSCSIAclList *list) {
    POLIBC_SZLIST names = nullptr;
    int count = ORLOiSCSIConfSectionEnum(kAclConfPath, &names);
    orlo::SzListGuard namesGuard(names);
    if (count < 0) {
        ORLO_LOG_ERR("ORLOiSCSIConfSectionEnum(\"%s\", %p) failed", kAclConfPath, static_cast<void *>(&names));
        return ORLO_ERR_ENUM_CONF_SECTION;
    }
    if (count == 0) return ORLO_OK;
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzHashAlloc(%d) failed", kHashSize);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    for (int i = 0; i < count; ++i) {
        const char *section = OLIBCSzListGet(names, i);
        int32_t sectionTid = 0;
        const char *initiator = nullptr;
        if (!ScanAclSection(section, &sectionTid, &initiator)) {
            errno = EINVAL;
            ORLO_LOG_ERR("sscanf(\"%s\", \"%s\", %p, %p) failed, err=%m", section, kAclSectionFmt,
                         static_cast<void *>(&sectionTid), static_cast<const void *>(&initiator));
            continue;
        }
        if (sectionTid != tid) continue;
        OLIBCSzHashRemoveAll(hash.get());
        int got = OLIBCFileGetSection(kAclConfPath, section, hash.addr());
        if (got < 1) {
            ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kAclConfPath, section,
                         static_cast<void *>(hash.addr()), got);
            return ORLO_ERR_GET_SECTION;
        }
        ORLOiSCSIAcl *acl = nullptr;
        uint32_t ret = ORLOiSCSITargetAclStructCreate(hash.get(), &acl);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetAclStructCreate(%p, %p) failed, err=%s", static_cast<void *>(hash.get()),
                         static_cast<void *>(&acl), ORLOiSCSIErrStr(ret));
            return ret;
        }
        if (strlen(initiator) >= sizeof(acl->initiator)) {
            ORLO_LOG_ERR("Initiator of section %.40s... longer than %zu characters", section,
                         sizeof(acl->initiator) - 1);
            free(acl);
            return ORLO_ERR_PARSE_STRING;
        }
        acl->tid = sectionTid;
        strcpy(acl->initiator, initiator);
        ORLOiSCSIListAppend(list, &acl->link);
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclLoad(int32_t tid, ORLOiSCSIAclList *list) {
    if (list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    orlo::FileLockGuard lock(kAclLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_ERR("Failed to lock file: %s.", kAclLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = LoadEntries(tid, list);
    if (ret != ORLO_OK) ORLOiSCSITargetAclListFree(list);
    return ret;
}
