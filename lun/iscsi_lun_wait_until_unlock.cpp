// Waits, asking once a second, until no operation holds a LUN's lock.
#include <unistd.h>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunWaitUntilUnlock(const ORLOiSCSILun *lun, int seconds) {
    if (lun == nullptr || seconds < 0) {
        ORLO_LOG_BAD_PARAMS();
        return orlo::lun::kErrInvalidInput;
    }
    for (int waited = 0;; ++waited) {
        int locked = 0;
        uint32_t ret = ORLOiSCSILunIsLocked(lun, &locked);
        if (ret != ORLO_OK) return ret;
        if (!locked) return ORLO_OK;
        if (seconds > 0 && waited >= seconds) {
            ORLO_LOG_ERR("LUN is still locked after %d seconds. lid: %d, name: %.*s", seconds, lun->lid,
                         static_cast<int>(sizeof(lun->name)), lun->name);
            return ORLO_ERR_TIMEOUT;
        }
        sleep(1);
    }
}
