// Reads the snapshot file of the LUN of a UUID.
#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotConfLoadByParentUuid(const char *lunUuid,
                                                                      const ORLOiSCSISnapshotFilter *filter,
                                                                      ORLOiSCSISnapshotList *list) {
    if (lunUuid == nullptr || lunUuid[0] == '\0' || filter == nullptr || list == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return orlo::snap::kErrInvalidInput;
    }
    ORLOiSCSILun lun;
    uint32_t ret = ORLOiSCSILunConfGetByUuid(lunUuid, &lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfGetByUuid(\"%s\", %p) failed, err=%s", lunUuid, static_cast<void *>(&lun),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    return ORLOiSCSISnapshotConfLoadByParentLun(&lun, filter, list);
}
