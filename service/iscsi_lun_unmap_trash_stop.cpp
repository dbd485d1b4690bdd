// Ends the background release of deleted LUNs' space that service starts launched: each
// recorded process group gets SIGTERM, and the stop waits until its processes are gone
// (SIGKILL after a grace period).  A worker ended this way leaves the map files it had
// not released in the trash for the next run.  Nothing recorded is nothing to stop.
#include <signal.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/unmap_trash_util.h"

namespace {

namespace unmap = orlo::service::unmap;

constexpr int kTermGraceMs = 5000;
constexpr int kKillGraceMs = 2000;
constexpr int kPollMs = 20;

// Signals every group that still has a process; ESRCH means it has ended.
uint32_t SignalGroups(const std::vector<pid_t> &groups, int sig) {
    uint32_t first = ORLO_OK;
    for (pid_t g : groups) {
        if (kill(-g, sig) != 0 && errno != ESRCH) {
            ORLO_LOG_ERR("kill(%d, %d) failed, err=%m", -static_cast<int>(g), sig);
            if (first == ORLO_OK) first = ORLO_ERR_DEFAULT;
        }
    }
    return first;
}

// Waits until no group has a running process: true, or false after ms.
bool WaitGroupsGone(const std::vector<pid_t> &groups, int ms) {
    for (int waited = 0;; waited += kPollMs) {
        bool any = false;
        for (pid_t g : groups) {
            if (unmap::LiveMembers(g) != 0) any = true;
        }
        if (!any) return true;
        if (waited >= ms) return false;
        struct timespec ts = {0, kPollMs * 1000000L};
        nanosleep(&ts, nullptr);
    }
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunUnmapTrashStop(void) {
    // Nothing was ever launched (or the last stop ended it all): no lock needed.
    if (orlo::os::Access(unmap::kPidFile, F_OK) != 0 && errno == ENOENT) return ORLO_OK;
    orlo::FileLockGuard lock(unmap::kPidLock, true, unmap::kPidLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(unmap::kPidLock);
        return ORLO_ERR_LOCK_FILE;
    }
    std::vector<pid_t> groups;
    uint32_t ret = unmap::ReadGroups(&groups);
    if (ret != ORLO_OK) return ret;
    if (groups.empty()) return ORLO_OK;

    ret = SignalGroups(groups, SIGTERM);
    if (!WaitGroupsGone(groups, kTermGraceMs)) {
        ORLO_LOG_ERR("Unmap workers did not end on SIGTERM within %d ms, killing them", kTermGraceMs);
        uint32_t r = SignalGroups(groups, SIGKILL);
        if (ret == ORLO_OK) ret = r;
        if (!WaitGroupsGone(groups, kKillGraceMs)) {
            ORLO_LOG_ERR("Unmap workers still run after SIGKILL");
            return ORLO_ERR_TIMEOUT;
        }
    }
    uint32_t r = unmap::WriteGroups({});
    return ret != ORLO_OK ? ret : r;
}
