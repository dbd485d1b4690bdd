// Loads the accepted target sections of the target file into a list, in file order,
// under the file's shared lock.  A failure leaves the list empty.
//
// The sections come from this thread's parse of the file (platform/olibc_file_cache.h);
// a query by tid looks only at the sections whose tid could match and still puts each of
// them through the filter.  A file the parse cannot serve (unreadable, malformed) is read
// section by section by name, which reports the failure as it always has.
#include <cerrno>
#include <cstdlib>
#include <memory>
#include <new>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_cache.h"
#include "target/target_internal.h"

namespace {

using namespace orlo::target;
using orlo::olibc::SectionFile;

constexpr uint32_t kFlagIgnored = 0x200000u;

// The section's tid as the filter reads it.
bool TidKey(const SectionFile &file, size_t i, int64_t *key) {
    const char *v = file.ValueOf(i, "tid");
    if (v == nullptr) return false;
    *key = static_cast<int32_t>(strtol(v, nullptr, 10));
    return true;
}

uint32_t Accept(const ORLOiSCSITargetFilter *filter, const OLIBC_SZHASH *section, ORLOiSCSITargetList *list) {
    if (!FilterAccepts(filter, section)) return ORLO_OK;
    ORLOiSCSITarget *target = nullptr;
    uint32_t ret = ORLOiSCSITargetStructCreate(section, &target);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetStructCreate(%p, %p) failed, err=%s", static_cast<const void *>(section),
                     static_cast<void *>(&target), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListAppend(list, &target->link);
    return ORLO_OK;
}

// Every section, enumerated and then read by name.
uint32_t LoadByName(const ORLOiSCSITargetFilter *filter, ORLOiSCSITargetList *list) {
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
        uint32_t ret = Accept(filter, hash.get(), list);
        if (ret != ORLO_OK) return ret;
    }
    return ORLO_OK;
}

// The sections the filter can accept, from the parse: those of a tid criterion, or all
// (nullptr).  The tid tests come first in the filter and reject silently, so skipping
// the sections they reject changes nothing but the time.
bool Narrow(const SectionFile &file, const ORLOiSCSITargetFilter *filter, std::vector<uint32_t> *picked,
            const std::vector<uint32_t> **out) {
    *out = nullptr;
    const uint32_t flags = filter->flags;
    if (flags == 0 || (flags & ~kFlagIgnored) == ORLO_ISCSI_TARGET_FILTER_ALL) return true;
    if (flags & ORLO_ISCSI_TARGET_FILTER_TID) {
        *out = file.Candidates(TidKey, filter->tid);
        return *out != nullptr;
    }
    if (flags & ORLO_ISCSI_TARGET_FILTER_TID_ARRAY) {
        try {
            std::vector<int64_t> keys;
            if (filter->tids != nullptr)
                for (int32_t i = 0; i < filter->tidCount; ++i) keys.push_back(filter->tids[i]);
            if (!orlo::olibc::CandidatesOf(file, TidKey, keys, picked)) return false;
        } catch (const std::bad_alloc &) {
            OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
            return false;
        }
        *out = picked;
    }
    return true;
}

uint32_t Load(const ORLOiSCSITargetFilter *filter, ORLOiSCSITargetList *list) {
    if (OLIBCFileExist(kConfPath) != 1) return ORLO_OK;  // no file: no targets
    std::shared_ptr<const SectionFile> file = orlo::olibc::PlainSectionFileLoad(kConfPath);
    if (file == nullptr) return LoadByName(filter, list);
    std::vector<uint32_t> picked;
    const std::vector<uint32_t> *candidates = nullptr;
    if (!Narrow(*file, filter, &picked, &candidates)) {
        ORLO_LOG_ERR("Failed to index %s, errno=0X%X", kConfPath, static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    return orlo::olibc::ForEachNamedSection(*file, candidates, [&](size_t i) -> uint32_t {
        const OLIBC_SZHASH *section = file->Hash(i);
        if (section == nullptr) {
            ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kConfPath, file->Name(i),
                         static_cast<const void *>(section), -1);
            return ORLO_ERR_GET_SECTION;
        }
        return Accept(filter, section, list);
    });
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
        ORLO_LOG_LOCK_FAILED(kLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = Load(filter, list);
    if (ret != ORLO_OK) ORLOiSCSITargetListFree(list);
    return ret;
}
