// Loads every stored LUN into its backstore.  One LUN that cannot be loaded (its volume
// missing, its data damaged) must not keep the others from serving: it is logged and
// the walk goes on; the first failure is returned.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunServiceStartAllWithoutLock(void) {
    ORLOiSCSILunList list;
    memset(&list, 0, sizeof(list));
    // Backup objects are LUNs the kernel serves too.
    uint32_t ret = ORLOiSCSILunConfGetAll(&list, ORLO_ISCSI_LUN_FILTER_BKP);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfGetAll(%p, 0x%x) failed, err=%s", static_cast<void *>(&list),
                     ORLO_ISCSI_LUN_FILTER_BKP, ORLOiSCSIErrStr(ret));
        return ret;
    }
    auto freeList = orlo::MakeScopeExit([&] { ORLOiSCSILunListFree(&list); });
    uint32_t first = ORLO_OK;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, lun) {
        ret = ORLOiSCSILunLoad(lun);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSILunLoad(%p) failed, err=%s. lid: %d, name: %s", static_cast<void *>(lun),
                         ORLOiSCSIErrStr(ret), lun->lid, lun->name);
            if (first == ORLO_OK) first = ret;
        }
    }
    return first;
}
