// Loads one target's access list in file order under the access-list file's shared lock.
// A failure leaves the list empty.
//
// The sections come from this thread's parse of the file (platform/olibc_file_cache.h),
// indexed by the tid their names carry: a load looks only at the target's own sections
// and at the names that do not scan (each is reported, in file order, as a full walk
// reports it).  A file the parse cannot serve is read section by section by name, which
// reports the failure as it always has.
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_cache.h"
#include "target/target_internal.h"

namespace {

using namespace orlo::target;
using orlo::olibc::SectionFile;

// The index key of names that do not scan as an access-list section.
constexpr int64_t kUnscanned = INT64_MIN;

bool AclTidKey(const SectionFile &file, size_t i, int64_t *key) {
    int32_t tid = 0;
    const char *initiator = nullptr;
    *key = ScanAclSection(file.Name(i), &tid, &initiator) ? tid : kUnscanned;
    return true;
}

// Builds and appends the entry of one section whose name scanned as tid and initiator.
uint32_t Append(const char *section, const OLIBC_SZHASH *hash, int32_t tid, const char *initiator,
                ORLOiSCSIAclList *list) {
    ORLOiSCSIAcl *acl = nullptr;
    uint32_t ret = ORLOiSCSITargetAclStructCreate(hash, &acl);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetAclStructCreate(%p, %p) failed, err=%s", static_cast<const void *>(hash),
                     static_cast<void *>(&acl), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (strlen(initiator) >= sizeof(acl->initiator)) {
        ORLO_LOG_ERR("Initiator of section %.40s... longer than %zu characters", section, sizeof(acl->initiator) - 1);
        free(acl);
        return ORLO_ERR_PARSE_STRING;
    }
    acl->tid = tid;
    strcpy(acl->initiator, initiator);
    ORLOiSCSIListAppend(list, &acl->link);
    return ORLO_OK;
}

// Whether section names an entry of tid; a name that does not scan is reported.
bool IsEntryOf(const char *section, int32_t tid, int32_t *sectionTid, const char **initiator) {
    if (!ScanAclSection(section, sectionTid, initiator)) {
        errno = EINVAL;
        ORLO_LOG_ERR("sscanf(\"%s\", \"%s\", %p, %p) failed, err=%m", section, kAclSectionFmt,
                     static_cast<void *>(sectionTid), static_cast<const void *>(initiator));
        return false;
    }
    return *sectionTid == tid;
}

// Every section, enumerated and then read by name.
uint32_t LoadByName(int32_t tid, ORLOiSCSIAclList *list) {
    POLIBC_SZLIST names = nullptr;
    int count = ORLOiSCSIConfSectionEnum(kAclConfPath, &names);
    orlo::SzListGuard namesGuard(names);
    if (count < 0) {
        ORLO_LOG_ERR("ORLOiSCSIConfSectionEnum(\"%s\", %p) failed", kAclConfPath, static_cast<void *>(&names));
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
        int32_t sectionTid = 0;
        const char *initiator = nullptr;
        if (!IsEntryOf(section, tid, &sectionTid, &initiator)) continue;
        OLIBCSzHashRemoveAll(hash.get());
        int got = OLIBCFileGetSection(kAclConfPath, section, hash.addr());
        if (got < 1) {
            ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kAclConfPath, section,
                         static_cast<void *>(hash.addr()), got);
            return ORLO_ERR_GET_SECTION;
        }
        uint32_t ret = Append(section, hash.get(), sectionTid, initiator, list);
        if (ret != ORLO_OK) return ret;
    }
    return ORLO_OK;
}

uint32_t LoadEntries(int32_t tid, ORLOiSCSIAclList *list) {
    if (OLIBCFileExist(kAclConfPath) != 1) return ORLO_OK;  // no file: no entries
    std::shared_ptr<const SectionFile> file = orlo::olibc::PlainSectionFileLoad(kAclConfPath);
    if (file == nullptr) return LoadByName(tid, list);
    std::vector<uint32_t> candidates;
    bool indexed = false;
    try {
        indexed = orlo::olibc::CandidatesOf(*file, AclTidKey, {static_cast<int64_t>(tid), kUnscanned}, &candidates);
    } catch (const std::bad_alloc &) {
        indexed = false;
    }
    if (!indexed) {
        ORLO_LOG_ERR("OLIBCSzHashAlloc(%d) failed", kHashSize);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    return orlo::olibc::ForEachNamedSection(*file, &candidates, [&](size_t i) -> uint32_t {
        const char *section = file->Name(i);
        int32_t sectionTid = 0;
        const char *initiator = nullptr;
        if (!IsEntryOf(section, tid, &sectionTid, &initiator)) return ORLO_OK;
        const OLIBC_SZHASH *hash = file->Hash(i);
        if (hash == nullptr) {
            ORLO_LOG_ERR("OLIBCFileGetSection(\"%s\", \"%s\", %p) failed, ret=%d", kAclConfPath, section,
                         static_cast<const void *>(hash), -1);
            return ORLO_ERR_GET_SECTION;
        }
        return Append(section, hash, sectionTid, initiator, list);
    });
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclLoad(int32_t tid, ORLOiSCSIAclList *list) {
    if (list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    orlo::FileLockGuard lock(kAclLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kAclLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    uint32_t ret = LoadEntries(tid, list);
    if (ret != ORLO_OK) ORLOiSCSITargetAclListFree(list);
    return ret;
}
