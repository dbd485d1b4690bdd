// The kernel side of one mapping: the LUN's backstore is loaded, the portal group gets
// lun/lun_<n> linked to it, and every access-list initiator gets its LUN entry with its
// write protection.  What this call made is taken away again when a later step fails,
// so a failed add leaves the portal group as it found it.
#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"
#include "target/lio_target_util.h"

namespace {

namespace acl = orlo::target::acl;
namespace lio = orlo::target::lio;

constexpr const char kDeferQueueModeKey[] = "iscsi_defer_queue_mode";
constexpr const char kDeferQueueModeDefault[] = "multi";
constexpr size_t kDeferQueueModeSize = 1024;

// Whether the default entry is passed over: the demo mode stands for it, except under
// the older target core.
bool SkipEntry(const ORLOiSCSIAcl *entry) {
    return acl::IsDefaultInitiator(entry->initiator) && !acl::DefaultEntryIsNodeAcl();
}

// Every initiator's LUN entry, with its write protection.
uint32_t InitiatorsAdd(const ORLOiSCSITarget *target, int n, const ORLOiSCSIAclList *acls) {
    ORLOiSCSIListLink *link;
    ORLOiSCSIAcl *entry;
    ORLO_ISCSI_ACL_LIST_FOREACH(acls, link, entry) {
        if (SkipEntry(entry)) continue;
        uint32_t ret = ORLOiSCSILioTargetLunAclInitiatorAdd(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER,
                                                            entry->initiator, n);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetLunAclInitiatorAdd(\"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, \"%s\", %d) "
                         "failed, err=%s",
                         target->iqn, entry->initiator, n, ORLOiSCSIErrStr(ret));
            return ret;
        }
        if ((ret = ORLOiSCSILioTargetLunInitiatorRw(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, entry, n)) !=
            ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetLunInitiatorRw(\"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, %p, %d) failed, "
                         "err=%s",
                         target->iqn, static_cast<void *>(entry), n, ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    return ORLO_OK;
}

// Takes the LUN entry of every initiator of the list away again; failures only logged.
void InitiatorsRemove(const ORLOiSCSITarget *target, int n, const ORLOiSCSIAclList *acls) {
    ORLOiSCSIListLink *link;
    ORLOiSCSIAcl *entry;
    ORLO_ISCSI_ACL_LIST_FOREACH(acls, link, entry) {
        if (SkipEntry(entry)) continue;
        uint32_t ret = ORLOiSCSILioTargetLunAclInitiatorRemove(target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER,
                                                               entry->initiator, n);
        if (ret != ORLO_OK)
            ORLO_LOG_ERR("ORLOiSCSILioTargetLunAclInitiatorRemove(\"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, \"%s\", "
                         "%d) failed, err=%s",
                         target->iqn, entry->initiator, n, ORLOiSCSIErrStr(ret));
    }
}

uint32_t DeferQueueModeSet(const ORLOiSCSILun *lun) {
    char mode[kDeferQueueModeSize];
    if (lio::OrloInfoGet(kDeferQueueModeKey, mode, sizeof(mode)) < 0)
        snprintf(mode, sizeof(mode), "%s", kDeferQueueModeDefault);
    uint32_t ret = ORLOiSCSILunConfigfsAttribSet(lun, "defer_queue_mode", mode);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsAttribSet(%p, \"%s\", \"%s\") failed, err=%s", static_cast<const void *>(lun),
                     "defer_queue_mode", mode, ORLOiSCSIErrStr(ret));
    return ret;
}

// The last path component.
const char *BaseName(const char *path) {
    const char *slash = strrchr(path, '/');
    return slash == nullptr ? path : slash + 1;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioMappingAdd(const ORLOiSCSITarget *target, const ORLOiSCSILun *lun,
                                                       int32_t n, const ORLOiSCSIAclList *acls) {
    // 1. Arguments.
    if (target == nullptr || lun == nullptr || acls == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = lio::CheckIqn(target->iqn);
    if (ret != ORLO_OK) return ret;
    if (n < 0 || n > ORLO_ISCSI_MAPPING_LUN_MAX) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char lunDir[lio::kPathSize];
    if ((ret = lio::FormatPath(lunDir, acl::kTpgLunFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, n)) != ORLO_OK)
        return ret;

    // 2. The backstore.
    if ((ret = ORLOiSCSILunLoad(lun)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunLoad(%p) failed, err=%s", static_cast<const void *>(lun), ORLOiSCSIErrStr(ret));
        return ret;
    }

    // 3. The portal group's LUN entry.
    bool madeDir = true;
    if (orlo::os::Mkdir(lunDir, S_IRWXU) != 0) {
        if (errno != EEXIST) {
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", lunDir);
            return ORLO_ERR_MKDIR;
        }
        madeDir = false;
    }
    char link[lio::kPathSize] = "";
    bool madeLink = false;
    // 8. From here on a failure takes the entry made here away again.
    auto undo = orlo::MakeScopeExit([&]() {
        if (madeLink && orlo::os::Unlink(link) != 0 && errno != ENOENT) {
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", link);
        }
        if (madeDir && orlo::os::Rmdir(lunDir) != 0 && errno != ENOENT) {
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", lunDir);
        }
    });

    // 4. The queueing mode of LUNs whose data is a file on a volume.
    if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type) && (ret = DeferQueueModeSet(lun)) != ORLO_OK) return ret;

    // 5. The link to the backstore, named after it.
    char backstore[lio::kPathSize];
    if ((ret = ORLOiSCSILunConfigfsDirPath(lun, backstore, sizeof(backstore))) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(backstore), sizeof(backstore), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = lio::FormatPath(link, "/config/target/iscsi/%s/tpgt_%d/lun/lun_%d/%s", target->iqn,
                               ISCSI_TARGET_DEFAULT_TPGT_NUMBER, n, BaseName(backstore))) != ORLO_OK)
        return ret;
    struct stat st;
    bool linkedBefore = orlo::os::Lstat(link, &st) == 0;
    if ((ret = ORLOiSCSIConfigfsSymlink(backstore, link)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsSymlink(\"%s\", \"%s\") failed, err=%s", backstore, link, ORLOiSCSIErrStr(ret));
        return ret;
    }
    madeLink = !linkedBefore;

    // 6, 7. The initiators' entries: all or none.
    if ((ret = InitiatorsAdd(target, n, acls)) != ORLO_OK) {
        InitiatorsRemove(target, n, acls);
        ORLO_LOG_ERR("ORLOiSCSILioTargetLunACLInitiatorsAdd(\"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, %d, %p) failed, "
                     "err=%s",
                     target->iqn, n, static_cast<const void *>(acls), ORLOiSCSIErrStr(ret));
        return ret;
    }
    undo.Dismiss();
    return ORLO_OK;
}
