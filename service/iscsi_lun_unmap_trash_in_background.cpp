// Starts, at service start, the release of the space of deleted advanced LUNs whose map
// files wait in a volume's trash ("<volume>/@iSCSI/EP_unmap").  Volumes are the
// "/volume<n>" mount points at the root; only those whose trash holds something get a
// worker (ORLOiSCSILunUnmapALUNInBackground).  The workers run in a process group of
// their own, recorded so that ORLOiSCSILunUnmapTrashStop can end them (see
// service/unmap_trash_util.h).  The call does not wait for the work.
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"
#include "platform/os_seam.h"
#include "service/unmap_trash_util.h"

namespace {

namespace unmap = orlo::service::unmap;

constexpr uint32_t kErrFork = 18990014;

// Whether the volume's trash holds any entry; a missing trash holds none.
bool TrashHoldsSomething(const char *volume) {
    char dir[EP_PATH_SIZE];
    if (orlo::ep::TrashDirPath(volume, dir, sizeof(dir)) != ORLO_OK) return false;
    orlo::DirGuard d(orlo::os::Opendir(dir));
    if (d.get() == nullptr) {
        if (errno != ENOENT && errno != ENOTDIR) {
            ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", dir);
        }
        return false;
    }
    while (struct dirent *e = readdir(d.get()))
        if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) return true;
    return false;
}

uint32_t VolumesWithTrash(std::vector<std::string> *volumes) {
    std::vector<int> numbers;
    if (orlo::VolumeNumbers(&numbers) != ORLO_OK) return ORLO_ERR_OPEN_DIR;
    for (int n : numbers) {
        std::string volume = "/volume" + std::to_string(n);
        if (TrashHoldsSomething(volume.c_str())) volumes->push_back(volume);
    }
    return ORLO_OK;
}

// The leader: a group of its own, reported to the caller through the pipe, then one
// worker per volume.  It keeps none of the caller's descriptors (a held service lock
// would stay held) and lets its workers die of SIGTERM whatever the caller had set.
[[noreturn]] void RunLeader(int readyFd, const std::vector<std::string> &volumes) {
    int ok = setpgid(0, 0) == 0 ? 1 : 0;
    char byte = ok ? '1' : '0';
    ssize_t w;
    do {
        w = ::write(readyFd, &byte, 1);
    } while (w < 0 && errno == EINTR);
    ::close(readyFd);
    if (!ok) _exit(1);
    closelog();
    if (close_range(3, ~0u, 0) != 0) {
        for (int fd = 3; fd < 1024; ++fd) ::close(fd);
    }
    signal(SIGTERM, SIG_DFL);
    sigset_t term;
    sigemptyset(&term);
    sigaddset(&term, SIGTERM);
    sigprocmask(SIG_UNBLOCK, &term, nullptr);
    int failed = 0;
    for (const std::string &volume : volumes) {
        uint32_t ret = ORLOiSCSILunUnmapALUNInBackground(volume.c_str());
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILunUnmapALUNInBackground(\"%s\") failed, err=%s", volume.c_str(),
                         ORLOiSCSIErrStr(ret));
            failed = 1;
        }
    }
    _exit(failed);
}

// Adds a group to the record, dropping groups that have ended.
uint32_t RecordGroup(pid_t pgid) {
    orlo::FileLockGuard lock(unmap::kPidLock, true, unmap::kPidLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(unmap::kPidLock);
        return ORLO_ERR_LOCK_FILE;
    }
    std::vector<pid_t> groups, kept;
    uint32_t ret = unmap::ReadGroups(&groups);
    if (ret != ORLO_OK) return ret;
    for (pid_t g : groups)
        if (g != pgid && unmap::LiveMembers(g) != 0) kept.push_back(g);
    kept.push_back(pgid);
    return unmap::WriteGroups(kept);
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunUnmapTrashInBackground(void) {
    std::vector<std::string> volumes;
    uint32_t ret = VolumesWithTrash(&volumes);
    if (ret != ORLO_OK) return ret;
    if (volumes.empty()) return ORLO_OK;

    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        ORLO_LOG_ERR("pipe2(%p, O_CLOEXEC) failed, err=%m", static_cast<void *>(fds));
        return kErrFork;
    }
    pid_t leader = OLIBCProcForkChildNoWait();
    if (leader == 0) {
        ::close(fds[0]);
        RunLeader(fds[1], volumes);
    }
    ::close(fds[1]);
    orlo::FdGuard ready(fds[0]);
    if (leader < 0) {
        ORLO_LOG_PLATFORM("OLIBCProcForkChildNoWait()");
        return kErrFork;
    }
    // Recorded only once the leader leads its group, so a stop right after this call
    // finds the group.
    char byte = 0;
    ssize_t r;
    do {
        r = ::read(ready.get(), &byte, 1);
    } while (r < 0 && errno == EINTR);
    if (r != 1 || byte != '1') {
        ORLO_LOG_ERR("setpgid(0, 0) failed in unmap leader %d", static_cast<int>(leader));
        return kErrFork;
    }
    ret = RecordGroup(leader);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to record unmap group %d, err=%s", static_cast<int>(leader), ORLOiSCSIErrStr(ret));
    }
    return ret;
}
