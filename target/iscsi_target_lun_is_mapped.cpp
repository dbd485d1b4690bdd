// Whether a mapping's LUN entry lun_<n> is in the target's portal group in the kernel.
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"
#include "target/lio_acl_util.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetLunIsMapped(const ORLOiSCSIMapping *mapping, bool *present) {
    namespace life = orlo::target::life;
    namespace acl = orlo::target::acl;
    if (mapping == nullptr || present == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!life::TidValid(mapping->tid) || mapping->lun < 0 || mapping->lun > ORLO_ISCSI_MAPPING_LUN_MAX) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    *present = false;
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTarget | ORLO_ISCSI_TARGET_FILTER_BKP, mapping->tid, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get config");
        return life::kErrGetConfig;
    }
    const ORLOiSCSITarget *target = life::FirstTarget(*conf);
    if (target == nullptr) {
        ORLO_LOG_ERR("Failed to get iscsi target, tid:%d", mapping->tid);
        return life::kErrLoadTargetConfig;
    }
    char path[acl::kPathSize];
    if ((ret = acl::FormatPath(path, acl::kTpgLunFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, mapping->lun)) !=
        ORLO_OK)
        return ret;
    if (orlo::os::Access(path, F_OK) == 0) {
        *present = true;
    } else if (errno != ENOENT && errno != ENOTDIR) {
        ORLO_LOG_ERR("Failed to get mapping status. path: %s", path);
        return life::kErrMappingStatus;
    }
    return ORLO_OK;
}
