// Removes the clone-family entries made from snapshots: an entry "FAMILY_L<child lid>" of
// /usr/orlo/etc/iscsi_family_lun.conf whose "parent_lid" and "parent_sid" name a snapshot
// that goes away.  The file is read once and rewritten once, under its lock.  Entries of
// clones made from the LUN itself ("parent_sid" 0) are left alone.
#include <algorithm>
#include <new>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_internal.h"
#include "snapshot/snapshot_internal.h"

namespace orlo {
namespace snap {

namespace {

constexpr const char *kFamilyConfPath = "/usr/orlo/etc/iscsi_family_lun.conf";
constexpr const char *kFamilyLockPath = "/tmp/iscsi/iscsi_family_lun.conf.lock";
constexpr std::string_view kFamilyPrefix = "FAMILY_L";

struct Entry {
    std::string section;
    long lid = 0;
    long parentLid = -1;
    long parentSid = -1;
};

long ToLong(std::string_view v) { return strtol(std::string(v).c_str(), nullptr, 10); }

// The family entries of the file, in file order.  0, or -1 when it cannot be read (a
// missing file has none).
int ReadEntries(std::vector<Entry> *entries) {
    olibc::FileImage image;
    if (olibc::ReadImage(kFamilyConfPath, &image, false) != 0) return OLIBCErrGet() == OLIBC_ERR_NOT_FOUND ? 0 : -1;
    olibc::LineScanner scanner(image.data);
    olibc::Line line;
    bool inFamily = false;
    while (scanner.Next(&line)) {
        if (line.kind == olibc::LineKind::kHeader || line.kind == olibc::LineKind::kBadHeader) {
            inFamily = line.name.substr(0, kFamilyPrefix.size()) == kFamilyPrefix;
            if (inFamily) entries->push_back(Entry{std::string(line.name)});
            continue;
        }
        if (!inFamily) continue;
        scanner.Parse(&line);
        if (line.kind != olibc::LineKind::kKey) continue;
        if (line.key == "lid") entries->back().lid = ToLong(line.value);
        else if (line.key == "parent_lid") entries->back().parentLid = ToLong(line.value);
        else if (line.key == "parent_sid") entries->back().parentSid = ToLong(line.value);
    }
    return 0;
}

}  // namespace

void DropFamilyEntries(int32_t parentLid, const std::vector<int32_t> &parentSids) {
    std::vector<Entry> entries;
    std::vector<const Entry *> doomed;
    try {
        FileLockGuard lock(kFamilyLockPath, true, kConfLockTimeoutSec);
        if (!lock.held()) {
            ORLO_LOG_LOCK_FAILED(kFamilyLockPath);
            ORLO_LOG_ERR("Failed to load family config.");
            return;
        }
        if (ReadEntries(&entries) != 0) {
            ORLO_LOG_ERR("Failed to read %s [0x%04X %s:%d]", kFamilyConfPath, OLIBCErrGet(), OLIBCErrorGetFile(),
                         OLIBCErrorGetLine());
            ORLO_LOG_ERR("Failed to load family config.");
            return;
        }
        for (const Entry &e : entries) {
            if (e.parentLid != parentLid || e.parentSid < 1) continue;
            if (std::find(parentSids.begin(), parentSids.end(), e.parentSid) != parentSids.end()) doomed.push_back(&e);
        }
        if (doomed.empty()) return;
        SzListGuard list(OLIBCSzListAlloc(static_cast<int>(doomed.size())));
        bool listed = list.get() != nullptr;
        for (const Entry *e : doomed) listed = listed && OLIBCSzListPush(list.addr(), e->section.c_str()) >= 0;
        uint32_t ret = ORLO_ERR_OUT_OF_MEMORY;
        if (listed) ret = ORLOiSCSIRemoveSectionList(kFamilyConfPath, list.get());
        if (ret == ORLO_OK) return;
        ORLO_LOG_ERR("ORLOiSCSIRemoveSectionList(\"%s\", %p) failed, err=%s", kFamilyConfPath,
                     static_cast<void *>(list.get()), ORLOiSCSIErrStr(ret));
    } catch (const std::bad_alloc &) {
        ORLO_LOG_ERR("Failed to load family config.");
        return;
    }
    for (const Entry *e : doomed) ORLO_LOG_ERR("Failed to remove family config. lid: %ld", e->lid);
}

}  // namespace snap
}  // namespace orlo
