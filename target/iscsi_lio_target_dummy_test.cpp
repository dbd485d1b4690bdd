// The kernel self-test: under the service lock, a trial target node is built in the
// kernel's iSCSI fabric and taken down again, and the outcome is left in
// /tmp/iscsi_dummy_result for the programs that check the appliance's health.
//
// The trial node is "iqn.2000-01.com.orlo-nas:iscsitrg.dummy.test": a backup-object
// target (so its only portal is 127.0.0.1:3260 and no interface ever listens for it)
// without authentication, with its portal group left off.  After the load the test
// writes its portal group's demo-mode switches (attrib/generate_node_acls 1,
// attrib/demo_mode_discovery 0), then the node is unloaded; a node left over from an
// interrupted run is unloaded first.  No configuration file is read or written.
//
// The result file holds two key=value lines: "result=pass" or "result=fail", then
// "err=<decimal result code>" (0 on a pass; on a failure the code of the step that
// failed: the forced failure and a failed trial load give 18990722).
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/lio_target_util.h"

namespace {

namespace lio = orlo::target::lio;

constexpr const char kTrialIqn[] = "iqn.2000-01.com.orlo-nas:iscsitrg.dummy.test";
constexpr const char kResultPath[] = "/tmp/iscsi_dummy_result";
const char *const kForcedFailurePaths[] = {"/root/iscsitrg_dummy_test_forced_failure",
                                           "/tmp/iscsitrg_dummy_test_forced_failure"};

ORLOiSCSITarget TrialTarget() {
    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    t.tid = 0;
    t.enabled = true;  // so the load never stores the trial record
    t.bkp_obj = true;
    snprintf(t.name, sizeof(t.name), "%s", "iscsitrg-dummy-test");
    snprintf(t.iqn, sizeof(t.iqn), "%s", kTrialIqn);
    t.max_recv_seg_bytes = 262144;
    t.max_send_seg_bytes = 262144;
    t.max_sessions = 1;
    t.auth_type = ORLO_ISCSI_AUTH_NONE;
    return t;
}

bool ForcedToFail() {
    for (const char *path : kForcedFailurePaths) {
        if (orlo::os::Access(path, F_OK) == 0) return true;
        if (errno != ENOENT) {
            ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", path);
        }
    }
    return false;
}

uint32_t WriteResult(uint32_t code) {
    FILE *f = orlo::os::Fopen(kResultPath, "w");
    if (f == nullptr) {
        ORLO_LOG_ERR("fopen(\"%s\", \"w\") failed, err=%m", kResultPath);
        return ORLO_ERR_OPEN_FILE;
    }
    int n = fprintf(f, "result=%s\nerr=%u\n", code == ORLO_OK ? "pass" : "fail", code);
    if (fclose(f) != 0 || n < 0) {
        ORLO_LOG_ERR("Failed to write %s, err=%m", kResultPath);
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}

// The trial itself: load, touch the demo-mode switches, unload.
uint32_t Trial() {
    ORLOiSCSITarget trial = TrialTarget();
    uint32_t ret = ORLOiSCSITargetUnloadByIqn(kTrialIqn);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetUnloadByIqn(\"%s\") failed, err=%s", kTrialIqn, ORLOiSCSIErrStr(ret));
        return ret;
    }
    uint32_t loadRet = ORLOiSCSILioTargetLoad(&trial, true);
    uint32_t result = ORLO_OK;
    if (loadRet != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILioTargetLoad(%p, true) failed, err=%s", static_cast<void *>(&trial),
                     ORLOiSCSIErrStr(loadRet));
        result = lio::kErrLoadTarget;
    } else if ((ret = lio::TpgWrite(kTrialIqn, "attrib/generate_node_acls", "1")) != ORLO_OK ||
               (ret = lio::TpgWrite(kTrialIqn, "attrib/demo_mode_discovery", "0")) != ORLO_OK) {
        result = ret;
    }
    // The trial node goes whatever happened; a node that stays is a failure too.
    if ((ret = ORLOiSCSITargetUnloadByIqn(kTrialIqn)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSITargetUnloadByIqn(\"%s\") failed, err=%s", kTrialIqn, ORLOiSCSIErrStr(ret));
        if (result == ORLO_OK) result = ret;
    }
    return result;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetDummyTest(void) {
    ORLOiSCSIServiceLockGuard guard;
    if (!guard.held()) return ORLO_ERR_LOCK_FILE;
    // An old result must not stand for this run.
    if (orlo::os::Unlink(kResultPath) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", kResultPath);
        return ORLO_ERR_UNLINK_FILE;
    }
    uint32_t result;
    if (ForcedToFail()) {
        ORLO_LOG_ERR("iscsitrg dummy test is forced to fail.");
        result = lio::kErrLoadTarget;
    } else {
        result = Trial();
    }
    uint32_t ret = WriteResult(result);
    return result != ORLO_OK ? result : ret;
}
