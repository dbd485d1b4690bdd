/*
 * What stands behind a snapshot on its volume and in the kernel, shared by the creation,
 * loading and deletion code: the per-LUN snapshot directory, a block snapshot's read-only
 * subvolume, an advanced snapshot's map file, the snapshot's backstore and its events.
 */
#ifndef ORLO_SNAPSHOT_SNAPSHOT_OBJECTS_H
#define ORLO_SNAPSHOT_SNAPSHOT_OBJECTS_H

#include <stddef.h>
#include <stdint.h>

#include "orloiscsi_lun.h"
#include "orloiscsi_snapshot.h"

namespace orlo {
namespace snap {

constexpr size_t kObjectPathSize = 4096;

// More conf_flags of a creation or deletion (never stored).
constexpr uint32_t kConfTrash = 0x01u;       // made for the trash: map file in EP_unmap
constexpr uint32_t kConfUnsync = 0x02u;      // unsynchronised snapshot
constexpr uint32_t kConfNoAppKey = 0x04u;    // deleted without the application-key check
constexpr uint32_t kConfSchedule = 0x08u;    // taken by a schedule

// Result codes of creation and deletion.
constexpr uint32_t kErrOutOfSpace = 18990002;
constexpr uint32_t kErrFileExists = 18990012;
constexpr uint32_t kErrFork = 18990014;
constexpr uint32_t kErrStatPath = 18990021;
constexpr uint32_t kErrRmdir = 18990029;
constexpr uint32_t kErrUnlink = 18990037;
constexpr uint32_t kErrRename = 18990042;
constexpr uint32_t kErrDirExists = 18990058;
constexpr uint32_t kErrBtrfsDelete = 18990318;
constexpr uint32_t kErrPluginNotify = 18990408;
constexpr uint32_t kErrMappedSize = 18990414;
constexpr uint32_t kErrBadLunType = 18990500;
constexpr uint32_t kErrDeleteLocked = 18990540;
constexpr uint32_t kErrMaxCount = 18990543;
constexpr uint32_t kErrTakeSnapshot = 18990569;
constexpr uint32_t kErrLoadSnapshot = 18990575;
constexpr uint32_t kErrUnloadSnapshot = 18990576;
constexpr uint32_t kErrLoadLun = 18990578;
constexpr uint32_t kErrUnusedSid = 18990581;
constexpr uint32_t kErrBaseVersion = 18990876;

// Event-log entries of snapshots.
constexpr unsigned int kEventOutOfSpace = 0x13d00004u;   // also "Maximum snapshot count reached"
constexpr unsigned int kEventTaken = 0x13d0000au;        // an advanced snapshot finished
constexpr unsigned int kEventDeleteFailed = 0x13d0000bu; // a snapshot could not be deleted

// The LUN families that can be snapshotted: the advanced one (all of bits 0xF) gives
// "ADV" snapshots, the block one (all of bits 0x107) "BLUN" snapshots.
inline bool IsAdvFamily(uint32_t type) { return (type & 0xFu) == 0xFu; }
inline bool IsBlockFamily(uint32_t type) { return (type & 0x107u) == 0x107u; }

// "<volume>/@iSCSI/Snapshot/<ADV|BLUN>/<lun uuid>": every snapshot of one LUN.
uint32_t LunSnapshotDir(const char *volume, int32_t type, const char *lunUuid, char *buf, size_t size);
// A block snapshot's subvolume: "<volume>/@iSCSI/Snapshot/BLUN/<lun uuid>/<uuid>".
uint32_t BlunSubvolPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
// An advanced snapshot's own directory "<volume>/@iSCSI/Snapshot/ADV/<lun uuid>/<uuid>",
// and its map file "<that>/<uuid>_00000" (the trash's "<volume>/@iSCSI/EP_unmap/<uuid>"
// for a snapshot made for the trash).
uint32_t AdvSnapshotDir(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
uint32_t AdvMapPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
// The snapshot's backstore in the kernel: its name by the conf_flags rule and its
// configfs directory under the extent pool's host (the trash host for 0x01).
uint32_t KernelObjectName(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
uint32_t ConfigfsDirPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size);
// The LUN's volume subvolume a block snapshot is taken of.
uint32_t BlunSourcePath(const ORLOiSCSILun *lun, char *buf, size_t size);

// An event-log entry of a snapshot for LUN types whose owners hear of them (the advanced
// family, CINDER and BLUN): "level=9" when support_dr_snap is "yes", else "level=1".
void Event(unsigned int id, const ORLOiSCSILun *lun, const char *text);

// The ending of an operation's log line when the LUN record is what it is about.
const char *LunName(const ORLOiSCSILun *lun);

}  // namespace snap
}  // namespace orlo

#endif
