// Sets the write protection of one initiator's LUN entry from the initiator's authority
// and the state of the LUN's volume (see WriteProtected in lio_acl_util.h).
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/lio_acl_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetLunInitiatorRw(const char *iqn, int tpgt, const ORLOiSCSIAcl *entry,
                                                                 int lun) {
    namespace acl = orlo::target::acl;
    if (entry == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = acl::CheckArgs(iqn, tpgt, entry->initiator, lun);
    if (ret != ORLO_OK) return ret;
    if (lun < 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char path[acl::kPathSize];
    if ((ret = acl::FormatPath(path, acl::kAclWriteProtectFmt, iqn, tpgt, entry->initiator, lun)) != ORLO_OK)
        return ret;
    bool readOnly = false;
    if ((ret = acl::LunVolumeIsReadOnly(iqn, tpgt, lun, &readOnly)) != ORLO_OK) return ret;
    const char *value = acl::WriteProtected(entry->authority, readOnly) ? "1" : "0";
    if ((ret = ORLOiSCSIConfigfsWrite(path, value)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, value, ORLOiSCSIErrStr(ret));
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}
