// What starting a clone or a mirror needs before writing to the kernel: the child's
// control file, the parent's kernel object name (the last component of its configfs
// directory, for example "LUN_<uuid>") and the parent map file's UUID.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep/iscsi_ep_relation.h"
#include "ep_internal.h"

namespace orlo {
namespace ep {

uint32_t RelationPrepare(const char *parentMapPath, const char *parentConfigfsDir, const char *childConfigfsDir,
                         RelationArgs *args) {
    if (parentMapPath == nullptr || parentMapPath[0] == '\0' || parentConfigfsDir == nullptr ||
        childConfigfsDir == nullptr || childConfigfsDir[0] == '\0' || args == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    size_t len = strlen(parentConfigfsDir);
    while (len > 0 && parentConfigfsDir[len - 1] == '/') --len;
    size_t start = len;
    while (start > 0 && parentConfigfsDir[start - 1] != '/') --start;
    if (len == start || len - start >= sizeof(args->parentName)) {
        ORLO_LOG_ERR("Bad parent configfs directory: \"%s\"", parentConfigfsDir);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    memcpy(args->parentName, parentConfigfsDir + start, len - start);
    args->parentName[len - start] = '\0';
    uint32_t ret = PathBuild(args->control, sizeof(args->control), "%s/control", childConfigfsDir);
    if (ret != ORLO_OK) return ret;
    ret = ORLOiSCSIEpFileUuidGet(parentMapPath, args->parentUuid);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpFileUuidGet(\"%s\", %p) failed, err=%s", parentMapPath,
                     static_cast<void *>(args->parentUuid), ORLOiSCSIErrStr(ret));
    return ret;
}

}  // namespace ep
}  // namespace orlo
