// Writes one LUN's section into one LUN file (the global file or a volume's copy): the
// worker behind both SetSection operations.  The caller holds the LUN files' lock.
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "platform/os_seam.h"

namespace {

constexpr int kSectionHashSize = 128;

// Why a value could not be written as one key line and read back exactly as it is, or
// NULL: the reader ends a value at a line break, drops blanks after "=" and unquotes a
// value in double quotes.
const char *ValueFault(const char *v) {
    if (strpbrk(v, "\n\r") != nullptr) return "line break";
    if (v[0] == ' ' || v[0] == '\t') return "leading blank";
    size_t n = strlen(v);
    if (n >= 2 && v[0] == '"' && v[n - 1] == '"') return "enclosed in double quotes";
    return nullptr;
}

bool HasControlChar(const char *v) {
    for (const unsigned char *p = reinterpret_cast<const unsigned char *>(v); *p != '\0'; ++p)
        if (*p < 0x20 || *p == 0x7F) return true;
    return false;
}

// The checks of the record, before anything is touched.
uint32_t CheckRecord(const ORLOiSCSILun *lun) {
    // Unterminated strings first: nothing below may read past an array.
    struct Field {
        const char *what;
        const char *value;
        size_t size;
    };
    const Field fields[] = {
        {"name", lun->name, sizeof(lun->name)},
        {"root path", lun->rootPath, sizeof(lun->rootPath)},
        {"UUID", lun->uuid, sizeof(lun->uuid)},
        {"vpd_unit_serial", lun->vpdUnitSerial, sizeof(lun->vpdUnitSerial)},
    };
    for (const Field &f : fields) {
        if (strnlen(f.value, f.size) == f.size) {
            ORLO_LOG_ERR("invalid LUN %s: longer than %zu characters. lid: %d", f.what, f.size - 1, lun->lid);
            return ORLO_ERR_BAD_PARAMETER;
        }
    }

    bool invalid = false;
    if (lun->lid < ORLO_ISCSI_LID_MIN || lun->lid > ORLO_ISCSI_LID_MAX) {
        ORLO_LOG_ERR("invalid LUN id: %d", lun->lid);
        invalid = true;
    }
    if (lun->name[0] == '\0') {
        ORLO_LOG_ERR("invalid LUN name");
        invalid = true;
    }
    if (lun->uuid[0] == '\0') {
        ORLO_LOG_ERR("invalid LUN UUID");
        invalid = true;
    }
    if (lun->vpdUnitSerial[0] == '\0') {
        ORLO_LOG_ERR("invalid LUN vpd_unit_serial");
        invalid = true;
    }
    if (lun->rootPath[0] != '\0' && lun->rootPath[0] != '/') {
        ORLO_LOG_ERR("invalid LUN root path: '%s'", lun->rootPath);
        invalid = true;
    }
    if (invalid) {
        ORLO_LOG_ERR("Bad parameters. Invalid LUN struct.");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }

    // Values that would break the section file or not read back as written.
    if (HasControlChar(lun->name)) {
        ORLO_LOG_ERR("invalid LUN name: control character. lid: %d", lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    // The uuid names the section and the LUN's directory and lock files.
    if (const char *bad = strpbrk(lun->uuid, "]/")) {
        ORLO_LOG_ERR("invalid LUN UUID: \"%c\" is not allowed. lid: %d", *bad, lun->lid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    for (const Field &f : fields) {
        const char *fault = ValueFault(f.value);
        if (fault != nullptr) {
            ORLO_LOG_ERR("invalid LUN %s: %s. lid: %d", f.what, fault, lun->lid);
            return ORLO_ERR_BAD_PARAMETER;
        }
    }

    if (orlo::lun::DevtypeOf(lun->type) < 0) {
        ORLO_LOG_ERR("Bad Lun type: %d", static_cast<int>(lun->type));
        return orlo::lun::kErrBadLunType;
    }
    return ORLO_OK;
}

// The twelve keys ("blocksize" only for 4096), in the order a reader sees them.
uint32_t FillSection(const ORLOiSCSILun *lun, POLIBC_SZHASH *hash) {
    const uint32_t type = lun->type;
    char lid[16];
    char bytes[32];
    char restored[32];
    char devtype[16];
    snprintf(lid, sizeof(lid), "%d", lun->lid);
    snprintf(bytes, sizeof(bytes), "%llu", static_cast<unsigned long long>(lun->size));
    // Sign-extended on purpose: the stored form of a negative time is its 64-bit pattern.
    snprintf(restored, sizeof(restored), "%llu",
             static_cast<unsigned long long>(static_cast<long long>(lun->restoredTime)));
    snprintf(devtype, sizeof(devtype), "%d", orlo::lun::DevtypeOf(type));
    const char *pairs[][2] = {
        {"lid", lid},
        {"rootpath", lun->rootPath},
        {"name", lun->name},
        {"uuid", lun->uuid},
        {"vpd_unit_serial", lun->vpdUnitSerial},
        {"bytes", bytes},
        {"restored_time", restored},
        {"devtype", devtype},
        {"pre_alloc", ORLO_ISCSI_LUN_TYPE_HAS(type, 0x7u) ? "no" : "yes"},
        {"bkp_obj", ORLO_ISCSI_LUN_TYPE_HAS(type, 0x47u) ? "1" : "0"},
        {"vaai_support", ORLO_ISCSI_LUN_TYPE_HAS(type, 0xFu) ? "yes" : "no"},
        {"blocksize", lun->blockSize == 4096 ? "4096" : nullptr},
    };
    for (const auto &kv : pairs) {
        if (kv[1] == nullptr) continue;
        if (OLIBCSzHashSetValue(hash, kv[0], kv[1]) != 0) {
            ORLO_LOG_ERR("Failed to set value into hash[0x%04X %s:%d]", OLIBCErrGet(), OLIBCErrorGetFile(),
                         OLIBCErrorGetLine());
            return orlo::lun::kErrSetHashValue;
        }
    }
    return ORLO_OK;
}

}  // namespace

uint32_t ORLOiSCSILunConfSetSection(const ORLOiSCSILun *lun, const char *path) {
    if (lun == nullptr || path == nullptr || path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = CheckRecord(lun);
    if (ret != ORLO_OK) return ret;

    char section[orlo::lun::kSectionNameSize];
    snprintf(section, sizeof(section), orlo::lun::kSectionFmt, lun->uuid);

    orlo::SzHashGuard hash(OLIBCSzHashAlloc(kSectionHashSize));
    if (hash.get() == nullptr) {
        ORLO_LOG_ERR("Failed to allocate hash, errno=0X%X", static_cast<unsigned>(errno));
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return ORLO_ERR_OUT_OF_MEMORY;
    }

    bool fileExists = true;
    if (orlo::os::Access(path, F_OK) != 0) {
        if (errno != ENOENT) {
            ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", path);
            return ORLO_ERR_ACCESS_PATH;
        }
        fileExists = false;
    }
    bool present = false;
    if (fileExists) {
        int found = OLIBCFileGetSection(path, section, hash.addr());
        if (found < 0) {
            ORLO_LOG_ERR("Failed to get section: %s from %s, errno=0x%X", section, path,
                         static_cast<unsigned>(OLIBCErrGet()));
            return ORLO_ERR_GET_SECTION;
        }
        present = found > 0;
        OLIBCSzHashRemoveAll(hash.get());
    }

    ret = FillSection(lun, hash.addr());
    if (ret != ORLO_OK) return ret;

    if (present) {
        if (OLIBCFileSetSection(path, section, section, hash.get(), orlo::lun::kLineFmt) < 1) {
            // Named after the call the appliance has always reported here.
            ORLO_LOG_PLATFORM("OLIBCFileTouch(\"%s\")", path);
            return ORLO_ERR_SET_SECTION;
        }
        return ORLO_OK;
    }

    if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type)) {
        ret = ORLOiSCSILunMkdir(lun);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSITrgMkdir(%p) failed, err=%s", static_cast<const void *>(lun), ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    if (!fileExists && OLIBCFileTouch(path) < 0) {
        ORLO_LOG_ERR("Failed to touch %s", path);
        return ORLO_ERR_TOUCH_FILE;
    }
    if (OLIBCFileAddSection(path, section, hash.get(), orlo::lun::kLineFmt) < 1) {
        ORLO_LOG_ERR("Failed to add section: %s to %s, errno=0x%X", section, path, static_cast<unsigned>(OLIBCErrGet()));
        return ORLO_ERR_ADD_SECTION;
    }
    return ORLO_OK;
}
