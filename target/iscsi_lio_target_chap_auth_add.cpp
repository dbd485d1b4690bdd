// Writes a portal group's CHAP credentials into its "auth" directory: kind 1 the
// one-way pair (userid, password), kind 2 the mutual pair (userid_mutual,
// password_mutual) with which the target answers the initiator.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/lio_target_util.h"

namespace {

namespace lio = orlo::target::lio;

// One credential file; a secret never reaches the log.
uint32_t WriteAuth(const char *iqn, int tpgt, const char *file, const char *value, bool secret) {
    char dir[lio::kPathSize], path[lio::kPathSize];
    uint32_t ret = lio::FormatPath(dir, "/config/target/iscsi/%s/tpgt_%d/auth", iqn, tpgt);
    if (ret != ORLO_OK || (ret = lio::FormatPath(path, "%s/%s", dir, file)) != ORLO_OK) return ret;
    if ((ret = ORLOiSCSIConfigfsWrite(path, value)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, secret ? "********" : value,
                     ORLOiSCSIErrStr(ret));
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetChapAuthAdd(int kind, const char *iqn, int tpgt, const char *user,
                                                              const char *secret) {
    uint32_t ret = lio::CheckIqn(iqn);
    if (ret != ORLO_OK) return ret;
    if (user == nullptr || secret == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (tpgt < 1 || tpgt > 65535) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    const char *userFile, *secretFile;
    if (kind == ORLO_ISCSI_AUTH_CHAP) {
        userFile = "userid";
        secretFile = "password";
    } else if (kind == ORLO_ISCSI_AUTH_MUTUAL_CHAP) {
        userFile = "userid_mutual";
        secretFile = "password_mutual";
    } else {
        ORLO_LOG_ERR("Unable to set CHAP for iSCSI default ACL for iSCSI Target Portal Group: %s %d, "
                     "Un-supported CHAP type %x",
                     iqn, tpgt, static_cast<unsigned int>(kind));
        return ORLO_ERR_BAD_PARAMETER;
    }
    if ((ret = WriteAuth(iqn, tpgt, userFile, user, false)) != ORLO_OK) return ret;
    return WriteAuth(iqn, tpgt, secretFile, secret, true);
}
