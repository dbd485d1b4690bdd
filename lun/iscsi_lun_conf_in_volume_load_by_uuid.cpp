// Copies one LUN, by uuid, from a volume's own copy of the LUN file.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfInVolumeLoadByUuid(const char *volume, const char *uuid,
                                                                   ORLOiSCSILun *lun) {
    if (volume == nullptr || volume[0] == '\0' || uuid == nullptr || uuid[0] == '\0' || lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char path[orlo::lun::kConfPathSize];
    uint32_t ret = orlo::lun::VolumeConfPath(volume, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    ORLOiSCSILunFilter filter = {};
    filter.flags = ORLO_ISCSI_LUN_FILTER_UUID | ORLO_ISCSI_LUN_FILTER_LOAD_LUNS;
    filter.uuid = uuid;
    ORLOiSCSILunList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSILunListFree(&list); });
    ret = ORLOiSCSILunConfLoadByPath(&filter, &list, path);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfLoadByPath(%p, %p, \"%s\") failed, err=%s", static_cast<void *>(&filter),
                     static_cast<void *>(&list), path, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *first = ORLOiSCSIListFirst(&list);
    if (first == nullptr) return orlo::lun::kErrNoSuchLun;
    *lun = *ORLO_ISCSI_LUN_OF(first);
    return ORLO_OK;
}
