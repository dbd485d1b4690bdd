// Scope guard of a LUN's snapshot file lock.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

ORLOiSCSISnapshotConfLockGuard::ORLOiSCSISnapshotConfLockGuard(const ORLOiSCSILun *lun) : held_(false), lunUuid_() {
    if (ORLOiSCSISnapshotConfLock(lun) != ORLO_OK) return;
    memcpy(lunUuid_, lun->uuid, sizeof(lunUuid_));
    held_ = true;
}

ORLOiSCSISnapshotConfLockGuard::~ORLOiSCSISnapshotConfLockGuard() {
    if (held_) orlo::snap::DropConfLock(lunUuid_);
}
