// Reads the snapshot sections of one file (a LUN's snapshot file or a cache file) into a
// list: each section is judged by the filter and every kept one becomes a record.
//
// The file is read whole and walked line by line with the grammar of every section file
// (platform/olibc_file_internal.h).  Only the seventeen keys of a snapshot are gathered,
// into a fixed table rather than a hash: a full appliance's snapshots are 1024 files of up
// to 256 sections, and listing them all is a common request.
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_internal.h"
#include "snapshot/snapshot_internal.h"

namespace {

using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;

// The keys of a snapshot section, in the order they are written.
enum Key {
    kLid,
    kSid,
    kTotalSize,
    kMappedSize,
    kTime,
    kSnapshotTime,
    kIsAppConsistence,
    kLock,
    kName,
    kStatus,
    kNote,
    kRootpath,
    kTakenBy,
    kUuid,
    kVersion,
    kParentUuid,
    kType,
    kKeyCount
};

constexpr std::string_view kKeyNames[kKeyCount] = {
    "lid",  "sid",    "total_size", "mappedSize", "time",     "snapshot_time", "isAppConsistence", "lock",       "name",
    "status", "note", "rootpath",   "taken_by",   "uuid",     "version",       "parent_uuid",      "type"};

// What a filter needs of every section it judges.
constexpr Key kJudgedKeys[] = {kRootpath, kLid, kSid, kUuid, kName, kSnapshotTime};

// The key's slot, or -1 for a key that is not a snapshot's.  Most keys differ in their
// length or first character, so the comparison is made with few candidates.
int KeyIndex(std::string_view key) {
    for (int i = 0; i < kKeyCount; ++i)
        if (kKeyNames[i].size() == key.size() && kKeyNames[i][0] == key[0] && kKeyNames[i] == key) return i;
    return -1;
}

// One section's values (views into the file image; the last line of a key wins).
struct Section {
    std::string_view value[kKeyCount];
    uint32_t present = 0;
    bool Has(Key k) const { return (present >> k) & 1u; }
    void Clear() { present = 0; }
};

long long Number(std::string_view v, bool isUnsigned) {
    char buf[64];
    std::string big;
    const char *s = buf;
    if (v.size() < sizeof(buf)) {
        memcpy(buf, v.data(), v.size());
        buf[v.size()] = '\0';
    } else {
        big.assign(v);
        s = big.c_str();
    }
    if (isUnsigned) return static_cast<long long>(strtoull(s, nullptr, 10));
    return strtol(s, nullptr, 10);
}

bool IsYes(std::string_view v) { return v.size() == 3 && strncasecmp(v.data(), "yes", 3) == 0; }

void CopyText(char *dst, size_t size, std::string_view v) {
    size_t n = v.size() < size - 1 ? v.size() : size - 1;
    memcpy(dst, v.data(), n);
    dst[n] = '\0';
}

// 0 accepted, 18990430 rejected.
uint32_t Judge(const ORLOiSCSISnapshotFilter *filter, const Section &s) {
    const uint32_t flags = filter->flags;
    if (flags == 0) return ORLO_OK;
    for (Key k : kJudgedKeys) {
        if (!s.Has(k)) {
            ORLO_LOG_ERR("Failed to get some keys in snapshot config");
            return orlo::snap::kErrNotAccepted;
        }
    }
    int equalities = 0;
    auto textTest = [&](uint32_t bit, const char *operand, Key k) -> int {  // 1 pass, 0 fail, -1 not asked
        if (!(flags & bit)) return -1;
        if (operand == nullptr) {
            ORLO_LOG_BAD_PARAMS();
            return 0;
        }
        return s.value[k] == operand ? 1 : 0;
    };
    int r = textTest(ORLO_ISCSI_SNAPSHOT_FILTER_ROOT_PATH, filter->rootpath, kRootpath);
    if (r == 0) return orlo::snap::kErrNotAccepted;
    equalities += r > 0;
    if (flags & ORLO_ISCSI_SNAPSHOT_FILTER_LID) {
        if (Number(s.value[kLid], false) != filter->lid) return orlo::snap::kErrNotAccepted;
        ++equalities;
    }
    if (flags & ORLO_ISCSI_SNAPSHOT_FILTER_SID) {
        if (Number(s.value[kSid], false) != filter->sid) return orlo::snap::kErrNotAccepted;
        ++equalities;
    }
    r = textTest(ORLO_ISCSI_SNAPSHOT_FILTER_UUID, filter->uuid, kUuid);
    if (r == 0) return orlo::snap::kErrNotAccepted;
    equalities += r > 0;
    r = textTest(ORLO_ISCSI_SNAPSHOT_FILTER_NAME, filter->name, kName);
    if (r == 0) return orlo::snap::kErrNotAccepted;
    equalities += r > 0;
    if ((flags & ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE) && !(Number(s.value[kSnapshotTime], false) < filter->time))
        return orlo::snap::kErrNotAccepted;
    if (flags & ORLO_ISCSI_SNAPSHOT_FILTER_PARENT_UUID) {
        if (filter->parent_uuid == nullptr) {
            ORLO_LOG_BAD_PARAMS();
            return orlo::snap::kErrNotAccepted;
        }
        if (!s.Has(kParentUuid) || s.value[kParentUuid] != filter->parent_uuid) return orlo::snap::kErrNotAccepted;
    }
    // A filter that compares nothing (0x200 alone) keeps nothing.
    if (!(flags & (ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE | ORLO_ISCSI_SNAPSHOT_FILTER_PARENT_UUID)) && equalities == 0)
        return orlo::snap::kErrNotAccepted;
    return ORLO_OK;
}

// A record built from a kept section, or a failure (logged).
uint32_t Build(const Section &s, ORLOiSCSISnapshot **out) {
    uint32_t ret = ORLO_OK;
    int32_t type = 0;
    if (s.present != (1u << kKeyCount) - 1) {
        ORLO_LOG_ERR("Failed to get some keys in snapshot config");
        OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
        ret = orlo::snap::kErrGetHashValue;
    } else if (s.value[kType] == "ADV") {
        type = ORLO_ISCSI_SNAPSHOT_TYPE_ADV;
    } else if (s.value[kType] == "BLUN") {
        type = ORLO_ISCSI_SNAPSHOT_TYPE_BLUN;
    } else {
        std::string word(s.value[kType]);
        ORLO_LOG_ERR("Invalid snapshot type in snapshot config. type: %s", word.c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_FORMAT);
        ret = orlo::snap::kErrBadType;
    }
    ORLOiSCSISnapshot *snap = nullptr;
    if (ret == ORLO_OK) {
        snap = static_cast<ORLOiSCSISnapshot *>(calloc(1, sizeof(ORLOiSCSISnapshot)));
        if (snap == nullptr) {
            ORLO_LOG_ERR("calloc(%d, %zu) failed", 1, sizeof(ORLOiSCSISnapshot));
            OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
            ret = ORLO_ERR_OUT_OF_MEMORY;
        }
    }
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to create snapshot struct.");
        return ret;
    }
    snap->lid = static_cast<int32_t>(Number(s.value[kLid], false));
    snap->sid = static_cast<int32_t>(Number(s.value[kSid], false));
    snap->lock_fd = -1;
    snap->type = type;
    snap->total_size = static_cast<uint64_t>(Number(s.value[kTotalSize], true));
    snap->mappedSize = static_cast<uint64_t>(Number(s.value[kMappedSize], true));
    snap->time = static_cast<int32_t>(Number(s.value[kTime], false));
    snap->snapshot_time = static_cast<int32_t>(Number(s.value[kSnapshotTime], false));
    snap->isAppConsistence = IsYes(s.value[kIsAppConsistence]);
    snap->lock = IsYes(s.value[kLock]);
    CopyText(snap->name, sizeof(snap->name), s.value[kName]);
    CopyText(snap->status, sizeof(snap->status), s.value[kStatus]);
    CopyText(snap->note, sizeof(snap->note), s.value[kNote]);
    CopyText(snap->rootpath, sizeof(snap->rootpath), s.value[kRootpath]);
    CopyText(snap->taken_by, sizeof(snap->taken_by), s.value[kTakenBy]);
    CopyText(snap->uuid, sizeof(snap->uuid), s.value[kUuid]);
    CopyText(snap->version, sizeof(snap->version), s.value[kVersion]);
    CopyText(snap->parent_uuid, sizeof(snap->parent_uuid), s.value[kParentUuid]);
    *out = snap;
    return ORLO_OK;
}

