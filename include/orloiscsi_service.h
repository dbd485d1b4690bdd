/*
 * Service control: the service lock and the kernel target's module sets.
 *
 * The service lock (/tmp/tcm_service_state.lock, exclusive, no time limit) serialises
 * every kernel-wide operation among processes: starting and stopping the service,
 * inserting and removing modules, the target self-test.  It is taken outside every
 * configuration-file lock, never inside one.  C++ callers hold it with
 * ORLOiSCSIServiceLockGuard; C callers pair ORLOiSCSIServiceLock and
 * ORLOiSCSIServiceUnlock.
 *
 * Module sets are numbered 1..4.  Loading any set first inserts the target-core set,
 * then the set's own modules; unloading a set removes only its own modules, last first
 * (set 3 is the target core itself).  Operations whose names end in WithoutLock expect
 * the caller to hold the service lock; the others take it for their whole run.  Every
 * function returns 0 or a result code (orloiscsi_base.h) and logs each failure once.
 * No in-process lock is taken: the lock file serialises threads and processes alike.
 */
#ifndef ORLOISCSI_SERVICE_H
#define ORLOISCSI_SERVICE_H

#include <stdint.h>

#include "orlo_export.h"

#define ISCSI_KERNEL_MODULES 1
#define VHOST_KERNEL_MODULES 2
#define TCM_KERNEL_MODULES 3
#define LOOPBACK_KERNEL_MODULES 4

/* The lock file of the service lock. */
#define ORLO_ISCSI_SERVICE_LOCK_FILE "/tmp/tcm_service_state.lock"

ORLO_EXTERN_C_BEGIN

/* Takes the service lock, waiting as long as it takes; *fd receives the handle, or -1
 * on failure (18990015). */
ORLO_EXPORT uint32_t ORLOiSCSIServiceLock(int *fd);
/* Releases a handle of ORLOiSCSIServiceLock and sets *fd to -1; a handle of -1 is
 * nothing to release.  18990016 when the release fails. */
ORLO_EXPORT uint32_t ORLOiSCSIServiceUnlock(int *fd);

/* Inserts the target-core modules and then those of the set (1..4); modules whose
 * /lib/modules/NAME.ko is missing are skipped, modules already in are left alone, and
 * the first failing insertion ends the load with 18990030. */
ORLO_EXPORT uint32_t ORLOiSCSILoadModulesWithoutLock(int module_set);
ORLO_EXPORT uint32_t ORLOiSCSILoadModules(int module_set);
/* Removes the set's own modules (set 3: the target core), last first; the first failing
 * removal ends the walk with 18990031. */
ORLO_EXPORT uint32_t ORLOiSCSIUnloadModulesWithoutLock(int module_set);
ORLO_EXPORT uint32_t ORLOiSCSIUnloadModules(int module_set);

ORLO_EXTERN_C_END

#ifdef __cplusplus
/* Holds the service lock for a scope.  The constructor waits for the lock (check
 * held(): a failure has been logged and leaves the guard without it); the destructor
 * releases it, logging a failed release and never throwing. */
class ORLO_EXPORT ORLOiSCSIServiceLockGuard {
  public:
    ORLOiSCSIServiceLockGuard();
    ~ORLOiSCSIServiceLockGuard();
    ORLOiSCSIServiceLockGuard(const ORLOiSCSIServiceLockGuard &) = delete;
    ORLOiSCSIServiceLockGuard &operator=(const ORLOiSCSIServiceLockGuard &) = delete;
    bool held() const { return fd_ >= 0; }

  private:
    int fd_ = -1;
};
#endif

#endif
