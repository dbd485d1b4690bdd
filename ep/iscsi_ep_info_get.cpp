// A volume's pool at a glance: whether it exists, its extent size, UUID and used space
// (with the free index's counts), and whether it and its unmap and offloaded-copy
// parts are on in the kernel.
#include <unistd.h>

#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"

namespace {
bool SwitchOn(int n, const char *name) {
    char attr[320];
    int v = 0;
    return orlo::ep::PoolConfigfsPath(n, name, attr, sizeof(attr)) == ORLO_OK && orlo::os::Access(attr, F_OK) == 0 &&
           ORLOiSCSIConfigfsGetInteger(attr, &v) == ORLO_OK && v == 1;
}
}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpInfoGet(const char *volume, ORLOiSCSIEpInfo *info) {
    if (volume == nullptr || volume[0] == '\0' || info == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    ORLOiSCSIEpInfo out;
    memset(&out, 0, sizeof(out));
    uint32_t ret = ORLOiSCSIEpExtentSizeAndShiftGet(volume, &out.extentSize, &out.extentShift);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpExtentSizeAndShiftGet(\"%s\", %p, %p) failed, err=%s", volume,
                     static_cast<void *>(&out.extentSize), static_cast<void *>(&out.extentShift), ORLOiSCSIErrStr(ret));
        return ret;
    }
    out.exists = out.extentSize != 0;
    if (out.exists) {
        char tbl[EP_PATH_SIZE], fri[EP_PATH_SIZE];
        if ((ret = orlo::ep::TblPath(volume, tbl, sizeof(tbl))) != ORLO_OK ||
            (ret = orlo::ep::FriPath(volume, fri, sizeof(fri))) != ORLO_OK)
            return ret;
        ret = ORLOiSCSIEpFileUuidGet(tbl, out.uuid);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpFileUuidGet(\"%s\", %p) failed, err=%s", tbl, static_cast<void *>(out.uuid),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
        ret = ORLOiSCSIEpUsedSpaceGet(volume, &out.usedBytes);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpUsedSpaceGet(\"%s\", %p) failed, err=%s", volume,
                         static_cast<void *>(&out.usedBytes), ORLOiSCSIErrStr(ret));
            return ret;
        }
        unsigned char block[EP_BLOCK_SIZE];
        if (orlo::os::Access(fri, F_OK) == 0 && ORLOiSCSIEpFileFriHeaderGet(fri, block) == ORLO_OK) {
            out.totalExtents = orlo::ep::Get64(block, EP_FRI_OFF_TOTAL);
            out.freeExtents = orlo::ep::Get64(block, EP_FRI_OFF_FREE);
        }
    }
    // Whether the kernel has the pool; a path on no volume has no pool there.
    int n = ORLOVolIDParse(volume);
    if (n > 0) {
        ret = ORLOiSCSIEpIsEnabled(n, &out.enabled);
        if (ret != ORLO_OK) return ret;
        if (out.enabled) {
            out.unmapEnabled = SwitchOn(n, "unmap_enable");
            out.rodEnabled = SwitchOn(n, "rod_enable");
        }
    }
    *info = out;
    return ORLO_OK;
}
