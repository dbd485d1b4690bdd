// Fills a LUN record from the keys of its section.  The type comes from "devtype" with
// "pre_alloc", "vaai_support" and "bkp_obj", or, in sections older than "devtype", from
// the root path.
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "orloiscsi_ep.h"

namespace {

// Copies at most max characters and terminates (reading never fails on a long value).
void CopyField(char *dst, size_t max, const char *src) {
    size_t n = strnlen(src, max);
    memcpy(dst, src, n);
    dst[n] = '\0';
}

bool StartsWith(const char *s, const char *prefix) { return strncmp(s, prefix, strlen(prefix)) == 0; }

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunStructCreate(ORLOiSCSILun *lun, const OLIBC_SZHASH *section) {
    if (lun == nullptr || section == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // The keys a section cannot do without, checked in this order.
    const char *required[] = {"lid", "name", "rootpath", "bytes", "pre_alloc"};
    const char *values[5];
    for (size_t i = 0; i < 5; ++i) {
        values[i] = OLIBCSzHashGetValue(section, required[i]);
        if (values[i] == nullptr) {
            ORLO_LOG_ERR("OLIBCSzHashGetValue(%p, \"%s\") failed", static_cast<const void *>(section), required[i]);
            return orlo::lun::kErrGetHashValue;
        }
    }
    const char *lid = values[0];
    const char *name = values[1];
    const char *rootPath = values[2];
    const char *bytes = values[3];
    const char *preAlloc = values[4];

    lun->lid = static_cast<int32_t>(strtol(lid, nullptr, 10));
    lun->lockHandle = -1;
    CopyField(lun->name, ORLO_ISCSI_LUN_NAME_LEN, name);
    CopyField(lun->rootPath, ORLO_ISCSI_LUN_ROOT_PATH_LEN, rootPath);
    lun->size = strtoull(bytes, nullptr, 10);
    const char *restored = OLIBCSzHashGetValue(section, "restored_time");
    lun->restoredTime = restored != nullptr ? static_cast<int32_t>(strtoull(restored, nullptr, 10)) : 0;
    const char *blockSize = OLIBCSzHashGetValue(section, "blocksize");
    lun->blockSize = (blockSize != nullptr && strtol(blockSize, nullptr, 10) == 4096) ? 4096u : 512u;

    // The type.  devtype 1 (and a volume root path without devtype) is a file LUN whose
    // kind the flag keys tell; the others name their type outright.
    const char *devtype = OLIBCSzHashGetValue(section, "devtype");
    long d = devtype != nullptr ? strtol(devtype, nullptr, 10) : 0;
    uint32_t type = 0;
    bool fileKind = false;
    if (d == 1) {
        type = ORLO_ISCSI_LUN_TYPE_FILE;
        fileKind = true;
    } else if ((type = orlo::lun::TypeOfDevtype(d)) != 0) {
        fileKind = false;
    } else if (rootPath[0] == '\0' || StartsWith(rootPath, "/dev")) {
        type = ORLO_ISCSI_LUN_TYPE_BLOCK;
    } else if (StartsWith(rootPath, "/volume")) {
        type = ORLO_ISCSI_LUN_TYPE_FILE;
        fileKind = true;
    } else {
        ORLO_LOG_ERR("unknown device type: [%s]", rootPath);
        return orlo::lun::kErrBadLunType;
    }
    if (fileKind) {
        if (!orlo::lun::IsYes(preAlloc)) type |= ORLO_ISCSI_LUN_BIT_THIN;
        if (type == ORLO_ISCSI_LUN_TYPE_THIN && orlo::lun::IsYes(OLIBCSzHashGetValue(section, "vaai_support")))
            type |= ORLO_ISCSI_LUN_BIT_ADV;
    }
    if (ORLO_ISCSI_LUN_TYPE_HAS(type, 0x7u)) {
        const char *bkp = OLIBCSzHashGetValue(section, "bkp_obj");
        if (bkp != nullptr && strtol(bkp, nullptr, 10) == 1) type |= ORLO_ISCSI_LUN_BIT_BKP;
    }
    lun->type = type;

    lun->extentSize = 0;
    if (ORLO_ISCSI_LUN_IS_ADV(type)) {
        uint32_t extentSize = 0;
        uint32_t shift = 0;
        if (ORLOiSCSIEpExtentSizeAndShiftGet(lun->rootPath, &extentSize, &shift) == 0) lun->extentSize = extentSize;
    }

    const char *uuid = OLIBCSzHashGetValue(section, "uuid");
    if (uuid != nullptr) {
        CopyField(lun->uuid, ORLO_ISCSI_UUID_LEN, uuid);
    } else {
        ORLO_LOG_ERR("warning: uuid not found in config of '%s'", lun->name);
        lun->uuid[0] = '\0';
    }
    const char *serial = OLIBCSzHashGetValue(section, "vpd_unit_serial");
    if (serial == nullptr) {
        ORLO_LOG_ERR("warning: vpd_unit_serial not found in config of '%s'", lun->name);
        lun->vpdUnitSerial[0] = '\0';
        return ORLO_OK;
    }
    CopyField(lun->vpdUnitSerial, ORLO_ISCSI_UUID_LEN, serial);
    return ORLO_OK;
}
