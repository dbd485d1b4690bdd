// Whether some target has a stored mapping of a LUN: a section "iSCSI_MAP_T<tid>_L<lid>"
// with the LUN's lid in the mapping file, read under the file's shared lock.
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"

namespace {

constexpr const char *kMappingConfPath = "/usr/orlo/etc/iscsi_mapping.conf";
constexpr const char *kMappingLockPath = "/tmp/iscsi/iscsi_mapping.conf.lock";
constexpr int kLockTimeoutSec = 60;

// The lid of a mapping section's name, or -1 when the name is no mapping's.
int LidOfSection(const char *name) {
    int tid = 0, lid = 0, end = 0;
    if (sscanf(name, "iSCSI_MAP_T%d_L%d%n", &tid, &lid, &end) != 2 || name[end] != '\0') return -1;
    return lid;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunIsMapped(const ORLOiSCSILun *lun, int *mapped) {
    if (lun == nullptr || mapped == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    *mapped = 0;
    orlo::FileLockGuard lock(kMappingLockPath, false, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    if (!OLIBCFileExist(kMappingConfPath)) return ORLO_OK;
    orlo::SzListGuard sections;
    if (OLIBCFileEnumSection(kMappingConfPath, sections.addr()) < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileEnumSection(\"%s\", %p)", kMappingConfPath, static_cast<void *>(sections.addr()));
        return ORLO_ERR_ENUM_SECTION;
    }
    for (int i = 0; i < OLIBCSzListCount(sections.get()); ++i) {
        const char *name = OLIBCSzListGet(sections.get(), i);
        if (name != nullptr && LidOfSection(name) == lun->lid) {
            *mapped = 1;
            break;
        }
    }
    return ORLO_OK;
}
