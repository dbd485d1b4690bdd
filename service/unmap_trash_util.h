// Book-keeping of the background release of deleted advanced LUNs' space that the
// service start launches (ORLOiSCSILunUnmapTrashInBackground) and the service stop ends
// (ORLOiSCSILunUnmapTrashStop).
//
// Each launch runs in a process group of its own: a leader process becomes the group's
// leader and starts one worker per volume with ORLOiSCSILunUnmapALUNInBackground, and the
// workers stay in its group.  The group ids of the launches are kept, one decimal number
// a line, in kPidFile, read and written under kPidLock.  Stopping signals each recorded
// group as a whole, so it reaches the workers even after the leader has ended.  Workers
// that a LUN deletion starts by itself are not in such a group and are not stopped.
#ifndef ORLO_SERVICE_UNMAP_TRASH_UTIL_H
#define ORLO_SERVICE_UNMAP_TRASH_UTIL_H

#include <sys/types.h>

#include <stdint.h>

#include <vector>

namespace orlo {
namespace service {
namespace unmap {

constexpr const char kPidFile[] = "/tmp/iscsi/iscsi_unmap_trash.pid";
constexpr const char kPidLock[] = "/tmp/iscsi/iscsi_unmap_trash.pid.lock";
constexpr int kPidLockTimeoutSec = 60;

// The recorded group ids (a missing file is none; lines that are no positive number are
// skipped).  0, or 18990039 when the file cannot be read.
uint32_t ReadGroups(std::vector<pid_t> *groups);
// Replaces the file with the given groups; an empty list removes it.  0, or 18990040 /
// 18990037.
uint32_t WriteGroups(const std::vector<pid_t> &groups);
// The number of processes of the group that are still running (zombies left out), from
// /proc; -1 when /proc cannot be read.
int LiveMembers(pid_t pgid);

}  // namespace unmap
}  // namespace service
}  // namespace orlo

#endif
