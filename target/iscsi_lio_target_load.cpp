// Builds a target node in the kernel's iSCSI fabric from its record, top to bottom:
// the node and its portal group, the default entry and the node access lists, the
// command window, the portals, CHAP, digests and segment lengths, the session limit and
// the alias.  The portal group is left as the kernel made it (off): switching it on is
// ORLOiSCSILioTargetEnable's last step.
//
// A failure takes the half-built node out again (ORLOiSCSITargetUnload), except in the
// self-test, which clears up its trial node by itself.
#include <sys/stat.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"
#include "target/lio_target_util.h"

namespace {

namespace lio = orlo::target::lio;

constexpr int kMaxSessions = 65535;       // the kernel's most; also what 0 stands for
constexpr const char kTargetAlias[] = "Orlo Target";

// The values a record must hold before anything reaches the kernel: the node's name is
// a directory name, the numbers are ones the kernel takes, the strings are terminated.
uint32_t CheckRecord(const ORLOiSCSITarget *t) {
    if (memchr(t->iqn, '\0', sizeof(t->iqn)) == nullptr || !ORLOiSCSIIsValidIscsiName(t->iqn)) {
        ORLO_LOG_ERR("Bad target iqn of tid %d", t->tid);
        return lio::kErrBadIqn;
    }
    if (t->max_recv_seg_bytes < ORLO_ISCSI_SEG_BYTES_MIN || t->max_recv_seg_bytes > ORLO_ISCSI_SEG_BYTES_MAX) {
        ORLO_LOG_ERR("Bad target max_recv_seg_bytes of tid %d: %d", t->tid, t->max_recv_seg_bytes);
        return lio::kErrBadRecvSeg;
    }
    if (t->max_send_seg_bytes < ORLO_ISCSI_SEG_BYTES_MIN || t->max_send_seg_bytes > ORLO_ISCSI_SEG_BYTES_MAX) {
        ORLO_LOG_ERR("Bad target max_send_seg_bytes of tid %d: %d", t->tid, t->max_send_seg_bytes);
        return lio::kErrBadSendSeg;
    }
    if (t->max_sessions < 0) {
        ORLO_LOG_ERR("Bad target max_sessions of tid %d: %d", t->tid, t->max_sessions);
        return lio::kErrBadMaxSessions;
    }
    const char *const strings[] = {t->user, t->password, t->mutual_user, t->mutual_password};
    for (const char *s : strings) {
        if (memchr(s, '\0', ORLO_ISCSI_TARGET_CHAP_SIZE) == nullptr) {
            ORLO_LOG_ERR("Bad target CHAP settings of tid %d: not terminated", t->tid);
            return ORLO_ERR_BAD_PARAMETER;
        }
    }
    return ORLO_OK;
}

// The stored authority of the default entry; 0 when the target has none.
uint32_t TargetGetDefaultAcl(const ORLOiSCSITarget *target, int32_t *permission) {
    *permission = ISCSI_TARGET_AUTHORITY_NONE;
    std::vector<ORLOiSCSIAcl> entries;
    uint32_t ret = ORLOiSCSITargetMaskingGet(target->tid, entries);
    if (ret != ORLO_OK) return ret;
    for (const ORLOiSCSIAcl &e : entries) {
        if (orlo::target::acl::IsDefaultInitiator(e.initiator)) {
            *permission = e.authority;
            break;
        }
    }
    return ORLO_OK;
}

uint32_t DefaultCmdsnDepthLoad(const ORLOiSCSITarget *target) {
    return lio::TpgPutInteger(target->iqn, "attrib/default_cmdsn_depth", lio::CmdsnDepth());
}

// The portal group's authentication switch, written only when it differs.
uint32_t AuthenticationSet(const ORLOiSCSITarget *target, int value) {
    char path[lio::kPathSize];
    uint32_t ret = lio::TpgFilePath(target->iqn, "attrib/authentication", path);
    if (ret != ORLO_OK) return ret;
    int current = -1;
    if ((ret = ORLOiSCSIConfigfsGetInteger(path, &current)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetInteger(\"%s\", %p) failed, err=%s", path, static_cast<void *>(&current),
                     ORLOiSCSIErrStr(ret));
        return ORLO_ERR_READ_FILE;
    }
    if (current == value) return ORLO_OK;
    return lio::TpgPutInteger(target->iqn, "attrib/authentication", value);
}

// Step 7: CHAP credentials and the authentication switch.  *stop is set for an
// authentication type this code does not know: the load ends there, without failing.
uint32_t AuthLoad(ORLOiSCSITarget *target, bool *stop) {
    *stop = false;
    const char *iqn = target->iqn;
    uint32_t ret;
    switch (target->auth_type) {
        case ORLO_ISCSI_AUTH_NONE:
            if ((ret = AuthenticationSet(target, 0)) != ORLO_OK)
                ORLO_LOG_ERR("AuthenticationSet(%p, 0) failed, err=%s", static_cast<void *>(target),
                             ORLOiSCSIErrStr(ret));
            return ret;
        case ORLO_ISCSI_AUTH_CHAP:
        case ORLO_ISCSI_AUTH_MUTUAL_CHAP:
            break;
        default:
            ORLO_LOG_ERR("Failed to set CHAP for iSCSI Target Portal Group: %s %d, Un-supported CHAP type %x", iqn,
                         ISCSI_TARGET_DEFAULT_TPGT_NUMBER, static_cast<unsigned int>(target->auth_type));
            *stop = true;
            return ORLO_OK;
    }
    // Secrets are shown masked.
    ret = ORLOiSCSILioTargetChapAuthAdd(ORLO_ISCSI_AUTH_CHAP, iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, target->user,
                                        target->password);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetChapAuthAdd(ISCSI_AUTH_SINGLE_CHAP, \"%s\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, "
                     "\"%s\", \"%s\") failed, err=%s",
                     iqn, target->user, "********", ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (target->auth_type == ORLO_ISCSI_AUTH_MUTUAL_CHAP) {
        ret = ORLOiSCSILioTargetChapAuthAdd(ORLO_ISCSI_AUTH_MUTUAL_CHAP, iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER,
                                            target->mutual_user, target->mutual_password);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetChapAuthAdd(ISCSI_AUTH_MUTUAL_CHAP, \"%s\", "
                         "ISCSI_TARGET_DEFAULT_TPGT_NUMBER, \"%s\", \"%s\") failed, err=%s",
                         iqn, target->mutual_user, "********", ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    if ((ret = ORLOiSCSILioTargetMaskingsChapAuthAdd(target, target->auth_type)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetMaskingsChapAuthAdd(%p, %d) failed, err=%s", static_cast<void *>(target),
                     target->auth_type, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = AuthenticationSet(target, 1)) != ORLO_OK) {
        ORLO_LOG_ERR("AuthenticationSet(%p, 1) failed, err=%s", static_cast<void *>(target), ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLO_OK;
}

// Step 8: digests, segment lengths, session limit and alias, in this order.
uint32_t ParamsLoad(const ORLOiSCSITarget *target) {
    const char *iqn = target->iqn;
    int sessions = target->max_sessions;
    if (sessions == 0 || sessions > kMaxSessions) sessions = kMaxSessions;
    uint32_t ret;
    if ((ret = lio::TpgWrite(iqn, "param/DataDigest", target->has_data_checksum ? "CRC32C" : "CRC32C,None")) !=
            ORLO_OK ||
        (ret = lio::TpgWrite(iqn, "param/HeaderDigest", target->has_header_checksum ? "CRC32C" : "CRC32C,None")) !=
            ORLO_OK ||
        (ret = lio::TpgPutInteger(iqn, "param/MaxRecvDataSegmentLength", target->max_recv_seg_bytes)) != ORLO_OK ||
        (ret = lio::TpgPutInteger(iqn, "param/MaxXmitDataSegmentLength", target->max_send_seg_bytes)) != ORLO_OK ||
        (ret = lio::TpgPutInteger(iqn, "max_session", sessions)) != ORLO_OK ||
        (ret = lio::TpgWrite(iqn, "param/TargetAlias", kTargetAlias)) != ORLO_OK)
        return ORLO_ERR_WRITE_FILE;
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetLoad(ORLOiSCSITarget *target, bool self_test) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = CheckRecord(target);
    if (ret != ORLO_OK) return ret;

    // A failure after the node was touched: the half-built node goes again.
    auto fail = [target, self_test](uint32_t code) -> uint32_t {
        if (!self_test) {
            uint32_t r = ORLOiSCSITargetUnload(target);
            if (r != ORLO_OK)
                ORLO_LOG_ERR("ORLOiSCSITargetUnload(%p) failed, err=%s", static_cast<void *>(target),
                             ORLOiSCSIErrStr(r));
        }
        return code;
    };

    // 2. The node.  One already there counts as loaded.
    char node[lio::kPathSize], tpg[lio::kPathSize];
    if ((ret = lio::FormatPath(node, lio::kNodeFmt, target->iqn)) != ORLO_OK ||
        (ret = lio::FormatPath(tpg, lio::kTpgFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER)) != ORLO_OK)
        return ret;
    if (orlo::os::Mkdir(node, S_IRWXU) != 0) {
        if (errno == EEXIST && !self_test) return ORLO_OK;
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", node);
        if (self_test) return static_cast<uint32_t>(-1);
        return fail(ORLO_ERR_MKDIR);
    }

    // 3. Its portal group.
    if (orlo::os::Mkdir(tpg, S_IRWXU) != 0 && errno != EEXIST) {
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", tpg);
        return fail(ORLO_ERR_MKDIR);
    }

    // 4. The default entry and the node access lists (not for the self-test's trial).
    if (!self_test) {
        int32_t permission = ISCSI_TARGET_AUTHORITY_NONE;
        if ((ret = TargetGetDefaultAcl(target, &permission)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetGetDefaultACL(%p, %p) failed, err=%s", static_cast<void *>(target),
                         static_cast<void *>(&permission), ORLOiSCSIErrStr(ret));
            return fail(ret);
        }
        if ((ret = ORLOiSCSITargetDefaultAclEnable(target, permission)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetDefaultAclEnable(%p, %d) failed, err=%s", static_cast<void *>(target),
                         permission, ORLOiSCSIErrStr(ret));
            return fail(ret);
        }
        if ((ret = ORLOiSCSILioTargetAclAdd(target)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILioTargetAclAdd(%p) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
            return fail(ret);
        }
    }

    // 5. The command window.
    if ((ret = DefaultCmdsnDepthLoad(target)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetDefaultCmdsnDepthLoad(%p) failed, err=%s", static_cast<void *>(target),
                     ORLOiSCSIErrStr(ret));
        return fail(ORLO_ERR_WRITE_FILE);
    }

    // 6. Portals: a target that cannot listen everywhere is still loaded.
    uint32_t portalRet = ORLOiSCSILioTargetNetworkPortalLoad(target);
    if (portalRet != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILioTargetNetworkPortalLoad(%p) failed, err=%s", static_cast<void *>(target),
                     ORLOiSCSIErrStr(portalRet));

    // 7. Authentication.
    bool stop = false;
    if ((ret = AuthLoad(target, &stop)) != ORLO_OK) return fail(ret);
    if (stop) return portalRet;

    // 8. Digests, segment lengths, sessions, alias.
    if ((ret = ParamsLoad(target)) != ORLO_OK) return fail(ret);

    // 9. A target in the kernel is wanted there.
    if (!target->enabled) {
        target->enabled = true;
        if ((ret = ORLOiSCSITargetConfUpdate(target)) != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITargetConfUpdate(%p) failed, err=%s", static_cast<void *>(target),
                         ORLOiSCSIErrStr(ret));
            target->enabled = false;
            return fail(lio::kErrUpdateTargetConfig);
        }
    }
    return ORLO_OK;
}
