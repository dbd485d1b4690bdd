// Gives each initiator of a target's access list the target's CHAP credentials: the
// "auth" directory of every node access list gets userid and password (kind 1), and
// for mutual CHAP (kind 2) also userid_mutual and password_mutual.  The default entry
// has a node access list only under the older target core; elsewhere it is passed over.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/lio_acl_util.h"

namespace {

namespace acl = orlo::target::acl;

// Writes one attribute of an initiator's "auth" directory.  Secrets are never logged.
uint32_t WriteAuth(const ORLOiSCSITarget *target, const char *initiator, const char *file, const char *value,
                   bool secret) {
    char path[acl::kPathSize];
    uint32_t ret = acl::FormatPath(path, acl::kAclAuthFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, initiator, file);
    if (ret != ORLO_OK) return ret;
    if ((ret = ORLOiSCSIConfigfsWrite(path, value)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, secret ? "********" : value,
                     ORLOiSCSIErrStr(ret));
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}

uint32_t InitiatorChapAdd(const ORLOiSCSITarget *target, const char *initiator, int kind) {
    uint32_t ret;
    if ((ret = WriteAuth(target, initiator, "userid", target->user, false)) != ORLO_OK ||
        (ret = WriteAuth(target, initiator, "password", target->password, true)) != ORLO_OK)
        return ret;
    if (kind != ORLO_ISCSI_AUTH_MUTUAL_CHAP) return ORLO_OK;
    if ((ret = WriteAuth(target, initiator, "userid_mutual", target->mutual_user, false)) != ORLO_OK ||
        (ret = WriteAuth(target, initiator, "password_mutual", target->mutual_password, true)) != ORLO_OK)
        return ret;
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetMaskingsChapAuthAdd(const ORLOiSCSITarget *target, int kind) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSIAclList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetAclListFree(&list); });
    uint32_t ret = ORLOiSCSITargetConfAclLoad(target->tid, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfAclLoad(%d, %p) failed, err=%s", target->tid, static_cast<void *>(&list),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSIAcl *entry;
    ORLO_ISCSI_ACL_LIST_FOREACH(&list, link, entry) {
        if (acl::IsDefaultInitiator(entry->initiator) && !acl::DefaultEntryIsNodeAcl()) continue;
        if (kind != ORLO_ISCSI_AUTH_CHAP && kind != ORLO_ISCSI_AUTH_MUTUAL_CHAP) {
            ORLO_LOG_ERR("Invalid CHAP type %d for iSCSI Initaitor %s", kind, entry->initiator);
            return ORLO_ERR_BAD_PARAMETER;
        }
        if ((ret = InitiatorChapAdd(target, entry->initiator, kind)) != ORLO_OK) return ret;
    }
    return ORLO_OK;
}
