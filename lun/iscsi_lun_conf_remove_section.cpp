// Removes one LUN's section from one LUN file (the caller holds the LUN files' lock).
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "platform/os_seam.h"

uint32_t ORLOiSCSILunConfRemoveSection(const ORLOiSCSILun *lun, const char *path) {
    if (lun == nullptr || path == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!orlo::lun::IsUuidUsable(lun)) {
        ORLO_LOG_ERR("invalid LUN UUID. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (orlo::os::Access(path, F_OK) != 0) {
        if (errno == ENOENT) return ORLO_OK;  // no file, no section
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", path);
        return ORLO_ERR_ACCESS_PATH;
    }
    char section[orlo::lun::kSectionNameSize];
    snprintf(section, sizeof(section), orlo::lun::kSectionFmt, lun->uuid);
    if (OLIBCFileRemoveSection(path, section) < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileRemoveSection(\"%s\", \"%s\")", path, section);
        return ORLO_ERR_REMOVE_SECTION;
    }
    return ORLO_OK;
}
