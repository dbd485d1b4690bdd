#include "base/configfs_paths.h"

#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "service/lio_version.h"

namespace orlo {

const char *BackstoreHostDir(BackstoreHost host) {
    switch (host) {
        case BackstoreHost::Block: return "/config/target/core/iblock_0";
        case BackstoreHost::File: return "/config/target/core/fileio_0";
        case BackstoreHost::Ep: return getTCMHBAEPIO();
        case BackstoreHost::Trash: return getTCMHBATrash();
    }
    return "";
}

uint32_t GetLUNConfigFSPath(const char *host, const char *name, char *buf, size_t size) {
    int n = snprintf(buf, size, "%s/%s", host, name);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf(%p, %zu, \"%%s/%%s\", \"%s\", \"%s\") failed: path too long", static_cast<void *>(buf),
                     size, host, name);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

uint32_t BuildBackstorePath(BackstoreHost host, BackstoreFile file, const char *name, char *buf, size_t size) {
    if (name == nullptr || buf == nullptr || size == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    const char *dir = BackstoreHostDir(host);
    if (file == BackstoreFile::None) return GetLUNConfigFSPath(dir, name, buf, size);
    const char *leaf = file == BackstoreFile::Control ? "control" : file == BackstoreFile::Enable ? "enable" : "info";
    int n = snprintf(buf, size, "%s/%s/%s", dir, name, leaf);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu: %s/%s/%s", size, dir, name, leaf);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

const char *ConfigfsLogValue(const char *path, const char *value) {
    const char *leaf = strrchr(path, '/');
    leaf = leaf != nullptr ? leaf + 1 : path;
    return strncmp(leaf, "password", 8) == 0 ? "********" : value;
}

}  // namespace orlo
