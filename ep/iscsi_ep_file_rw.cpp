// The byte-level block access every extent-pool header accessor shares: exact reads and
// writes of small blocks at fixed offsets, each opening and closing the file, and the
// checksum of a 64-byte block.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace orlo {
namespace ep {

uint32_t BlockChecksum(const void *block) {
    unsigned char copy[EP_BLOCK_SIZE];
    memcpy(copy, block, sizeof(copy));
    Put32(copy, 0, 0);
    return ORLOiSCSIFileCRC32CksumCompute(0, copy, sizeof(copy));
}

uint32_t FilePread(const char *path, void *buf, size_t len, off_t off) {
    int fd = os::Open(path, O_RDONLY | O_LARGEFILE | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_RDONLY | O_LARGEFILE) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    uint32_t ret = ORLO_OK;
    ssize_t n;
    do {
        n = pread(fd, buf, len, off);
    } while (n < 0 && errno == EINTR);
    if (n < 0 || static_cast<size_t>(n) != len) {
        if (n >= 0) errno = EIO;  // a short read: the file ends before the block does
        ORLO_LOG_ERR("pread(%d, %p, %zu, %lld) failed, err=%m", fd, buf, len, static_cast<long long>(off));
        ret = ORLO_ERR_READ_FILE;
    }
    if (close(fd) != 0) ORLO_LOG_ERR("close(%d) failed, err=%m", fd);
    return ret;
}

uint32_t FilePwrite(const char *path, const void *buf, size_t len, off_t off, bool sync) {
    int fd = os::Open(path, O_WRONLY | O_LARGEFILE | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_WRONLY | O_LARGEFILE) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    uint32_t ret = ORLO_OK;
    ssize_t n;
    do {
        n = pwrite(fd, buf, len, off);
    } while (n < 0 && errno == EINTR);
    if (n < 0 || static_cast<size_t>(n) != len) {
        if (n >= 0) errno = ENOSPC;  // a short write means the volume filled up
        ORLO_LOG_ERR("pwrite(%d, %p, %zu, %lld) failed, err=%m", fd, buf, len, static_cast<long long>(off));
        ret = errno == ENOSPC ? ORLO_ERR_OUT_OF_SPACE : ORLO_ERR_WRITE_FILE;
    } else if (sync && fsync(fd) != 0) {
        ORLO_LOG_ERR("fsync(%d) failed, err=%m", fd);
        ret = errno == ENOSPC ? ORLO_ERR_OUT_OF_SPACE : ORLO_ERR_WRITE_FILE;
    }
    if (close(fd) != 0) {
        ORLO_LOG_ERR("close(%d) failed, err=%m", fd);
        if (ret == ORLO_OK) ret = errno == ENOSPC ? ORLO_ERR_OUT_OF_SPACE : ORLO_ERR_WRITE_FILE;
    }
    return ret;
}

uint32_t BlockGet(const char *path, off_t off, void *buf, size_t len) {
    uint32_t ret = FilePread(path, buf, len, off);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("FilePread(\"%s\", %p, %zu, %zu) failed, err=%s", path, buf, len, static_cast<size_t>(off),
                     ORLOiSCSIErrStr(ret));
        return ORLO_ERR_READ_FILE;
    }
    return ORLO_OK;
}

uint32_t BlockSet(const char *path, off_t off, const void *block, bool sync) {
    unsigned char copy[EP_BLOCK_SIZE];
    memcpy(copy, block, sizeof(copy));
    Put32(copy, 0, BlockChecksum(copy));
    uint32_t ret = FilePwrite(path, copy, sizeof(copy), off, sync);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("FilePwrite(\"%s\", %p, %zu, %zu, %d) failed, err=%s", path, static_cast<void *>(copy),
                     sizeof(copy), static_cast<size_t>(off), sync ? 1 : 0, ORLOiSCSIErrStr(ret));
    return ret;
}

}  // namespace ep
}  // namespace orlo
