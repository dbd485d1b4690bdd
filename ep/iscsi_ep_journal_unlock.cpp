// Releases the journal lock.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpJournalUnlock(int32_t fd) {
    if (fd < 0) return ORLO_OK;  // nothing held
    if (OLIBCFileUnlockByFile(fd) != 0) {
        ORLO_LOG_ERR("OLIBCFileUnlockByFile(%d) failed", fd);
        return ORLO_ERR_UNLOCK_FILE;
    }
    return ORLO_OK;
}
