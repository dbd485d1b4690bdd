// Makes a LUN's backing object, by type: every LUN whose data is a file on a volume
// (plain, thin, advanced and the kinds built on them) gets its file, a BLOCK LUN its
// binding to a block device.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

namespace {

struct ObjectMaker {
    uint32_t type;
    uint32_t (*make)(ORLOiSCSILun *lun);
    const char *makerName;
};

const ObjectMaker kMakers[] = {
    {ORLO_ISCSI_LUN_TYPE_BLOCK, ORLOiSCSILunObjectCreateBLOCK, "ORLOiSCSILunObjectCreateBLOCK"},
    {ORLO_ISCSI_LUN_TYPE_FILE, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_THIN, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_ADV, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_SINK, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_VDISK_ADV, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_BKP_THIN, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_BKP_ADV, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_CINDER, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_BLUN, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
    {ORLO_ISCSI_LUN_TYPE_VDISK_BLUN, ORLOiSCSILunObjectCreateFILE, "ORLOiSCSILunObjectCreateFILE"},
};

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunObjectCreate(ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    for (const ObjectMaker &m : kMakers) {
        if (m.type != lun->type) continue;
        uint32_t ret = m.make(lun);
        if (ret != ORLO_OK) ORLO_LOG_ERR("%s(%p) failed, err=%s", m.makerName, static_cast<void *>(lun), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLO_LOG_ERR("Unknown lun type: %d (%s)", static_cast<int>(lun->type), ORLOiSCSILunTypeName(lun->type));
    return orlo::lun::kErrBadLunType;
}
