// The control string of a BLOCK LUN: the block device its root path names.  The device
// is also written to the backstore's "udev_path", where administrators' tools read it.
#include <cctype>
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "orlo_storage.h"
#include "orloiscsi_configfs.h"

namespace {

// Copies src without its leading and trailing blanks; false when nothing is left or
// it does not fit.
bool Trim(const char *src, char *out, size_t size) {
    while (*src != '\0' && isspace(static_cast<unsigned char>(*src))) ++src;
    size_t len = strlen(src);
    while (len > 0 && isspace(static_cast<unsigned char>(src[len - 1]))) --len;
    if (len == 0 || len >= size) {
        out[0] = '\0';
        return false;
    }
    memcpy(out, src, len);
    out[len] = '\0';
    return true;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsBlockControlInitString(const ORLOiSCSILun *lun, char *buf,
                                                                         size_t size) {
    if (lun == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char dir[orlo::lun::kConfigfsPathSize];
    uint32_t ret = ORLOiSCSILunConfigfsDirPath(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ORLO_ERR_PARSE_STRING;
    }
    ORLO_SPACE_INFO info;
    if (ORLOSpaceInfoGet(lun->rootPath, &info) < 1) {
        ORLO_LOG_ERR("ORLOSpaceInfoGet(\"%s\", %p) failed", lun->rootPath, static_cast<void *>(&info));
        return ORLO_ERR_STAT_PATH;
    }
    // The root path itself must name the device: a path on a mounted volume would
    // otherwise hand the whole volume's device to initiators.
    if (!info.isBlockDevice || strncmp(info.szDevice, "/dev/", 5) != 0 || strncmp(lun->rootPath, "/dev/", 5) != 0) {
        ORLO_LOG_ERR("lid:%d name:%s szRootPath:%s IBLOCK: Please reference a valid /dev/ block_device", lun->lid,
                     lun->name, lun->rootPath);
        return ORLO_ERR_BAD_PARAMETER;
    }
    char udevPath[sizeof(info.szDevice)];
    if (!Trim(lun->rootPath, udevPath, sizeof(udevPath))) {
        ORLO_LOG_ERR("Failed to trim szRootPath[%s] to szUdevPath[%s]", lun->rootPath, udevPath);
        return ORLO_ERR_PARSE_STRING;
    }
    char attr[orlo::lun::kConfigfsPathSize];
    ret = orlo::lun::BackstoreAttrPath(dir, "udev_path", attr, sizeof(attr));
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIConfigfsWrite(attr, udevPath);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", attr, udevPath, ORLOiSCSIErrStr(ret));
        return ret;
    }
    int n = snprintf(buf, size, "udev_path=%s", udevPath);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
