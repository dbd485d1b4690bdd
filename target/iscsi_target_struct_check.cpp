// The checks a target record passes before it is stored: identifiers in range, names the
// kernel and initiators accept, and strings that one key line can carry and give back
// exactly as they were.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace orlo {
namespace target {

const char *ValueFault(const char *v, size_t size) {
    size_t n = strnlen(v, size);
    if (n == size) return "not terminated";
    for (size_t i = 0; i < n; ++i) {
        unsigned char c = static_cast<unsigned char>(v[i]);
        if (c < 0x20 || c == 0x7F) return "control character";
    }
    if (v[0] == ' ') return "leading blank";
    if (n >= 2 && v[0] == '"' && v[n - 1] == '"') return "enclosed in double quotes";
    return nullptr;
}

uint32_t CheckRecord(const ORLOiSCSITarget *t, bool checkAuthType) {
    if (t->tid < ORLO_ISCSI_TID_MIN || t->tid > ORLO_ISCSI_TID_MAX) {
        ORLO_LOG_ERR("Bad target ID: %d, not in %d..%d", t->tid, ORLO_ISCSI_TID_MIN, ORLO_ISCSI_TID_MAX);
        return kErrBadTid;
    }
    const char *fault = ValueFault(t->name, sizeof(t->name));
    if (fault == nullptr && t->name[0] == '\0') fault = "empty";
    if (fault == nullptr && !IsUtf8(t->name, strlen(t->name))) fault = "not UTF-8";
    if (fault != nullptr) {
        ORLO_LOG_ERR("Bad target name of tid %d: %s", t->tid, fault);
        return kErrBadName;
    }
    if (strnlen(t->iqn, sizeof(t->iqn)) == sizeof(t->iqn) || !ORLOiSCSIIsValidIscsiName(t->iqn)) {
        ORLO_LOG_ERR("Bad target iqn of tid %d: not an iSCSI name", t->tid);
        return kErrBadIqn;
    }
    if (checkAuthType && (t->auth_type < ORLO_ISCSI_AUTH_NONE || t->auth_type > ORLO_ISCSI_AUTH_MUTUAL_CHAP)) {
        ORLO_LOG_ERR("Bad target auth_type of tid %d: %d", t->tid, t->auth_type);
        return kErrBadAuthType;
    }
    if (t->max_sessions < 0) {
        ORLO_LOG_ERR("Bad target max_sessions of tid %d: %d", t->tid, t->max_sessions);
        return kErrBadMaxSessions;
    }
    struct Chap {
        const char *what;
        const char *value;
        size_t size;
        bool secret;
        uint32_t code;
    };
    const Chap chaps[] = {
        {"user", t->user, sizeof(t->user), false, kErrBadUser},
        {"password", t->password, sizeof(t->password), true, kErrBadPassword},
        {"mutual_user", t->mutual_user, sizeof(t->mutual_user), false, kErrBadMutualUser},
        {"mutual_password", t->mutual_password, sizeof(t->mutual_password), true, kErrBadMutualPassword},
    };
    for (const Chap &c : chaps) {
        fault = ValueFault(c.value, c.size);
        if (fault == nullptr && c.secret && strlen(c.value) > OLIBC_CRYPT_PLAIN_MAX) fault = "too long to store";
        if (fault != nullptr) {
            ORLO_LOG_ERR("Bad target %s of tid %d: %s", c.what, t->tid, fault);
            return c.code;
        }
    }
    if (t->max_recv_seg_bytes < ORLO_ISCSI_SEG_BYTES_MIN || t->max_recv_seg_bytes > ORLO_ISCSI_SEG_BYTES_MAX) {
        ORLO_LOG_ERR("Bad target max_recv_seg_bytes of tid %d: %d", t->tid, t->max_recv_seg_bytes);
        return kErrBadRecvSeg;
    }
    if (t->max_send_seg_bytes < ORLO_ISCSI_SEG_BYTES_MIN || t->max_send_seg_bytes > ORLO_ISCSI_SEG_BYTES_MAX) {
        ORLO_LOG_ERR("Bad target max_send_seg_bytes of tid %d: %d", t->tid, t->max_send_seg_bytes);
        return kErrBadSendSeg;
    }
    fault = ValueFault(t->network_portals, sizeof(t->network_portals));
    if (fault != nullptr) {
        ORLO_LOG_ERR("Bad target network_portals of tid %d: %s", t->tid, fault);
        return ORLO_ERR_BAD_PARAMETER;
    }
    return ORLO_OK;
}

}  // namespace target
}  // namespace orlo

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetStructCheck(const ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = orlo::target::CheckRecord(target, true);
    if (ret != ORLO_OK) OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
    return ret;
}
