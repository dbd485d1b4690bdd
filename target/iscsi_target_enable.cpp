// Enables a target in the kernel with its stored access list.  The stored enabled flag
// is left as it is.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetEnable(ORLOiSCSITarget *target) {
    namespace life = orlo::target::life;
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLO_TARGET_LOCK_OR_RETURN(targetLock, ORLO_ERR_LOCK_FILE);
    ORLOiSCSIAclList acls = {};
    ORLOiSCSIListInit(&acls);
    auto freeAcls = orlo::MakeScopeExit([&acls] { ORLOiSCSITargetAclListFree(&acls); });
    uint32_t ret = ORLOiSCSITargetConfAclLoad(target->tid, &acls);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetConfAclLoad(%d, %p) failed, err=%s", target->tid, static_cast<void *>(&acls),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = ORLOiSCSILioTargetEnable(target, &acls)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetEnable(%p, %p) failed, err=%s", static_cast<void *>(target),
                     static_cast<void *>(&acls), ORLOiSCSIErrStr(ret));
        return life::kErrEnableTarget;
    }
    (void)ORLOiSCSITargetiSNSRegister(target);
    return ORLO_OK;
}
