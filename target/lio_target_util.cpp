// Paths, checks and attribute writes shared by the target-node builders.
#include "target/lio_target_util.h"

#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_configfs.h"

namespace orlo {
namespace target {
namespace lio {

uint32_t CheckIqn(const char *iqn) {
    if (iqn == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (iqn[0] == '\0' || strchr(iqn, '/') != nullptr || strcmp(iqn, ".") == 0 || strcmp(iqn, "..") == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    return ORLO_OK;
}

uint32_t TpgFilePath(const char *iqn, const char *leaf, char *buf) {
    return FormatPath(buf, kTpgFileFmt, iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, leaf);
}

uint32_t TpgWrite(const char *iqn, const char *leaf, const char *text) {
    char path[kPathSize];
    uint32_t ret = TpgFilePath(iqn, leaf, path);
    if (ret != ORLO_OK) return ret;
    if ((ret = ORLOiSCSIConfigfsWrite(path, text)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsWrite(\"%s\", \"%s\") failed, err=%s", path, text, ORLOiSCSIErrStr(ret));
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}

uint32_t TpgPutInteger(const char *iqn, const char *leaf, int value) {
    char path[kPathSize];
    uint32_t ret = TpgFilePath(iqn, leaf, path);
    if (ret != ORLO_OK) return ret;
    if ((ret = ORLOiSCSIConfigfsPutInteger(path, value)) != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfigfsPutInteger(\"%s\", %d) failed, err=%s", path, value, ORLOiSCSIErrStr(ret));
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}

int OrloInfoGet(const char *key, char *buf, size_t size) {
    if (!OLIBCFileExist(kOrloInfoDefaults)) return -1;
    int len = OLIBCFileGetKeyValue(kOrloInfoDefaults, key, buf, size);
    if (len < 0) {
        int err = OLIBCErrGet();
        if (err != OLIBC_ERR_NOT_FOUND) {
            ORLO_LOG_PLATFORM("OLIBCFileGetKeyValue(\"%s\", \"%s\", %p, %zu)", kOrloInfoDefaults, key,
                              static_cast<void *>(buf), size);
        }
        buf[0] = '\0';
        return -1;
    }
    return len;
}

int CmdsnDepth() {
    constexpr int kDefaultCmdsnDepth = 16;
    constexpr int kMaxCmdsnDepth = 512;  // the kernel's most
    char value[16];
    if (OrloInfoGet("iscsitrg_cmdsn_depth", value, sizeof(value)) < 0) return kDefaultCmdsnDepth;
    char *end = nullptr;
    errno = 0;
    long depth = strtol(value, &end, 10);
    if (end == value || *end != '\0' || errno != 0 || depth < 1) return kDefaultCmdsnDepth;
    return depth > kMaxCmdsnDepth ? kMaxCmdsnDepth : static_cast<int>(depth);
}

}  // namespace lio
}  // namespace target
}  // namespace orlo
