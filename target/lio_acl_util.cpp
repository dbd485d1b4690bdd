// Paths, the default entry and write protection of a portal group's access lists.
#include "target/lio_acl_util.h"

#include <sys/stat.h>
#include <sys/statvfs.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"
#include "platform/os_seam.h"
#include "target/iscsi_lio_unload_util.h"

namespace orlo {
namespace target {
namespace acl {

namespace {

constexpr unsigned int kLioVersionWithoutDemoMode = 2;

// Backstore names carry the LUN's uuid after one of these prefixes.
const char *const kBackstorePrefixes[] = {"UNMAP_LUN_", "UNSYNC_LUN_", "LUN_"};

bool UuidOfBackstore(const std::string &name, std::string *uuid) {
    for (const char *p : kBackstorePrefixes) {
        size_t len = strlen(p);
        if (name.compare(0, len, p) == 0 && name.size() > len) {
            *uuid = name.substr(len);
            return true;
        }
    }
    return false;
}

}  // namespace

uint32_t FormatPath(char *buf, const char *fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    int n = vsnprintf(buf, kPathSize, fmt, ap);
    va_end(ap);
    if (n < 0 || static_cast<size_t>(n) >= kPathSize) {
        ORLO_LOG_ERR("snprintf(%p, %zu, \"%s\") failed", static_cast<void *>(buf), kPathSize, fmt);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

uint32_t CheckArgs(const char *iqn, int tpgt, const char *initiator, int lun) {
    if (iqn == nullptr || initiator == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (iqn[0] == '\0' || initiator[0] == '\0' || strchr(iqn, '/') != nullptr || strchr(initiator, '/') != nullptr ||
        tpgt < 1 || tpgt > 65535 || lun > ORLO_ISCSI_MAPPING_LUN_MAX) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    return ORLO_OK;
}

bool IsDefaultInitiator(const char *initiator) {
    return strncmp(initiator, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, sizeof(ORLO_ISCSI_DEFAULT_ACL_INITIATOR)) == 0;
}

bool DefaultEntryIsNodeAcl() { return ORLOiSCSIGetLioVersion() == kLioVersionWithoutDemoMode; }

bool WriteProtected(int32_t authority, bool volumeReadOnly) {
    if (volumeReadOnly) return true;
    return authority != ISCSI_TARGET_AUTHORITY_RW && authority != ISCSI_TARGET_AUTHORITY_LEGACY_RW;
}

uint32_t LunVolumeIsReadOnly(const char *iqn, int tpgt, int n, bool *readOnly) {
    *readOnly = false;
    char lunDir[kPathSize];
    uint32_t ret = FormatPath(lunDir, kTpgLunFmt, iqn, tpgt, n);
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> names;
    if ((ret = ListConfigfsDir(lunDir, &names)) != ORLO_OK) return ret;
    std::string uuid;
    for (const std::string &name : names) {
        std::string path;
        if ((ret = JoinConfigfsPath(lunDir, name, &path)) != ORLO_OK) return ret;
        struct stat st;
        if (os::Lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode) && UuidOfBackstore(name, &uuid)) break;
        uuid.clear();
    }
    if (uuid.empty()) {
        ORLO_LOG_ERR("No backstore is linked under %s", lunDir);
        return ORLO_ERR_FILE_NOT_FOUND;
    }
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    if ((ret = ORLOiSCSILunConfGetByUuid(uuid.c_str(), &lun)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunConfGetByUuid(\"%s\", %p) failed, err=%s", uuid.c_str(), static_cast<void *>(&lun),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (lun.rootPath[0] == '\0' || strncmp(lun.rootPath, "/dev/", 5) == 0) return ORLO_OK;
    struct statvfs vfs;
    if (os::Statvfs(lun.rootPath, &vfs) != 0) {
        ORLO_LOG_ERR("statvfs(\"%s\", %p) failed, err=%m", lun.rootPath, static_cast<void *>(&vfs));
        return ORLO_ERR_STAT_PATH;
    }
    *readOnly = (vfs.f_flag & ST_RDONLY) != 0;
    return ORLO_OK;
}

}  // namespace acl
}  // namespace target
}  // namespace orlo
