// Sizes a clone's map file like its source's: the child (created when missing) grows to
// the length of the parent's map file, so it can hold the parent's whole map.
#include <sys/stat.h>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpCloneFileTrunc(const char *childMapPath, const char *parentMapPath) {
    if (childMapPath == nullptr || childMapPath[0] == '\0' || parentMapPath == nullptr || parentMapPath[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    struct stat st;
    if (orlo::os::Stat(parentMapPath, &st) != 0) {
        ORLO_LOG_ERR("stat(\"%s\") failed, err=%m", parentMapPath);
        return ORLO_ERR_STAT_PATH;
    }
    uint32_t ret = orlo::ep::FileGrow(childMapPath, static_cast<uint64_t>(st.st_size));
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("FileGrow(\"%s\", %llu) failed, err=%s", childMapPath, static_cast<unsigned long long>(st.st_size),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
