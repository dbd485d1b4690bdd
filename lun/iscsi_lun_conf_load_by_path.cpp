// Reads the LUN sections of one file (the global file or a volume's copy) into a list:
// every section header of the file in order, duplicates included, each section's keys
// offered to the filter.
//
// The sections come from this thread's parse of the file (platform/olibc_file_cache.h).
// A query by lid looks only at the sections of that lid; the configuration snapshot may
// also ask for the LUNs of a set of lids only (the LUNs its mappings name), which is
// granted when leaving the other sections out cannot change the outcome.  A file the
// parse cannot serve is read line by line, which reports the failure as it always has.
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string_view>
#include <vector>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "platform/olibc_file_cache.h"
#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace {

using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;
using orlo::olibc::SectionFile;

constexpr int kSectionHashSize = 128;

// Offers the gathered section: a rejected one is dropped, an accepted one becomes a list
// element.  *accepted tells which.
uint32_t Offer(const ORLOiSCSILunFilter *filter, const OLIBC_SZHASH *section, ORLOiSCSILunList *list,
               bool *accepted) {
    *accepted = false;
    uint32_t ret = ORLOiSCSILunFilterApply(filter, section);
    if (ret == orlo::lun::kErrNotAccepted) return ORLO_OK;
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to apply filter[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
        return ret;
    }
    auto *elem = static_cast<ORLOiSCSILunElem *>(calloc(1, sizeof(ORLOiSCSILunElem)));
    if (elem == nullptr) {
        ORLO_LOG_ERR("calloc(%d, %zu) failed", 1, sizeof(ORLOiSCSILunElem));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    ret = ORLOiSCSILunStructCreate(&elem->lun, section);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to create LUN struct.");
        free(elem);
        return ret;
    }
    ORLOiSCSIListAppend(list, &elem->link);
    *accepted = true;
    return ORLO_OK;
}

