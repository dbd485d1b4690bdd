// Whether the kernel uses the EP journal: "/config/pool/ext_jnl_enable"; a kernel
// without the attribute (no pool module) does not.
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_configfs.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpIsJournalEnabled(bool *enabled) {
    if (enabled == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *enabled = false;
    if (orlo::os::Access(EP_JNL_ENABLE_PATH, F_OK) != 0) {
        if (errno == ENOENT) return ORLO_OK;
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", EP_JNL_ENABLE_PATH);
        return ORLO_ERR_ACCESS_PATH;
    }
    bool v = false;
    uint32_t ret = ORLOiSCSIConfigfsGetBool(EP_JNL_ENABLE_PATH, &v);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsGetBool(\"%s\", %p) failed, err=%s", EP_JNL_ENABLE_PATH, static_cast<void *>(&v),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    *enabled = v;
    return ORLO_OK;
}
