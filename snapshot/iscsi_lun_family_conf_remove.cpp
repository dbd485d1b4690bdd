// Removes a LUN's clone relations from the family file, on either side: its own entry
// "FAMILY_L<lid>" (the LUN as a clone) and every entry whose "parent_lid" is the LUN.  A
// LUN that is gone is nobody's parent, and as lids are reused, an entry left behind would
// make the next LUN given this lid look like a parent with clones.  The file is read in
// one pass and rewritten once.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_snapshot.h"
#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace {

using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;

constexpr const char *kFamilyConfPath = "/usr/orlo/etc/iscsi_family_lun.conf";
constexpr const char *kFamilyLockPath = "/tmp/iscsi/iscsi_family_lun.conf.lock";
constexpr int kLockTimeoutSec = 60;

// Lists into doomed the family sections in which lid takes part.
uint32_t CollectRelations(FILE *file, int32_t lid, POLIBC_SZLIST *doomed) {
    char own[32];
    snprintf(own, sizeof(own), "FAMILY_L%d", lid);
    char *buf = nullptr;
    size_t cap = 0;
    auto freeBuf = orlo::MakeScopeExit([&buf]() { free(buf); });
    std::string section;
    bool listed = false;
    ssize_t n;
    while ((n = getline(&buf, &cap, file)) >= 0) {
        LineScanner scanner(std::string_view(buf, static_cast<size_t>(n)));
        Line line;
        if (!scanner.Next(&line)) continue;
        if (line.kind == LineKind::kHeader || line.kind == LineKind::kBadHeader) {
            section.assign(line.name);
            listed = false;
            if (section != own) continue;
        } else {
            if (section.empty() || listed || section.compare(0, 8, "FAMILY_L") != 0) continue;
            scanner.Parse(&line);
            if (line.kind != LineKind::kKey || line.key != "parent_lid") continue;
            std::string value(line.value);
            if (strtol(value.c_str(), nullptr, 10) != lid) continue;
        }
        if (OLIBCSzListPush(doomed, section.c_str()) < 0) {
            ORLO_LOG_PLATFORM("OLIBCSzListPush(%p, \"%s\")", static_cast<void *>(doomed), section.c_str());
            return ORLO_ERR_OUT_OF_MEMORY;
        }
        listed = true;
    }
    if (ferror(file)) {
        ORLO_LOG_ERR("getline(%p, %p, %p) failed, err=%m", static_cast<void *>(&buf), static_cast<void *>(&cap),
                     static_cast<void *>(file));
        return ORLO_ERR_READ_FILE;
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunFamilyConfRemove(int32_t lid) {
    if (lid < 1 || lid > 1024) {
        ORLO_LOG_ERR("Bad parameters, lid[%d] is In-Valid[%d]", lid, lid);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::FileLockGuard lock(kFamilyLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kFamilyLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    orlo::SzListGuard doomed(OLIBCSzListAlloc(16));
    if (doomed.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzListAlloc(%d) failed", 16);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    {
        orlo::FileGuard file(orlo::os::Fopen(kFamilyConfPath, "r"));
        if (file.get() == nullptr) {
            if (errno == ENOENT) return ORLO_OK;  // no clones anywhere
            ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", kFamilyConfPath, "r");
            return ORLO_ERR_OPEN_FILE;
        }
        uint32_t ret = CollectRelations(file.get(), lid, doomed.addr());
        if (ret != ORLO_OK) return ret;
    }
    if (OLIBCSzListCount(doomed.get()) == 0) return ORLO_OK;
    uint32_t ret = ORLOiSCSIRemoveSectionList(kFamilyConfPath, doomed.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIRemoveSectionList(\"%s\", %p) failed, err=%s", kFamilyConfPath,
                     static_cast<void *>(doomed.get()), ORLOiSCSIErrStr(ret));
        return ORLO_ERR_REMOVE_SECTION;
    }
    return ORLO_OK;
}
