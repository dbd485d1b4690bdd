// Loads the accepted mapping sections of the mapping file into a snapshot's mapping
// list, in file order, under the file's shared lock.  A failure leaves the list empty.
#include <cstddef>
#include <cstdlib>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

namespace {

using namespace orlo::conf;

// Whether key is present and holds want.
bool KeyEquals(const OLIBC_SZHASH *section, const char *key, int32_t want) {
    const char *v = OLIBCSzHashGetValue(section, key);
    return v != nullptr && static_cast<int32_t>(strtol(v, nullptr, 10)) == want;
}

bool Accepts(const ORLOiSCSILunFilter *filter, const OLIBC_SZHASH *section) {
    const uint32_t flags = filter->flags;
    if ((flags & ORLO_ISCSI_TARGET_FILTER_TID) && !KeyEquals(section, "tid", filter->tid)) return false;
    if ((flags & ORLO_ISCSI_LUN_FILTER_LID) && !KeyEquals(section, "lid", filter->lid)) return false;
    if ((flags & ORLO_ISCSI_MAPPING_FILTER_LUN) && !KeyEquals(section, "lun", filter->lun)) return false;
    return true;
}

uint32_t LoadSections(const ORLOiSCSILunFilter *filter, ORLOiSCSIMappingList *list) {
    POLIBC_SZLIST names = nullptr;
    int count = ORLOiSCSIConfSectionEnum(kMappingConfPath, &names);
    orlo::SzListGuard namesGuard(names);
    if (count < 0) {
        ORLO_LOG_ERR("Failed to enum targets' sections, errno=0X%X", static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_ENUM_SECTION;
    }
    if (count == 0) return ORLO_OK;

    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("Failed to alloc for %s, errno=0X%X", kMappingConfPath, static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    for (int i = 0; i < count; ++i) {
        const char *section = OLIBCSzListGet(names, i);
        OLIBCSzHashRemoveAll(hash.get());
        if (OLIBCFileGetSection(kMappingConfPath, section, hash.addr()) < 1) {
            ORLO_LOG_ERR("Failed to get section '%s' of %s, errno=0X%X", section, kMappingConfPath,
                         static_cast<unsigned>(OLIBCErrGet()));
            return ORLO_ERR_GET_SECTION;
        }
        if (!Accepts(filter, hash.get())) continue;
        ORLOiSCSIMapping *m = nullptr;
        uint32_t ret = ORLOiSCSITargetMappingObjectCreate(hash.get(), &m);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetMappingObjectCreate(%p, %p) failed, err=%s", static_cast<void *>(hash.get()),
                         static_cast<void *>(&m), ORLOiSCSIErrStr(ret));
            return ret;
        }
        ORLOiSCSIListAppend(list, &m->link);
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingLoad(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf) {
    if (filter == nullptr || conf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(&conf->mappings)) ORLOiSCSIListInit(&conf->mappings);
    orlo::FileLockGuard lock(kMappingLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_ERR("Failed to lock file: %s.", kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = LoadSections(filter, &conf->mappings);
    if (ret != ORLO_OK) ORLOiSCSIListFree(&conf->mappings, offsetof(ORLOiSCSIMapping, link));
    return ret;
}
