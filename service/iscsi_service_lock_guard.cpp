// The scope guard of the service lock.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_service.h"

ORLOiSCSIServiceLockGuard::ORLOiSCSIServiceLockGuard() {
    uint32_t ret = ORLOiSCSIServiceLock(&fd_);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIServiceLock(%p) failed, err=%s", static_cast<void *>(&fd_), ORLOiSCSIErrStr(ret));
        fd_ = -1;
    }
}

ORLOiSCSIServiceLockGuard::~ORLOiSCSIServiceLockGuard() {
    if (fd_ < 0) return;
    // Releasing must not disturb what the guarded function is about to report.
    int savedErrno = errno;
    uint32_t ret = ORLOiSCSIServiceUnlock(&fd_);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIServiceUnlock(%p) failed, err=%s", static_cast<void *>(&fd_), ORLOiSCSIErrStr(ret));
    }
    errno = savedErrno;
}