// Reads the open file to its end (or to the first accepted LUN with FIRST_ONLY).
uint32_t ReadSections(FILE *file, const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list, POLIBC_SZHASH *hash) {
    const bool firstOnly = (filter->flags & ORLO_ISCSI_LUN_FILTER_FIRST_ONLY) != 0;
    char *buf = nullptr;
    size_t cap = 0;
    auto freeBuf = orlo::MakeScopeExit([&buf]() { free(buf); });
    bool inSection = false;
    bool accepted = false;
    ssize_t n;
    while ((n = getline(&buf, &cap, file)) >= 0) {
        LineScanner scanner(std::string_view(buf, static_cast<size_t>(n)));
        Line line;
        if (!scanner.Next(&line)) continue;
        if (line.kind == LineKind::kHeader || line.kind == LineKind::kBadHeader) {
            if (inSection) {
                orlo::olibc::SectionStatsAdd(1, 0);
                uint32_t ret = Offer(filter, *hash, list, &accepted);
                if (ret != ORLO_OK) return ret;
                if (accepted && firstOnly) return ORLO_OK;
            }
            OLIBCSzHashRemoveAll(*hash);
            inSection = true;
            continue;
        }
        if (!inSection) continue;  // lines before the first header belong to no LUN
        scanner.Parse(&line);
        if (line.kind != LineKind::kKey) continue;
        // Key and value are views into buf: end each with a NUL in place.  The key ends at
        // a blank or the "=", the value at the line's end or its closing quote.
        char *key = buf + (line.key.data() - buf);
        char *value = buf + (line.value.data() - buf);
        key[line.key.size()] = '\0';
        value[line.value.size()] = '\0';
        if (OLIBCSzHashSetValue(hash, key, value) != 0) {
            ORLO_LOG_ERR("Failed to set value into hash[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                         OLIBCErrorGetLine());
            return orlo::lun::kErrSetHashValue;
        }
    }
    if (ferror(file)) {
        ORLO_LOG_ERR("getline(%p, %p, %p) failed, err=%m", static_cast<void *>(&buf), static_cast<void *>(&cap),
                     static_cast<void *>(file));
        return ORLO_ERR_READ_FILE;
    }
    if (inSection) {
        orlo::olibc::SectionStatsAdd(1, 0);
        return Offer(filter, *hash, list, &accepted);
    }
    return ORLO_OK;
}

// The file read line by line (the caller holds the LUN files' lock).
uint32_t ReadFile(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list, const char *path, POLIBC_SZHASH *hash) {
    orlo::FileGuard file(orlo::os::Fopen(path, "r"));
    if (file.get() == nullptr) {
        if (errno == ENOENT) return ORLO_OK;  // no file: no LUNs
        ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", path, "r");
        return ORLO_ERR_OPEN_FILE;
    }
    return ReadSections(file.get(), filter, list, hash);
}

// The section's lid as a LUN record holds it.
bool LidKey(const SectionFile &file, size_t i, int64_t *key) {
    const char *v = file.ValueOf(i, "lid");
    if (v == nullptr) return false;
    *key = static_cast<int32_t>(strtol(v, nullptr, 10));
    return true;
}

// Whether the filter reports a missing operand ("Bad parameters") for every section it
// is offered: then every section must be offered, for the log to say so as often.
bool ReportsEachSection(const ORLOiSCSILunFilter *filter) {
    const uint32_t flags = filter->flags;
    if (flags == ORLO_ISCSI_LUN_FILTER_ALL || flags == ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP) return false;
    return ((flags & ORLO_ISCSI_LUN_FILTER_ROOT_PATH) && filter->rootPath == nullptr) ||
           ((flags & ORLO_ISCSI_LUN_FILTER_NAME) && filter->name == nullptr) ||
           ((flags & ORLO_ISCSI_LUN_FILTER_UUID) && filter->uuid == nullptr);
}

bool StartsWith(const char *s, const char *prefix) { return strncmp(s, prefix, strlen(prefix)) == 0; }

// Every section of the file becomes a LUN record without a failure or a warning: it has
// the keys ORLOiSCSILunStructCreate requires or warns about, and a type it can tell.
// Only then may sections that would be dropped anyway go unread: reading them could
// not fail the load nor add to the log.
bool BuildsQuietly(const SectionFile &file) {
    static const char *const kKeys[] = {"lid", "name", "rootpath", "bytes", "pre_alloc", "uuid", "vpd_unit_serial"};
    for (size_t i = 0; i < file.Count(); ++i) {
        for (const char *key : kKeys)
            if (file.ValueOf(i, key) == nullptr) return false;
        const char *devtype = file.ValueOf(i, "devtype");
        const long d = devtype != nullptr ? strtol(devtype, nullptr, 10) : 0;
        if (d == 1 || orlo::lun::TypeOfDevtype(d) != 0) continue;
        const char *rootPath = file.ValueOf(i, "rootpath");
        if (rootPath[0] != '\0' && !StartsWith(rootPath, "/dev") && !StartsWith(rootPath, "/volume")) return false;
    }
    return true;
}

// The sections to offer (all of them: nullptr in *out).  onlyLids, when given, limits
// them to the LUNs of those lids if that cannot change what the caller keeps.
bool Narrow(const SectionFile &file, const ORLOiSCSILunFilter *filter, const std::vector<int32_t> *onlyLids,
            std::vector<uint32_t> *picked, const std::vector<uint32_t> **out) {
    *out = nullptr;
    const uint32_t flags = filter->flags;
    if (ReportsEachSection(filter)) return true;
    try {
        std::vector<int64_t> keys;
        if (onlyLids != nullptr && !(flags & ORLO_ISCSI_LUN_FILTER_FIRST_ONLY) && file.Holds(BuildsQuietly)) {
            keys.assign(onlyLids->begin(), onlyLids->end());
        } else if (flags == ORLO_ISCSI_LUN_FILTER_ALL || flags == ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP) {
            return true;
        } else if (flags & ORLO_ISCSI_LUN_FILTER_LID) {
            *out = file.Candidates(LidKey, filter->lid);
            return *out != nullptr;
        } else if ((flags & ORLO_ISCSI_LUN_FILTER_LID_ARRAY) && filter->lids != nullptr && filter->lidCount > 0) {
            for (int32_t i = 0; i < filter->lidCount; ++i) keys.push_back(filter->lids[i]);
        } else {
            return true;
        }
        if (!orlo::olibc::CandidatesOf(file, LidKey, keys, picked)) return false;
    } catch (const std::bad_alloc &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return false;
    }
    *out = picked;
    return true;
}

uint32_t ReadParsed(const SectionFile &file, const ORLOiSCSILunFilter *filter, const std::vector<int32_t> *onlyLids,
                    ORLOiSCSILunList *list) {
    std::vector<uint32_t> picked;
    const std::vector<uint32_t> *candidates = nullptr;
    if (!Narrow(file, filter, onlyLids, &picked, &candidates)) {
        ORLO_LOG_ERR("Failed to allocate hash, errno=0X%X", static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    const bool firstOnly = (filter->flags & ORLO_ISCSI_LUN_FILTER_FIRST_ONLY) != 0;
    const size_t n = candidates != nullptr ? candidates->size() : file.Count();
    for (size_t k = 0; k < n; ++k) {
        const size_t i = candidates != nullptr ? (*candidates)[k] : k;
        const OLIBC_SZHASH *section = file.Hash(i);
        if (section == nullptr) {
            ORLO_LOG_ERR("Failed to set value into hash[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                         OLIBCErrorGetLine());
            return orlo::lun::kErrSetHashValue;
        }
        bool accepted = false;
        uint32_t ret = Offer(filter, section, list, &accepted);
        if (ret != ORLO_OK) return ret;
        if (accepted && firstOnly) return ORLO_OK;
    }
    return ORLO_OK;
}

uint32_t LoadByPath(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list, const char *path,
                    const std::vector<int32_t> *onlyLids) {
    if (filter == nullptr || list == nullptr || path == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);

    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kSectionHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("Failed to allocate hash, errno=0X%X", static_cast<unsigned>(errno));
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }

    uint32_t ret = ORLO_OK;
    {
        orlo::FileLockGuard lock(orlo::lun::kConfLockPath, false, orlo::lun::kConfLockTimeoutSec);
        if (!lock.held()) {
            ORLO_LOG_LOCK_FAILED(orlo::lun::kConfLockPath);
            ret = ORLO_ERR_LOCK_FILE;
        } else {
            const orlo::olibc::ErrState before = orlo::olibc::ErrState::Save();
            std::shared_ptr<const SectionFile> file = orlo::olibc::SectionFileLoad(path);
            if (file == nullptr) {
                before.Restore();
                ret = ReadFile(filter, list, path, hash.addr());
            } else {
                ret = ReadParsed(*file, filter, onlyLids, list);
            }
        }
    }
    if (ret != ORLO_OK) ORLOiSCSILunListFree(list);
    return ret;
}

}  // namespace

namespace orlo {
namespace conf {

uint32_t LunConfLoadOfLids(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list, const std::vector<int32_t> &lids) {
    return LoadByPath(filter, list, orlo::lun::kGlobalConfPath, &lids);
}

}  // namespace conf
}  // namespace orlo

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfLoadByPath(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list,
                                                           const char *path) {
    return LoadByPath(filter, list, path, nullptr);
}
