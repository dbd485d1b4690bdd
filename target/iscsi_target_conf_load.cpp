// Loads the accepted target sections of the target file into a list, in file order,
// under the file's shared lock.  A failure leaves the list empty.
#include <cerrno>
#include <cstdlib>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace {

using namespace orlo::target;

uint32_t LoadSections(const ORLOiSCSITargetFilter *filter, ORLOiSCSITargetList *list) {
    POLIBC_SZLIST names = nullptr;
    int count = ORLOiSCSIConfSectionEnum(kConfPath, &names);
    orlo::SzListGuard namesGuard(names);
    if (count < 0) {
        ORLO_LOG_ERR("Failed to enum targets' sections, errno=0X%X", static_cast<unsigned>(OLIBCErrGet()));
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
        OLIBCSzHashRemoveAll(hash.get());
        int got = OLIBCFileGetSection(kConfPath, section, hash.addr());
        if (got < 1) {
            ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kConfPath, section,
                         static_cast<void *>(hash.addr()), got);
            return ORLO_ERR_GET_SECTION;
        }
        if (!FilterAccepts(filter, hash.get())) continue;
        ORLOiSCSITarget *target = nullptr;
        uint32_t ret = ORLOiSCSITargetStructCreate(hash.get(), &target);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetStructCreate(%p, %p) failed, err=%s", static_cast<void *>(hash.get()),
                         static_cast<void *>(&target), ORLOiSCSIErrStr(ret));
            return ret;
        }
        ORLOiSCSIListAppend(list, &target->link);
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfLoad(const ORLOiSCSITargetFilter *filter,
                                                        ORLOiSCSITargetList *list) {
    if (filter == nullptr || list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    orlo::FileLockGuard lock(kLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_ERR("Failed to lock file: %s.", kLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = LoadSections(filter, list);
    if (ret != ORLO_OK) ORLOiSCSITargetListFree(list);
    return ret;
}
