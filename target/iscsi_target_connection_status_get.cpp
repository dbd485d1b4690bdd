// Whether initiators are connected to a target: 2 when its portal group is not
// running, else 1 with at least one session and 0 without.
#include "base/iscsi_base_internal.h"
#include "target/target_life_util.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConnectionStatusGet(int32_t tid, char *out) {
    namespace life = orlo::target::life;
    if (out == nullptr || !life::TidValid(tid)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryTarget, tid, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X, tid:%d) failed, err=%s", life::kQueryTarget, tid, ORLOiSCSIErrStr(ret));
        return life::kErrLoadTargetConfig;
    }
    const ORLOiSCSITarget *target = life::FirstTarget(*conf);
    if (target == nullptr) {
        ORLO_LOG_ERR("Failed to get iscsi target, tid:%d", tid);
        return life::kErrNoSuchTarget;
    }
    if (!(ORLOiSCSITargetStatusGet(tid, target) & ORLO_ISCSI_TARGET_STATUS_ENABLED)) {
        *out = ORLO_ISCSI_TARGET_CONN_DOWN;
        return ORLO_OK;
    }
    ORLOiSCSISessionStateList sessions = {};
    ORLOiSCSIListInit(&sessions);
    int count = ORLOiSCSITargetSessionStateListGet(tid, &sessions);
    ORLOiSCSITargetSessionStateListFree(&sessions);
    if (count < 0) {
        ORLO_LOG_ERR("Failed to get session of tid: %d", tid);
        return ORLO_OK;
    }
    *out = count > 0 ? ORLO_ISCSI_TARGET_CONN_ACTIVE : ORLO_ISCSI_TARGET_CONN_NONE;
    return ORLO_OK;
}
