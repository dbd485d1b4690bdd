// Paths of the extent pool's files, built into the callers' fixed buffers; a path that
// does not fit is refused, never cut.
#include <cstdarg>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

namespace orlo {
namespace ep {

uint32_t PathBuild(char *buf, size_t size, const char *fmt, ...) {
    if (buf == nullptr || size == 0 || fmt == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    va_list ap;
    va_start(ap, fmt);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    int n = vsnprintf(buf, size, fmt, ap);
#pragma GCC diagnostic pop
    va_end(ap);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        buf[0] = '\0';
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

namespace {
uint32_t OnVolume(const char *volume, const char *fmt, char *buf, size_t size) {
    if (volume == nullptr || volume[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return PathBuild(buf, size, fmt, volume);
}
}  // namespace

uint32_t PoolDirPath(const char *volume, char *buf, size_t size) { return OnVolume(volume, "%s/@iSCSI/EP", buf, size); }
uint32_t TblPath(const char *volume, char *buf, size_t size) { return OnVolume(volume, "%s/@iSCSI/EP/EP_TBL", buf, size); }
uint32_t FriPath(const char *volume, char *buf, size_t size) { return OnVolume(volume, "%s/@iSCSI/EP/EP_FRI", buf, size); }
uint32_t DatPath(const char *volume, char *buf, size_t size) { return OnVolume(volume, "%s/@iSCSI/EP/EP_DAT", buf, size); }
uint32_t BufPath(const char *volume, char *buf, size_t size) { return OnVolume(volume, "%s/@iSCSI/EP/EP_BUF", buf, size); }
uint32_t RodPath(const char *volume, char *buf, size_t size) { return OnVolume(volume, "%s/@iSCSI/EP/EP_ROD", buf, size); }
uint32_t TrashDirPath(const char *volume, char *buf, size_t size) {
    return OnVolume(volume, "%s/@iSCSI/EP_unmap", buf, size);
}

uint32_t DatNPath(const char *volume, int n, char *buf, size_t size) {
    if (volume == nullptr || volume[0] == '\0' || n < 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return PathBuild(buf, size, "%s/@iSCSI/EP/EP_DAT_%05d", volume, n);
}

uint32_t TrashEntryPath(const char *volume, const char *name, char *buf, size_t size) {
    if (volume == nullptr || volume[0] == '\0' || name == nullptr || name[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    return PathBuild(buf, size, "%s/@iSCSI/EP_unmap/%s", volume, name);
}

uint32_t JnlPath(const char *root, char *buf, size_t size) { return OnVolume(root, "%s/" EP_JNL_FILE_NAME, buf, size); }

uint32_t PoolConfigfsPath(int volumeNumber, const char *attr, char *buf, size_t size) {
    if (attr == nullptr || attr[0] == '\0') return PathBuild(buf, size, EP_CONFIGFS_POOL_FMT, volumeNumber);
    return PathBuild(buf, size, EP_CONFIGFS_POOL_FMT "/%s", volumeNumber, attr);
}

}  // namespace ep
}  // namespace orlo
