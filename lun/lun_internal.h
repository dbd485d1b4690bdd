/*
 * Private helpers of the LUN code: the type table, the fixed paths of the LUN files and
 * lock files, the filter and the section writer shared by the global and volume files.
 */
#ifndef ORLO_LUN_LUN_INTERNAL_H
#define ORLO_LUN_LUN_INTERNAL_H

#include <stddef.h>
#include <stdint.h>

#include "olibc.h"
#include "orloiscsi_lun.h"

namespace orlo {
namespace lun {

// Result codes used by the LUN code beyond those of orloiscsi_base.h.
constexpr uint32_t kErrSetHashValue = 18990032;  // Failed to set hash value
constexpr uint32_t kErrGetHashValue = 18990033;  // Failed to get hash value
constexpr uint32_t kErrInvalidInput = 18990201;  // Invalid input
constexpr uint32_t kErrMappedSize = 18990414;    // Failed to get mapped size
constexpr uint32_t kErrNotAccepted = 18990430;   // Not accepted by filter
constexpr uint32_t kErrBadLunType = 18990500;    // Bad LUN type
constexpr uint32_t kErrNoSuchLun = 18990531;     // No such LUN
constexpr uint32_t kErrLunLocked = 18990535;     // LUN is locked

constexpr const char *kGlobalConfPath = "/usr/orlo/etc/iscsi_lun.conf";
constexpr const char *kConfLockPath = "/tmp/iscsi/iscsi_lun.conf.lock";
constexpr const char *kVolumeConfFmt = "%s/@iSCSI/LUN/iscsi_lun.conf";
constexpr const char *kSectionFmt = "LUN_%s";
constexpr const char *kLineFmt = "\t%s=%s\n";
constexpr int kConfLockTimeoutSec = 60;
constexpr size_t kConfPathSize = 320;    // configuration and configfs paths
constexpr size_t kSectionNameSize = 64;  // "LUN_" and a uuid

// One row of the type table: the type's bits, its name and the "devtype" it is stored as.
struct TypeInfo {
    uint32_t type;
    const char *name;
    int devtype;
};
// The row of a named type, or NULL.
const TypeInfo *TypeFind(uint32_t type);
// The "devtype" written for a type: the table's, 1 for any other type with bits 0x3 both
// set, else -1 (the type cannot be stored).
int DevtypeOf(uint32_t type);
// The type a stored "devtype" other than 1 stands for, or 0 when it names none.
uint32_t TypeOfDevtype(long devtype);

// "yes" compared without regard to case; anything else (or NULL) is no.
bool IsYes(const char *value);

// True when the record's uuid can name a section, a directory and lock files: not empty,
// terminated inside its array, without "]", "/" or a line break.
bool IsUuidUsable(const ORLOiSCSILun *lun);

// "<volume>/@iSCSI/LUN/iscsi_lun.conf" in a buffer of 320; 18990050 (logged) when the path
// does not fit or the volume is empty.
uint32_t VolumeConfPath(const char *volume, char *buf, size_t size);

// The LUN lock file ("/tmp/iscsi/lun_lock/LUN_%s.lock", or the unsync form with state flag
// 0x4) and the progress file ("/tmp/iscsi/LUN_%s.progress"); false when they do not fit.
bool LockFilePath(const ORLOiSCSILun *lun, char *buf, size_t size);
bool ProgressFilePath(const ORLOiSCSILun *lun, char *buf, size_t size);

// ---- Creations and deletions under way (lun_pending.cpp) ----
// The journal of LUN creations and deletions under way, guarded by the LUN files' lock.
constexpr const char *kPendingConfPath = "/usr/orlo/etc/iscsi_lun_pending.conf";
// Records that op ("create" or "delete") is about to change the LUN: its section
// "PENDING_<uuid>" with what recovery needs to finish or undo it.  0 or a code (logged).
uint32_t RecordPending(const ORLOiSCSILun *lun, const char *op);
// Removes the LUN's record (a missing one is fine).
void ClearPending(const char *uuid);
// Finishes or undoes the operations whose process is gone and removes stale progress
// files.  creationLockHeld: the caller holds the LUN creation lock; otherwise it is tried
// without waiting and recovery is left to its holder when busy.
void RecoverPending(bool creationLockHeld);

}  // namespace lun
}  // namespace orlo

// The filter test of one section: 0 accepted, 18990430 rejected, another code on failure.
uint32_t ORLOiSCSILunFilterApply(const ORLOiSCSILunFilter *filter, const OLIBC_SZHASH *section);

// Writes the LUN's section into the file at path (the caller holds the LUN files' lock):
// checks the record, replaces a present section, or makes the LUN's directories and
// appends the section.
uint32_t ORLOiSCSILunConfSetSection(const ORLOiSCSILun *lun, const char *path);

// Removes the LUN's section from the file at path; a missing file is success.
uint32_t ORLOiSCSILunConfRemoveSection(const ORLOiSCSILun *lun, const char *path);

#endif
