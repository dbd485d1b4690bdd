// Builds a target record from the keys of its section.  Every required key is checked for
// presence before anything is allocated, so a section missing one fails whole, whatever
// its authentication.
#include <strings.h>

#include <cstdio>
#include <cstdlib>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace {

using orlo::target::kConfPath;

const char *const kRequiredKeys[] = {
    "tid",      "name",        "iqn",        "enabled",        "authen",         "username",       "password",
    "mutual",   "mutual_username", "mutual_password", "hdr_chksum", "data_chksum", "send_seg_bytes", "recv_seg_bytes",
};

int ToInt(const char *v) { return v == nullptr ? 0 : static_cast<int>(strtol(v, nullptr, 10)); }

bool IsYes(const char *v) { return v != nullptr && strcasecmp(v, "yes") == 0; }

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetStructCreate(const OLIBC_SZHASH *hash, ORLOiSCSITarget **out) {
    if (hash == nullptr || out == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    for (const char *key : kRequiredKeys) {
        if (OLIBCSzHashGetValue(hash, key) == nullptr) {
            OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
            ORLO_LOG_ERR("Failed to get %s in %s, errno=0X%X", key, kConfPath, static_cast<unsigned>(OLIBCErrGet()));
            return orlo::target::kErrGetHashValue;
        }
    }
    auto *t = static_cast<ORLOiSCSITarget *>(calloc(1, sizeof(ORLOiSCSITarget)));
    if (t == nullptr) {
        ORLO_LOG_ERR("calloc(%d, %zu) failed, err=%m", 1, sizeof(ORLOiSCSITarget));
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    auto freeHalfBuilt = orlo::MakeScopeExit([t]() { free(t); });
    auto get = [hash](const char *key) { return OLIBCSzHashGetValue(hash, key); };

    t->tid = ToInt(get("tid"));
    snprintf(t->name, sizeof(t->name), "%s", get("name"));
    snprintf(t->iqn, sizeof(t->iqn), "%s", get("iqn"));
    t->enabled = IsYes(get("enabled"));
    t->enabled_as_loaded = t->enabled;
    t->has_header_checksum = IsYes(get("hdr_chksum"));
    t->has_data_checksum = IsYes(get("data_chksum"));
    t->max_send_seg_bytes = ToInt(get("send_seg_bytes"));
    t->max_recv_seg_bytes = ToInt(get("recv_seg_bytes"));
    const char *portals = get("network_portals");
    snprintf(t->network_portals, sizeof(t->network_portals), "%s", portals != nullptr ? portals : "");
    const char *sessions = get("max_sessions");
    t->max_sessions = sessions != nullptr ? ToInt(sessions) : 1;
    t->bkp_obj = ToInt(get("bkp_obj")) != 0;

    t->auth_type = ORLO_ISCSI_AUTH_NONE;
    if (strcasecmp(get("authen"), "no") != 0) {
        t->auth_type = ORLO_ISCSI_AUTH_CHAP;
        snprintf(t->user, sizeof(t->user), "%s", get("username"));
        if (OLIBCCryptSzDecrypt(get("password"), t->password, sizeof(t->password)) != 0) {
            ORLO_LOG_ERR("Failed to decrypt password[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                         OLIBCErrorGetLine());
            return orlo::target::kErrBadPassword;
        }
        if (strcasecmp(get("mutual"), "no") != 0) {
            t->auth_type = ORLO_ISCSI_AUTH_MUTUAL_CHAP;
            snprintf(t->mutual_user, sizeof(t->mutual_user), "%s", get("mutual_username"));
            if (OLIBCCryptSzDecrypt(get("mutual_password"), t->mutual_password, sizeof(t->mutual_password)) != 0) {
                ORLO_LOG_ERR("Failed to decrypt mutual password[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                             OLIBCErrorGetLine());
                return orlo::target::kErrBadMutualPassword;
            }
        }
    }
    freeHalfBuilt.Dismiss();
    *out = t;
    return ORLO_OK;
}
