// The control string of a LUN, by its kind: extent pool, file, or block device.  The
// kinds are a table, tried in order; the first whose type bits the LUN has builds it.
#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "lun/lun_kernel.h"

namespace {

typedef uint32_t (*BuildFn)(const ORLOiSCSILun *lun, char *buf, size_t size);

struct ControlKind {
    bool (*matches)(uint32_t type);
    BuildFn build;
    const char *tcmName;  // names the kind in the log line of a failure
};

const ControlKind kKinds[] = {
    {[](uint32_t t) { return ORLO_ISCSI_LUN_IS_ADV(t); }, ORLOiSCSIConfigfsEpControlInitString, "epio"},
    {[](uint32_t t) { return ORLO_ISCSI_LUN_IS_FILE_BACKED(t); }, ORLOiSCSIConfigfsFileControlInitString, "fileio"},
    {[](uint32_t t) { return t == ORLO_ISCSI_LUN_TYPE_BLOCK; }, ORLOiSCSIConfigfsBlockControlInitString, "iBlock"},
};

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsPrepareControlInitString(const ORLOiSCSILun *lun, char *buf,
                                                                           size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    buf[0] = '\0';
    for (const ControlKind &kind : kKinds) {
        if (!kind.matches(lun->type)) continue;
        uint32_t ret = kind.build(lun, buf, size);
        if (ret != ORLO_OK)
            ORLO_LOG_ERR("Failed to get TCM %s control init string. lid: %d, name: %s", kind.tcmName, lun->lid,
                         lun->name);
        return ret;
    }
    ORLO_LOG_ERR("Failed to add lun, Unknow lun type, lid:%d name:%s", lun->lid, lun->name);
    return orlo::lun::kErrBadLunType;
}