// Judges a gathered section and keeps it: 0 (kept or not, *kept tells) or a failure.
uint32_t Offer(const ORLOiSCSISnapshotFilter *filter, const Section &s, ORLOiSCSISnapshotList *list, bool *kept) {
    *kept = false;
    if (Judge(filter, s) != ORLO_OK) return ORLO_OK;  // not accepted: swallowed
    ORLOiSCSISnapshot *snap = nullptr;
    uint32_t ret = Build(s, &snap);
    if (ret != ORLO_OK) return ret;
    ORLOiSCSIListAppend(list, &snap->link);
    *kept = true;
    return ORLO_OK;
}

uint32_t ReadSections(const std::string &data, const ORLOiSCSISnapshotFilter *filter, ORLOiSCSISnapshotList *list) {
    const bool firstOnly = (filter->flags & ORLO_ISCSI_SNAPSHOT_FILTER_FIRST_ONLY) != 0;
    LineScanner scanner(data);
    Line line;
    Section section;
    bool inSection = false;
    bool kept = false;
    while (scanner.Next(&line)) {
        if (line.kind == LineKind::kHeader || line.kind == LineKind::kBadHeader) {
            if (inSection) {
                uint32_t ret = Offer(filter, section, list, &kept);
                if (ret != ORLO_OK || (kept && firstOnly)) return ret;
            }
            section.Clear();
            inSection = true;
            continue;
        }
        if (!inSection) continue;  // lines before the first header belong to no snapshot
        scanner.Parse(&line);
        if (line.kind != LineKind::kKey) continue;
        int k = KeyIndex(line.key);
        if (k < 0) continue;
        section.value[k] = line.value;
        section.present |= 1u << k;
    }
    if (!inSection) return ORLO_OK;
    return Offer(filter, section, list, &kept);
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoadWithPath(const ORLOiSCSISnapshotFilter *filter,
                                                                  ORLOiSCSISnapshotList *list, const char *path) {
    if (filter == nullptr || list == nullptr || path == nullptr || path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    orlo::olibc::FileImage image;
    try {
        if (orlo::olibc::ReadImage(path, &image, false) != 0) {
            if (OLIBCErrGet() == OLIBC_ERR_NOT_FOUND) return ORLO_OK;  // no file: no snapshots
            ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", path, "r");
            ORLOiSCSISnapshotListFree(list);
            return ORLO_ERR_OPEN_FILE;
        }
    } catch (const std::exception &) {
        ORLO_LOG_ERR("Failed to allocate memory for %s", path);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        ORLOiSCSISnapshotListFree(list);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    uint32_t ret = ReadSections(image.data, filter, list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to apply filter[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
        ORLOiSCSISnapshotListFree(list);
    }
    return ret;
}
