// Removes every access-list entry of one target in one rewrite of the file.
#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

using namespace orlo::target;

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclsRemove(int32_t tid) {
    orlo::FileLockGuard lock(kAclLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kAclLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    POLIBC_SZLIST names = nullptr;
    int count = ORLOiSCSIConfSectionEnum(kAclConfPath, &names);
    orlo::SzListGuard namesGuard(names);
    if (count < 0) {
        ORLO_LOG_ERR("ORLOiSCSIConfSectionEnum(\"%s\", %p) failed", kAclConfPath, static_cast<void *>(&names));
        return ORLO_ERR_ENUM_CONF_SECTION;
    }
    if (count == 0) return ORLO_OK;
    orlo::SzListGuard doomed(OLIBCSzListAlloc(16));
    if (doomed.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzListAlloc(%d) failed", 16);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    for (int i = 0; i < count; ++i) {
        const char *section = OLIBCSzListGet(names, i);
        int32_t sectionTid = 0;
        const char *initiator = nullptr;
        if (!ScanAclSection(section, &sectionTid, &initiator) || sectionTid != tid) continue;
        if (OLIBCSzListPush(doomed.addr(), section) < 0) {
            ORLO_LOG_PLATFORM("OLIBCSzListPush(%p, \"%s\")", static_cast<void *>(doomed.addr()), section);
            return ORLO_ERR_OUT_OF_MEMORY;
        }
    }
    if (OLIBCSzListCount(doomed.get()) == 0) return ORLO_OK;
    uint32_t ret = ORLOiSCSIRemoveSectionList(kAclConfPath, doomed.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIRemoveSectionList(\"%s\", %p) failed, err=%s", kAclConfPath,
                     static_cast<void *>(doomed.get()), ORLOiSCSIErrStr(ret));
        return ORLO_ERR_REMOVE_SECTION;
    }
    return ORLO_OK;
}
