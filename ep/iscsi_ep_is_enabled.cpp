// Whether a volume's pool is on in the kernel: its directory /config/pool/EP_<n> exists
// (the kernel brings the pool up with the directory and takes it down with it).
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpIsEnabled(int volumeNumber, bool *enabled) {
    if (enabled == nullptr || volumeNumber < 1) {
        ORLO_LOG_BAD_PARAMS();
        return enabled == nullptr ? ORLO_ERR_NULL_POINTER : ORLO_ERR_BAD_PARAMETER;
    }
    char dir[320];
    uint32_t ret = orlo::ep::PoolConfigfsPath(volumeNumber, nullptr, dir, sizeof(dir));
    if (ret != ORLO_OK) return ret;
    struct stat st;
    if (orlo::os::Stat(dir, &st) != 0) {
        if (errno != ENOENT) {
            ORLO_LOG_ERR("stat(\"%s\") failed, err=%m", dir);
            return ORLO_ERR_STAT_PATH;
        }
        *enabled = false;
        return ORLO_OK;
    }
    *enabled = S_ISDIR(st.st_mode);
    return ORLO_OK;
}
