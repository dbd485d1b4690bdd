// Takes the system's one journal lock: journal creation and moves happen under it.  It
// waits for ever.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpJournalLock(int32_t *fd) {
    if (fd == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *fd = -1;
    static const char kPath[] = "/tmp/ep_journal_access.lock";
    int handle = -1;
    if (!OLIBCFileLockTimeByFile(kPath, 1, -1, &handle)) {
        ORLO_LOG_LOCK_FAILED(kPath);
        return ORLO_ERR_LOCK_FILE;
    }
    *fd = handle;
    return ORLO_OK;
}
