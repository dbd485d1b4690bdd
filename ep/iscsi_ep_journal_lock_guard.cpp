// The journal lock as a scope object.
#include <stdexcept>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

ORLOiSCSIEpJournalLockGuard::ORLOiSCSIEpJournalLockGuard() {
    uint32_t ret = ORLOiSCSIEpJournalLock(&fd_);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpJournalLock(%p) failed, err=%s", static_cast<void *>(&fd_), ORLOiSCSIErrStr(ret));
        throw std::runtime_error("ORLOiSCSIEpJournalLockGuard()");
    }
}

ORLOiSCSIEpJournalLockGuard::~ORLOiSCSIEpJournalLockGuard() {
    uint32_t ret = ORLOiSCSIEpJournalUnlock(fd_);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpJournalUnlock(%d) failed, err=%s", fd_, ORLOiSCSIErrStr(ret));
}
