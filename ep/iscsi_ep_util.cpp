// Small steps the pool operations share: growing a file to the length its kind needs and
// turning a volume path into the volume number the kernel knows the pool by.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"

namespace orlo {
namespace ep {

uint32_t FileGrow(const char *path, uint64_t length) {
    if (path == nullptr || path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    // Pool files are never reached through a link: one planted in a LUN directory must
    // not make us grow some other file.
    int fd = os::Open(path, O_WRONLY | O_CREAT | O_NOFOLLOW | O_LARGEFILE | O_CLOEXEC, 0600);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_WRONLY | O_CREAT | O_NOFOLLOW, 0600) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    FdGuard guard(fd);
    struct stat st;
    if (fstat(fd, &st) != 0) {
        ORLO_LOG_ERR("fstat(%d) failed, err=%m", fd);
        return ORLO_ERR_STAT_PATH;
    }
    if (!S_ISREG(st.st_mode)) {
        ORLO_LOG_ERR("Not a file. path: %s", path);
        return ORLO_ERR_BAD_FILE_TYPE;
    }
    if (static_cast<uint64_t>(st.st_size) >= length) return ORLO_OK;
    if (ftruncate(fd, static_cast<off_t>(length)) != 0) {
        ORLO_LOG_ERR("ftruncate(%d, %llu) failed, err=%m", fd, static_cast<unsigned long long>(length));
        return errno == ENOSPC || errno == EFBIG ? ORLO_ERR_OUT_OF_SPACE : ORLO_ERR_TRUNCATE_FILE;
    }
    return ORLO_OK;
}

int VolumeNumber(const char *volume) {
    int n = volume != nullptr ? ORLOVolIDParse(volume) : -1;
    if (n < 0) ORLO_LOG_ERR("ORLOVolIDParse(\"%s\") failed", volume != nullptr ? volume : "(null)");
    return n;
}

}  // namespace ep
}  // namespace orlo
