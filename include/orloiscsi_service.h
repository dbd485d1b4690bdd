/*
 * Service control: the service lock, the kernel target's module sets and stopping the
 * whole service.
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

#include <stdbool.h>
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

/* ---- Stopping the service ----
 *
 * The stops work from what the kernel's configfs tree holds, not from the configuration
 * files, so they also clear objects the files no longer know.  None of them changes a
 * configuration file.  Each goes on past a failing object and returns the first
 * failure; whatever was taken out stays out, and a repeated stop carries on from there.
 * Something already gone, or a fabric whose module is not in, is success. */

/* Stops the LUN-backup daemon (/bin/killall orlolunbkp; failure logged as
 * "ORLOLunBackupStop() failed"), the trash release (ORLOiSCSILunUnmapTrashStop) and the
 * iSNS client.  Each failure is logged and the next still stopped; the first is
 * returned.  No service lock. */
ORLO_EXPORT uint32_t ORLOiSCSIStopMiscService(void);
/* The misc stop (failure only logged), then every target node under
 * /config/target/iscsi taken out with ORLOiSCSITargetUnloadByConfigfsPath. */
ORLO_EXPORT uint32_t ORLOiSCSIStopAllWithoutLock(void);
ORLO_EXPORT uint32_t ORLOiSCSIStopAll(void);
/* Every node of /config/target/vhost, resp. /config/target/loopback: each portal group's
 * nexus dropped, its LUN entries unlinked and removed, then the group and the node. */
ORLO_EXPORT uint32_t ORLOiSCSIVhostStopAllWithoutLock(void);
ORLO_EXPORT uint32_t ORLOiSCSIVhostStopAll(void);
ORLO_EXPORT uint32_t ORLOiSCSILoopbackStopAllWithoutLock(void);
/* Loads every LUN of /usr/orlo/etc/iscsi_lun.conf (backup objects too) with
 * ORLOiSCSILunLoad; a failing LUN is logged and the others still loaded. */
ORLO_EXPORT uint32_t ORLOiSCSILunServiceStartAllWithoutLock(void);
/* Takes every backstore under the target-core hosts (/config/target/core/<host>/<name>)
 * out of the kernel.  One that a fabric LUN entry still links to is left in and counted
 * as 18990534 "LUN is mapped"; one the kernel refuses (a virtual LUN's hold) likewise.
 * When every backstore is gone, the extent pools (/config/pool/EP_<n>) are switched off
 * too, so that the extent-pool module can be removed. */
ORLO_EXPORT uint32_t ORLOiSCSILunServiceStopAllWithoutLock(void);
ORLO_EXPORT uint32_t ORLOiSCSILunServiceStopAll(void);
/* Under the service lock: stop all, loopback, vhost, LUN backstores, then the module sets
 * 1, 4, 2, 3.  Every step runs whatever the one before returned; the first failure is
 * returned. */
ORLO_EXPORT uint32_t ORLOiSCSITotallyStopAndUnload(void);
/* *in_use is set when the configuration holds any LUN or any target (backup objects
 * left out): then the service has something to serve.  No service lock. */
ORLO_EXPORT uint32_t ORLOiSCSIServiceIsInUse(bool *in_use);

/* ---- Starting the service ----
 * Under the service lock: working directories, the iSCSI module set, the plug-in daemon,
 * every LUN into its backstore, /config/target/iscsi, iSNS, every target whose stored
 * enabled flag is set (a failing target is logged and the others still started), the
 * extent-pool unmap buffer and the trash unmap.  Starting a running service succeeds. */
ORLO_EXPORT uint32_t ORLOiSCSIStartAll(void);
ORLO_EXPORT uint32_t ORLOiSCSIStartAllWithoutLock(void);
/* The iSCSI module set (18990030 "Failed to insmod kernel module") and the plug-in
 * daemon (/sbin/initctl start is_plugind; only logged). */
ORLO_EXPORT uint32_t ORLOiSCSIStartBasicWithoutLock(void);
/* Gives back, in the background, the extents of the map files left in every volume's
 * "@iSCSI/EP_unmap": one ORLOiSCSILunUnmapALUNInBackground per /volume<n> whose trash
 * holds something, in a process group of its own recorded in
 * /tmp/iscsi/iscsi_unmap_trash.pid; the call does not wait.  The stop sends SIGTERM to
 * every recorded group and waits until its processes have ended (SIGKILL after 5 s;
 * 18990010 when they outlive that too); map files not yet released stay for the next
 * run. */
ORLO_EXPORT uint32_t ORLOiSCSILunUnmapTrashInBackground(void);
ORLO_EXPORT uint32_t ORLOiSCSILunUnmapTrashStop(void);

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
