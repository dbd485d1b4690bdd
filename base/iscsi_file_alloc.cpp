// Appends allocated space to a file: the blocks are reserved now, so that a LUN never
// runs out of space on writes its initiator was promised.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIFileAlloc(const char *path, uint64_t len, uint64_t *pu64Progress) {
    if (path == nullptr || path[0] == '\0' || pu64Progress == nullptr || len == 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (len > static_cast<uint64_t>(INT64_MAX)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    orlo::FdGuard fd(orlo::os::Open(path, O_WRONLY | O_APPEND | O_CLOEXEC));
    if (fd.get() < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_WRONLY | O_APPEND) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    struct stat st;
    if (fstat(fd.get(), &st) != 0) {
        ORLO_LOG_ERR("fstat(%d, %p) failed, err=%m", fd.get(), static_cast<void *>(&st));
        return ORLO_ERR_STAT_PATH;
    }
    off_t offset = st.st_size;
    if (static_cast<uint64_t>(offset) > static_cast<uint64_t>(INT64_MAX) - len) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (ORLOFSFallocate(fd.get(), 0, offset, static_cast<off_t>(len)) != 0) {
        int platErr = OLIBCErrGet();
        ORLO_LOG_PLATFORM("ORLOFSFallocate(%d, 0, %lld, %llu)", fd.get(), static_cast<long long>(offset),
                          static_cast<unsigned long long>(len));
        // A partial allocation is given back: the file keeps its former size.
        if (ftruncate(fd.get(), offset) != 0)
            ORLO_LOG_ERR("ftruncate(%d, %lld) failed, err=%m", fd.get(), static_cast<long long>(offset));
        return platErr == OLIBC_ERR_NO_SPACE ? ORLO_ERR_OUT_OF_SPACE : ORLO_ERR_ALLOCATE_FILE;
    }
    *pu64Progress += len;
    int raw = fd.release();
    if (close(raw) != 0) ORLO_LOG_ERR("close(%d) failed, err=%m", raw);
    return ORLO_OK;
}
