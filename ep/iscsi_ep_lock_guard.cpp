// The pool lock as a scope object.
#include <stdexcept>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

ORLOiSCSIEpLockGuard::ORLOiSCSIEpLockGuard(int volumeNumber) { Take(volumeNumber); }

ORLOiSCSIEpLockGuard::ORLOiSCSIEpLockGuard(const char *volumePath) {
    int n = orlo::ep::VolumeNumber(volumePath);
    if (n < 0) throw std::runtime_error("ORLOiSCSIEpLockGuard()");
    Take(n);
}

void ORLOiSCSIEpLockGuard::Take(int volumeNumber) {
    uint32_t ret = ORLOiSCSIEpLock(&fd_, volumeNumber);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpLock(%p, %d) failed, err=%s", static_cast<void *>(&fd_), volumeNumber,
                     ORLOiSCSIErrStr(ret));
        throw std::runtime_error("ORLOiSCSIEpLockGuard()");
    }
}

ORLOiSCSIEpLockGuard::~ORLOiSCSIEpLockGuard() {
    uint32_t ret = ORLOiSCSIEpUnlock(fd_);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpUnlock(%d) failed, err=%s", fd_, ORLOiSCSIErrStr(ret));
}
