// Makes a stored LUN present in the kernel target as a backstore: the directory under
// the host of its kind, the control string that names its data, its identity
// attributes, and finally the switch.  The backstore's existence is what "loaded"
// means: an existing one is left as it is, and a failed load removes the directory it
// made, so no half-configured backstore is ever left behind.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"
#include "lun/lun_kernel.h"
#include "orlo_storage.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_ep.h"
#include "platform/os_seam.h"

namespace {

// The attribute writes after the control string, in the kernel's order of need.
uint32_t WriteAttributes(const ORLOiSCSILun *lun, const char *dir) {
    // The virtual-disk kinds (all of bits 0x27) are watched by the hypervisor, not by
    // the appliance's resource monitor, and flush on every sync-cache command.
    const int virtualDisk = ORLO_ISCSI_LUN_TYPE_HAS(lun->type, 0x27u) ? 1 : 0;
    struct TextAttr {
        const char *leaf;
        const char *value;
    };
    const TextAttr texts[] = {
        {"wwn/vpd_unit_serial", lun->vpdUnitSerial},
        {"attrib/uuid", lun->uuid},
        {"attrib/lun_name", lun->name},
    };
    struct IntAttr {
        const char *leaf;
        int value;
    };
    const IntAttr ints[] = {
        {"attrib/is_skip_resource_monitor", virtualDisk},
        {"attrib/emulate_sync_cache", virtualDisk},
        {"alua/default_tg_pt_gp/alua_access_type", 1},
    };
    char path[orlo::lun::kConfigfsPathSize];
    for (const TextAttr &a : texts) {
        uint32_t ret = orlo::lun::BackstoreAttrPath(dir, a.leaf, path, sizeof(path));
        if (ret != ORLO_OK) return ret;
        ret = ORLOiSCSIConfigfsWrite(path, a.value);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, a.value, ORLOiSCSIErrStr(ret));
            return ORLO_ERR_WRITE_FILE;
        }
    }
    for (const IntAttr &a : ints) {
        uint32_t ret = orlo::lun::BackstoreAttrPath(dir, a.leaf, path, sizeof(path));
        if (ret != ORLO_OK) return ret;
        ret = ORLOiSCSIConfigfsPutInteger(path, a.value);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", path, a.value, ORLOiSCSIErrStr(ret));
            return ORLO_ERR_WRITE_FILE;
        }
    }
    return ORLO_OK;
}

// Everything after the directory was made; a failure here has the directory removed.
uint32_t Configure(const ORLOiSCSILun *lun, const char *dir) {
    char control[orlo::lun::kControlSize];
    uint32_t ret = ORLOiSCSIConfigfsPrepareControlInitString(lun, control, sizeof(control));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPrepareControlInitString(%p, %p, %zu) failed, err=%s",
                     static_cast<const void *>(lun), static_cast<void *>(control), sizeof(control),
                     ORLOiSCSIErrStr(ret));
        return ret == orlo::lun::kErrBadLunType ? ret : static_cast<uint32_t>(ORLO_ERR_PARSE_STRING);
    }
    ret = ORLOiSCSILunConfigfsControl(lun, control);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsControl(%p, %p) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(control), ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = WriteAttributes(lun, dir);
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSILunConfigfsEnable(lun, 1);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsEnable(%p, true) failed, err=%s", static_cast<const void *>(lun),
                     ORLOiSCSIErrStr(ret));
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunLoad(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // A BLOCK LUN's root path names its device, not a volume; its control string
    // checks the device instead.
    int volumeNumber = -1;
    if (lun->type != ORLO_ISCSI_LUN_TYPE_BLOCK) {
        volumeNumber = ORLOVolIDParse(lun->rootPath);
        if (volumeNumber < 0) {
            ORLO_LOG_ERR("ORLOVolIDParse(\"%s\") failed", lun->rootPath);
            return orlo::lun::kErrParseVolumeId;
        }
    }
    if (ORLOSpaceCanEnable(lun->name) < 1) {
        ORLO_LOG_ERR("%s can not enable", lun->name);
        return ORLO_ERR_DEFAULT;
    }
    if (ORLO_ISCSI_LUN_IS_ADV(lun->type)) {
        uint32_t ret = ORLOiSCSIEpEnable(volumeNumber);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpEnable(%d) failed, err=%s", volumeNumber, ORLOiSCSIErrStr(ret));
            return orlo::lun::kErrEnablePool;
        }
    }
    char dir[orlo::lun::kConfigfsPathSize];
    uint32_t ret = ORLOiSCSILunConfigfsDirPath(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ORLO_ERR_PARSE_STRING;
    }
    if (orlo::os::Mkdir(dir, S_IRWXU) != 0) {
        if (errno == EEXIST) return ORLO_OK;  // loaded already: left as it is
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", dir);
        return ORLO_ERR_MKDIR;
    }
    ret = Configure(lun, dir);
    if (ret != ORLO_OK && orlo::os::Rmdir(dir) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", dir);
    return ret;
}
