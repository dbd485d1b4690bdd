// Removes every mapping of one LUN from the mapping file, whatever its target: the
// sections "iSCSI_MAP_T<tid>_L<lid>" whose lid is the LUN's, in one rewrite of the file.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

namespace {

constexpr const char *kMappingConfPath = "/usr/orlo/etc/iscsi_mapping.conf";
constexpr const char *kMappingLockPath = "/tmp/iscsi/iscsi_mapping.conf.lock";
constexpr int kLockTimeoutSec = 60;

// True when name is exactly "iSCSI_MAP_T<tid>_L<lid>" with this lid.
bool IsMappingOf(const char *name, int32_t lid) {
    int tid = 0;
    int l = 0;
    int end = 0;
    if (sscanf(name, "iSCSI_MAP_T%d_L%d%n", &tid, &l, &end) != 2) return false;
    return name[end] == '\0' && l == lid;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunMappingRemove(int32_t lid) {
    if (lid < 1 || lid > 1024) {
        ORLO_LOG_ERR("Bad parameters, lid[%d] is In-Valid[%d]", lid, lid);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::FileLockGuard lock(kMappingLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    POLIBC_SZLIST names = nullptr;
    int count = ORLOiSCSIConfSectionEnum(kMappingConfPath, &names);
    orlo::SzListGuard namesGuard(names);
    if (count < 0) {
        ORLO_LOG_ERR("ORLOiSCSIConfSectionEnum(\"%s\", %p) failed", kMappingConfPath, static_cast<void *>(&names));
        return ORLO_ERR_ENUM_SECTION;
    }
    if (count == 0) return ORLO_OK;

    orlo::SzListGuard doomed(OLIBCSzListAlloc(16));
    if (doomed.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzListAlloc(%d) failed", 16);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    for (int i = 0; i < count; ++i) {
        const char *name = OLIBCSzListGet(names, i);
        if (name == nullptr || !IsMappingOf(name, lid)) continue;
        if (OLIBCSzListPush(doomed.addr(), name) < 0) {
            ORLO_LOG_PLATFORM("OLIBCSzListPush(%p, \"%s\")", static_cast<void *>(doomed.addr()), name);
            return ORLO_ERR_OUT_OF_MEMORY;
        }
    }
    if (OLIBCSzListCount(doomed.get()) == 0) return ORLO_OK;  // nothing to rewrite
    uint32_t ret = ORLOiSCSIRemoveSectionList(kMappingConfPath, doomed.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIRemoveSectionList(\"%s\", %p) failed, err=%s", kMappingConfPath,
                     static_cast<void *>(doomed.get()), ORLOiSCSIErrStr(ret));
        return ORLO_ERR_REMOVE_SECTION;
    }
    return ORLO_OK;
}
