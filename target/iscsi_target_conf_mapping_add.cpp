// Writes one mapping section "iSCSI_MAP_T<tid>_L<lid>" (keys tid, lid, lun in that
// order) into the mapping file, replacing it in place when present, appending it when not.
#include <cstdio>

#include "base/conf_snapshot_internal.h"
#include "base/iscsi_base_internal.h"

using namespace orlo::conf;

extern "C" ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingAdd(int32_t tid, int32_t lid, int32_t lun) {
    if (tid < ORLO_ISCSI_TID_MIN || tid > ORLO_ISCSI_TID_MAX || lid < 1 || lid > 1024 || lun < 0 ||
        lun > ORLO_ISCSI_MAPPING_LUN_MAX) {
        ORLO_LOG_ERR("Bad parameter, tid:%d lid:%d lun:%d", tid, lid, lun);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::FileLockGuard lock(kMappingLockPath, true, kLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kMappingLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("Failed to alloc for %s, errno=0X%X", kMappingConfPath, static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    char section[kSectionNameSize];
    snprintf(section, sizeof(section), kMappingSectionFmt, tid, lid);

    const bool fileExists = OLIBCFileExist(kMappingConfPath) == 1;
    bool present = false;
    if (fileExists) {
        int got = OLIBCFileGetSection(kMappingConfPath, section, hash.addr());
        if (got < 0) {
            ORLO_LOG_ERR("Failed to get section: %s from %s, errno=0x%X", section, kMappingConfPath,
                         static_cast<unsigned>(OLIBCErrGet()));
            return ORLO_ERR_GET_SECTION;
        }
        present = got > 0;
        OLIBCSzHashRemoveAll(hash.get());
    }

    char tidText[16];
    char lidText[16];
    char lunText[16];
    snprintf(tidText, sizeof(tidText), "%d", tid);
    snprintf(lidText, sizeof(lidText), "%d", lid);
    snprintf(lunText, sizeof(lunText), "%d", lun);
    const char *pairs[][2] = {{"tid", tidText}, {"lid", lidText}, {"lun", lunText}};
    for (const auto &kv : pairs) {
        if (OLIBCSzHashSetValue(hash.addr(), kv[0], kv[1]) != 0) {
            ORLO_LOG_PLATFORM("OLIBCSzHashSetValue(%p, \"%s\")", static_cast<void *>(hash.addr()), kv[0]);
            return ORLO_ERR_OUT_OF_MEMORY;
        }
    }

    if (present) {
        if (OLIBCFileSetSection(kMappingConfPath, section, section, hash.get(), kLineFmt) < 1) {
            ORLO_LOG_ERR("Failed to set section: %s from %s, errno=0x%X", section, kMappingConfPath,
                         static_cast<unsigned>(OLIBCErrGet()));
            return ORLO_ERR_SET_SECTION;
        }
        return ORLO_OK;
    }
    if (!fileExists && OLIBCFileTouch(kMappingConfPath) < 0) {
        ORLO_LOG_ERR("Failed to touch %s", kMappingConfPath);
        return ORLO_ERR_TOUCH_FILE;
    }
    if (OLIBCFileAddSection(kMappingConfPath, section, hash.get(), kLineFmt) < 1) {
        ORLO_LOG_ERR("Failed to add section: %s from %s, errno=0x%X", section, kMappingConfPath,
                     static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_ADD_SECTION;
    }
    return ORLO_OK;
}
