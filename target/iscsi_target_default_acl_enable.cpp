// Applies the default access-list entry (the one that stands for every initiator not
// listed) to a target's portal group in the kernel.
//
// Under the current target core the portal group's demo mode stands for it: with
// authority 0 only listed initiators may log in (generate_node_acls 0); otherwise any
// initiator gets a dynamic node access list (generate_node_acls 1, cached with
// cache_dynamic_acls 1) whose LUNs are write-protected for read-only authority.
//
// The older target core (version 2) gives the default entry a node access list of its
// own, with LUN entries and write protection like any listed initiator (see
// DefaultEntryIsNodeAcl).  There the demo mode must not let initiators in beside it, so
// generate_node_acls is switched off whatever the authority is.
#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_target.h"
#include "target/lio_acl_util.h"
#include "target/lio_target_util.h"

namespace {

namespace lio = orlo::target::lio;

// One demo-mode attribute of the portal group, logged as the kernel write it is.
uint32_t WriteAttrib(const char *iqn, const char *leaf, const char *value) {
    char path[lio::kPathSize];
    uint32_t ret = lio::TpgFilePath(iqn, leaf, path);
    if (ret != ORLO_OK) return ret;
    if ((ret = ORLOiSCSIConfigfsWrite(path, value)) != ORLO_OK) {
        if (value[0] == '1') {
            ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"1\") failed, err=%s", path, ORLOiSCSIErrStr(ret));
        } else {
            ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"0\") failed, err=%s", path, ORLOiSCSIErrStr(ret));
        }
        return ret;
    }
    return ORLO_OK;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetDefaultAclEnable(const ORLOiSCSITarget *target, int32_t authority) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = lio::CheckIqn(target->iqn);
    if (ret != ORLO_OK) return ret;
    const char *iqn = target->iqn;

    if (orlo::target::acl::DefaultEntryIsNodeAcl() || authority == ISCSI_TARGET_AUTHORITY_NONE)
        return WriteAttrib(iqn, "attrib/generate_node_acls", "0");

    if (authority != ISCSI_TARGET_AUTHORITY_RO && authority != ISCSI_TARGET_AUTHORITY_RW)
        ORLO_LOG_ERR("Suspicious iSCSI Target default rw permission: %s %d", iqn, authority);
    if ((ret = WriteAttrib(iqn, "attrib/generate_node_acls", "1")) != ORLO_OK ||
        (ret = WriteAttrib(iqn, "attrib/cache_dynamic_acls", "1")) != ORLO_OK)
        return ret;
    return WriteAttrib(iqn, "attrib/demo_mode_write_protect",
                       authority == ISCSI_TARGET_AUTHORITY_RO ? "1" : "0");
}
