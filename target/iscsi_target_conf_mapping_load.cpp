// Loads the accepted mapping sections of the mapping file into a snapshot's mapping
// list, in file order, under the file's shared lock.  A failure leaves the list empty.
//
// The sections come from this thread's parse of the file (platform/olibc_file_cache.h);
// a query by tid (or else by lid, or by LUN number) looks only at the sections whose key
// could match and still tests each of them.  A file the parse cannot serve is read
// section by section by name, which reports the failure as it always has.
#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <memory>
#include <new>
#include <vector>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_cache.h"

namespace {

using namespace orlo::conf;
using orlo::olibc::SectionFile;

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

// A section's number under key, as Accepts and the record read it.
bool NumberKey(const SectionFile &file, size_t i, const char *key, int64_t *out) {
    const char *v = file.ValueOf(i, key);
    if (v == nullptr) return false;
    *out = static_cast<int32_t>(strtol(v, nullptr, 10));
    return true;
}
bool TidKey(const SectionFile &file, size_t i, int64_t *key) { return NumberKey(file, i, "tid", key); }
bool LidKey(const SectionFile &file, size_t i, int64_t *key) { return NumberKey(file, i, "lid", key); }
bool LunKey(const SectionFile &file, size_t i, int64_t *key) { return NumberKey(file, i, "lun", key); }

// The sections that can pass the filter's criteria (all of them: nullptr in *out).
// Accepts rejects the others without a word, so they need not be looked at.
bool Narrow(const SectionFile &file, const ORLOiSCSILunFilter *filter, const std::vector<uint32_t> **out) {
    *out = nullptr;
    const uint32_t flags = filter->flags;
    if (flags & ORLO_ISCSI_TARGET_FILTER_TID)
        *out = file.Candidates(TidKey, filter->tid);
    else if (flags & ORLO_ISCSI_LUN_FILTER_LID)
        *out = file.Candidates(LidKey, filter->lid);
    else if (flags & ORLO_ISCSI_MAPPING_FILTER_LUN)
        *out = file.Candidates(LunKey, filter->lun);
    else
        return true;
    return *out != nullptr;
}

uint32_t Accept(const ORLOiSCSILunFilter *filter, const OLIBC_SZHASH *section, ORLOiSCSIMappingList *list) {
    if (!Accepts(filter, section)) return ORLO_OK;
    ORLOiSCSIMapping *m = nullptr;
    uint32_t ret = ORLOiSCSITargetMappingObjectCreate(section, &m);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetMappingObjectCreate(%p, %p) failed, err=%s", static_cast<const void *>(section),
                     static_cast<void *>(&m), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListAppend(list, &m->link);
    return ORLO_OK;
}

// Every section, enumerated and then read by name.
uint32_t LoadByName(const ORLOiSCSILunFilter *filter, ORLOiSCSIMappingList *list) {
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
        uint32_t ret = Accept(filter, hash.get(), list);
        if (ret != ORLO_OK) return ret;
    }
    return ORLO_OK;
}

uint32_t LoadSections(const ORLOiSCSILunFilter *filter, ORLOiSCSIMappingList *list) {
    if (OLIBCFileExist(kMappingConfPath) != 1) return ORLO_OK;  // no file: no mappings
    std::shared_ptr<const SectionFile> file = orlo::olibc::PlainSectionFileLoad(kMappingConfPath);
    if (file == nullptr) return LoadByName(filter, list);
    const std::vector<uint32_t> *candidates = nullptr;
    if (!Narrow(*file, filter, &candidates)) {
        ORLO_LOG_ERR("Failed to alloc for %s, errno=0X%X", kMappingConfPath, static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    return orlo::olibc::ForEachNamedSection(*file, candidates, [&](size_t i) -> uint32_t {
        const OLIBC_SZHASH *section = file->Hash(i);
        if (section == nullptr) {
            ORLO_LOG_ERR("Failed to get section '%s' of %s, errno=0X%X", file->Name(i), kMappingConfPath,
                         static_cast<unsigned>(OLIBCErrGet()));
            return ORLO_ERR_GET_SECTION;
        }
        return Accept(filter, section, list);
    });
}

}  // namespace

namespace orlo {
namespace conf {

bool MappedLids(const ORLOiSCSILunFilter *filter, std::vector<int32_t> *lids) {
    const olibc::ErrState before = olibc::ErrState::Save();
    auto restore = MakeScopeExit([&before]() { before.Restore(); });
    lids->clear();
    FileLockGuard lock(kMappingLockPath, false, 0);  // a busy file is not waited for here
    if (!lock.held()) return false;
    if (OLIBCFileExist(kMappingConfPath) != 1) return true;
    std::shared_ptr<const SectionFile> file = olibc::SectionFileLoad(kMappingConfPath);
    if (file == nullptr || !file->IsPlain()) return false;
    const std::vector<uint32_t> *candidates = nullptr;
    if (!Narrow(*file, filter, &candidates)) return false;
    try {
        const size_t n = candidates != nullptr ? candidates->size() : file->Count();
        for (size_t k = 0; k < n; ++k) {
            const size_t i = candidates != nullptr ? (*candidates)[k] : k;
            if (!file->IsFirstOfName(i)) continue;
            const OLIBC_SZHASH *section = file->Hash(i);
            if (section == nullptr) return false;
            if (!Accepts(filter, section)) continue;
            int64_t lid = 0;
            if (!LidKey(*file, i, &lid)) return false;  // the load itself will refuse it
            lids->push_back(static_cast<int32_t>(lid));
        }
        std::sort(lids->begin(), lids->end());
        lids->erase(std::unique(lids->begin(), lids->end()), lids->end());
    } catch (const std::bad_alloc &) {
        return false;
    }
    return true;
}

}  // namespace conf
}  // namespace orlo

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingLoad(const ORLOiSCSILunFilter *filter, ORLOiSCSIConf *conf) {
    if (filter == nullptr || conf == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(&conf->mappings)) ORLOiSCSIListInit(&conf->mappings);
    orlo::FileLockGuard lock(kMappingLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = LoadSections(filter, &conf->mappings);
    if (ret != ORLO_OK) ORLOiSCSIListFree(&conf->mappings, offsetof(ORLOiSCSIMapping, link));
    return ret;
}
