// Writes one section of a configuration file: replaced in place when present, appended
// when not, the file created first when missing.  The caller holds the file's lock.
#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_internal.h"

namespace {

constexpr int kScratchHashCapacity = 512;
constexpr const char *kKeyLineFormat = "\t%s=%s\n";

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIPutSectionToConfig(const char *path, const char *section,
                                                            const OLIBC_SZHASH *pHash) {
    if (path == nullptr || path[0] == '\0' || section == nullptr || section[0] == '\0' || pHash == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // Refuse what cannot be written as one header and one line per key, before the file
    // is touched.
    if (!orlo::olibc::IsValidSectionName(section)) {
        ORLO_LOG_ERR("Bad parameters, invalid section name: \"%s\"", orlo::olibc::Printable(section).c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    const char *key = nullptr;
    const char *value = nullptr;
    for (int i = 0; OLIBCSzHashEnum(pHash, i, &key, &value); ++i) {
        if (!orlo::olibc::IsValidKey(key)) {
            ORLO_LOG_ERR("Bad parameters, invalid key: \"%s\" in section %s", orlo::olibc::Printable(key).c_str(),
                         section);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return ORLO_ERR_BAD_PARAMETER;
        }
        if (!orlo::olibc::IsValidValue(value)) {
            ORLO_LOG_ERR("Bad parameters, invalid value of key %s in section %s", key, section);
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return ORLO_ERR_BAD_PARAMETER;
        }
    }

    orlo::SzHashGuard scratch(OLIBCSzHashAlloc(kScratchHashCapacity));
    if (scratch.get() == nullptr) {
        ORLO_LOG_ERR("Failed to alloc pshHash");
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    if (!OLIBCFileExist(path) && OLIBCFileTouch(path) < 0) {
        ORLO_LOG_ERR("Failed to touch %s", path);
        OLIBCErrSet(OLIBC_ERR_CONF);
        return ORLO_ERR_TOUCH_FILE;
    }
    int found = OLIBCFileGetSection(path, section, scratch.addr());
    if (found < 0) {
        ORLO_LOG_ERR("Failed to get section: %s from %s, errno=0x%X", section, path, OLIBCErrGet());
        OLIBCErrSet(OLIBC_ERR_CONF);
        return ORLO_ERR_GET_SECTION;
    }
    if (found > 0) {
        if (OLIBCFileSetSection(path, section, section, pHash, kKeyLineFormat) < 1) {
            ORLO_LOG_ERR("Failed to set section: %s from %s, errno=0x%X", section, path, OLIBCErrGet());
            OLIBCErrSet(OLIBC_ERR_CONF);
            return ORLO_ERR_SET_SECTION;
        }
    } else if (OLIBCFileAddSection(path, section, pHash, kKeyLineFormat) < 1) {
        ORLO_LOG_ERR("Failed to add section: %s to %s, errno=0x%X", section, path, OLIBCErrGet());
        OLIBCErrSet(OLIBC_ERR_CONF);
        return ORLO_ERR_ADD_SECTION;
    }
    return ORLO_OK;
}
