// Reads the LUN sections of one file (the global file or a volume's copy) into a list,
// in one pass: each section's keys are gathered into a scratch hash and, at the next
// header or at the end of the file, offered to the filter.
#include <cerrno>
#include <cstdlib>
#include <string_view>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace {

using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;

constexpr int kSectionHashSize = 128;

// Offers the gathered section: a rejected one is dropped, an accepted one becomes a list
// element.  *accepted tells which.
uint32_t Offer(const ORLOiSCSILunFilter *filter, const OLIBC_SZHASH *section, ORLOiSCSILunList *list,
               bool *accepted) {
    *accepted = false;
    orlo::olibc::SectionStatsAdd(1, 0);
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
    if (inSection) return Offer(filter, *hash, list, &accepted);
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfLoadByPath(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list,
                                                           const char *path) {
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
            ORLO_LOG_ERR("Failed to lock file: %s.", orlo::lun::kConfLockPath);
            ret = ORLO_ERR_LOCK_FILE;
        } else {
            orlo::FileGuard file(orlo::os::Fopen(path, "r"));
            if (file.get() == nullptr) {
                if (errno == ENOENT) return ORLO_OK;  // no file: no LUNs
                ORLO_LOG_ERR("fopen(\"%s\", \"%s\") failed, err=%m", path, "r");
                ret = ORLO_ERR_OPEN_FILE;
            } else {
                ret = ReadSections(file.get(), filter, list, hash.addr());
            }
        }
    }
    if (ret != ORLO_OK) ORLOiSCSILunListFree(list);
    return ret;
}
