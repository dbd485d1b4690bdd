// The backstore directory of a LUN in the kernel target: the host directory of the
// LUN's kind and, below it, the backstore named after the LUN's uuid.  A LUN whose map
// file waits in the extent pool's trash lives in the trash host as "UNMAP_LUN_<uuid>";
// an unsynchronised LUN is "UNSYNC_LUN_<uuid>"; every other LUN is "LUN_<uuid>".
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "orloiscsi_configfs.h"

namespace {

typedef uint32_t (*HbaPathFn)(const char *name, char *buf, size_t size);

struct HostChoice {
    HbaPathFn build;
    const char *fnName;  // for the log line of a failing builder
};

// The host directory's builder, in the order the kinds are told apart; false for a
// type that has no backstore kind.
bool ChooseHost(const ORLOiSCSILun *lun, HostChoice *out) {
    if (lun->stateFlags & ORLO_ISCSI_LUN_STATE_EP_UNMAP)
        *out = {ORLOiSCSIConfigfsTrashLunHbaPath, "ORLOiSCSIConfigfsTrashLunHbaPath"};
    else if (ORLO_ISCSI_LUN_IS_ADV(lun->type))
        *out = {ORLOiSCSIConfigfsEpLunHbaPath, "ORLOiSCSIConfigfsEpLunHbaPath"};
    else if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type))
        *out = {ORLOiSCSIConfigfsFileLunHbaPath, "ORLOiSCSIConfigfsFileLunHbaPath"};
    else if (lun->type == ORLO_ISCSI_LUN_TYPE_BLOCK)
        *out = {ORLOiSCSIConfigfsBlockLunHbaPath, "ORLOiSCSIConfigfsBlockLunHbaPath"};
    else
        return false;
    return true;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsDirPath(const ORLOiSCSILun *lun, char *buf, size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    char name[orlo::lun::kSectionNameSize];
    const char *fmt = (lun->stateFlags & ORLO_ISCSI_LUN_STATE_EP_UNMAP) ? "UNMAP_LUN_%s"
                      : (lun->stateFlags & ORLO_ISCSI_LUN_STATE_UNSYNC) ? "UNSYNC_LUN_%s"
                                                                         : "LUN_%s";
    int n = snprintf(name, sizeof(name), fmt, lun->uuid);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(name)) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", sizeof(name));
        return ORLO_ERR_PARSE_STRING;
    }
    HostChoice host;
    if (!ChooseHost(lun, &host)) {
        ORLO_LOG_ERR("Unknown lun type: %d (%s)", static_cast<int>(lun->type), ORLOiSCSILunTypeName(lun->type));
        return orlo::lun::kErrBadLunType;
    }
    uint32_t ret = host.build(name, buf, size);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("%s(\"%s\", %p, %zu) failed, err=%s", host.fnName, name, static_cast<void *>(buf), size,
                     ORLOiSCSIErrStr(ret));
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
