// Writes one attribute of a LUN's backstore: "<backstore directory>/attrib/<attr>".
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_kernel.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunConfigfsAttribSet(const ORLOiSCSILun *lun, const char *attr,
                                                              const char *value) {
    if (lun == nullptr || attr == nullptr || value == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // One file of the attribute group, never a path that leads elsewhere.
    if (attr[0] == '\0' || strchr(attr, '/') != nullptr || strcmp(attr, ".") == 0 || strcmp(attr, "..") == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    char dir[orlo::lun::kConfigfsPathSize];
    uint32_t ret = ORLOiSCSILunConfigfsDirPath(lun, dir, sizeof(dir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfigfsDirPath(%p, %p, %zu) failed, err=%s", static_cast<const void *>(lun),
                     static_cast<void *>(dir), sizeof(dir), ORLOiSCSIErrStr(ret));
        return ret;
    }
    char leaf[orlo::lun::kConfigfsPathSize];
    int n = snprintf(leaf, sizeof(leaf), "attrib/%s", attr);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(leaf)) {
        ORLO_LOG_ERR("snprintf(%p, %zu, \"attrib/%%s\") failed", static_cast<void *>(leaf), sizeof(leaf));
        return ORLO_ERR_PARSE_STRING;
    }
    char path[orlo::lun::kConfigfsPathSize];
    if ((ret = orlo::lun::BackstoreAttrPath(dir, leaf, path, sizeof(path))) != ORLO_OK) return ret;
    if ((ret = ORLOiSCSIConfigfsWrite(path, value)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, value, ORLOiSCSIErrStr(ret));
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}
