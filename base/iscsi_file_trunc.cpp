// Grows a LUN file to its size: by setting the size (sparse), by writing zeros, or by
// allocating space step by step, with the progress file of this process kept up to
// date for the last two.  Files are only ever grown.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cinttypes>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace {

constexpr uint32_t kErrBadFileSize = 18990007;  // Bad file size
constexpr size_t kZeroChunk = 1048576;           // bytes per write when zero filling
// Never written: left non-const so that it lives in .bss instead of adding a megabyte
// of zeros to the library file.
char gZeros[kZeroChunk];

// Removes any old progress file of this process and starts a new one with the planned
// byte count.  False when the count could not be written (the work goes on without).
bool ProgressStart(uint64_t total) {
    char path[64];
    snprintf(path, sizeof(path), ORLO_ISCSI_FILE_PROGRESS_PATH_FMT, static_cast<int>(getpid()));
    // ENOTDIR: the runtime directory is not a directory, so there is no old file either.
    if (orlo::os::Unlink(path) != 0 && errno != ENOENT && errno != ENOTDIR)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    char value[32];
    snprintf(value, sizeof(value), "%" PRIu64, total);
    return OLIBCFileSetKeyValue(path, ORLO_ISCSI_FILE_PROGRESS_TOTAL, value, "%s=%s\n") >= 0;
}

// Appends addBytes zeros to path, which is origSize bytes long now.
uint32_t DDFile(const char *path, uint64_t addBytes, uint64_t *pu64Progress, off_t origSize) {
    FILE *f = orlo::os::Fopen(path, "a");
    if (f == nullptr) {
        ORLO_LOG_ERR("fopen(\"%s\", \"a\") failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    // Unbuffered: every piece reaches the file before its bytes are reported done, and
    // a full file system is seen at the write that hits it.
    setvbuf(f, nullptr, _IONBF, 0);
    // Once the progress file cannot be written, it is left alone: one log line, not one
    // per piece.
    bool progressFile = ProgressStart(addBytes);
    if (!progressFile) ORLO_LOG_ERR("Error OLIBCFileSetKeyValue key=total_bytes, error[%X]", OLIBCErrGet());

    uint32_t ret = ORLO_OK;
    uint64_t written = 0;
    while (written < addBytes) {
        size_t piece = static_cast<size_t>(std::min<uint64_t>(kZeroChunk, addBytes - written));
        size_t n = fwrite(gZeros, 1, piece, f);
        int err = errno;
        written += n;
        if (pu64Progress != nullptr) *pu64Progress += n;
        if (progressFile && n > 0 && ORLOiSCSIFileProgressWrite(n) != ORLO_OK) progressFile = false;
        if (n != piece) {
            errno = err;
            ORLO_LOG_ERR("fwrite(%p, 1, %zu, %p) failed, err=%m", static_cast<const void *>(gZeros), piece,
                         static_cast<void *>(f));
            ret = err == ENOSPC ? ORLO_ERR_OUT_OF_SPACE : ORLO_ERR_WRITE_FILE;
            break;
        }
    }
    if (written != addBytes) {
        ORLO_LOG_ERR("Failed to write u64PlanTruncBytes[%llu] with wrong u64RealTruncBytes[%llu]",
                     static_cast<unsigned long long>(addBytes), static_cast<unsigned long long>(written));
    }
    if (ret != ORLO_OK && ftruncate(fileno(f), origSize) != 0)
        ORLO_LOG_ERR("ftruncate(%d, %lld) failed, err=%m", fileno(f), static_cast<long long>(origSize));
    if (fclose(f) != 0) ORLO_LOG_ERR("fclose(\"%s\") failed, err=%m", path);
    return ret;
}

// Appends addBytes of allocated space to path in steps of ORLO_ISCSI_FILE_ALLOC_STEP,
// reporting each step in the progress file.
uint32_t FallocFile(const char *path, uint64_t addBytes, uint64_t *pu64Progress, off_t origSize) {
    bool progressFile = ProgressStart(addBytes);
    if (!progressFile) ORLO_LOG_ERR("Error OLIBCFileSetKeyValue key=total_bytes, error[%X]", OLIBCErrGet());
    uint64_t done = 0;
    while (done < addBytes) {
        uint64_t step = std::min<uint64_t>(ORLO_ISCSI_FILE_ALLOC_STEP, addBytes - done);
        uint64_t stepDone = 0;
        uint32_t ret = ORLOiSCSIFileAlloc(path, step, &stepDone);
        if (ret != ORLO_OK) {
            // The failed step is already undone; give back the finished ones too.
            if (done > 0 && orlo::os::Truncate(path, origSize) != 0)
                ORLO_LOG_ERR("truncate(\"%s\", %lld) failed, err=%m", path, static_cast<long long>(origSize));
            return ret;
        }
        done += stepDone;
        if (pu64Progress != nullptr) *pu64Progress += stepDone;
        if (progressFile && ORLOiSCSIFileProgressWrite(stepDone) != ORLO_OK) progressFile = false;
    }
    return ORLO_OK;
}

uint32_t SetSize(const char *path, uint64_t addBytes, uint64_t *pu64Progress, off_t origSize) {
    off_t size = origSize + static_cast<off_t>(addBytes);
    if (orlo::os::Truncate(path, size) != 0) {
        ORLO_LOG_ERR("truncate(\"%s\", %lld) failed, err=%m", path, static_cast<long long>(size));
        return ORLO_ERR_TRUNCATE_FILE;
    }
    if (pu64Progress != nullptr) *pu64Progress += addBytes;
    return ORLO_OK;
}

struct GrowMode {
    unsigned int mode;
    uint32_t (*grow)(const char *path, uint64_t addBytes, uint64_t *pu64Progress, off_t origSize);
};

constexpr GrowMode kGrowModes[] = {
    {ORLO_ISCSI_TRUNC_MODE_SPARSE, SetSize},
    {ORLO_ISCSI_TRUNC_MODE_ZERO, DDFile},
    {ORLO_ISCSI_TRUNC_MODE_ALLOC, FallocFile},
};

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIFileTrunc(const char *path, uint64_t size, uint64_t *pu64Progress,
                                                   unsigned int mode) {
    if (path == nullptr || path[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    const GrowMode *grow = nullptr;
    for (const GrowMode &g : kGrowModes) {
        if (g.mode == mode) grow = &g;
    }
    if (grow == nullptr || size > static_cast<uint64_t>(INT64_MAX)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (!OLIBCFileExist(path)) {
        int ret = OLIBCFileTouch(path);
        if (ret < 0) {
            ORLO_LOG_ERR("OLIBCFileTouch(\"%s\") failed, ret=%d", path, ret);
            return ORLO_ERR_TOUCH_FILE;
        }
    }
    struct stat st;
    if (orlo::os::Stat(path, &st) != 0) {
        ORLO_LOG_ERR("stat(\"%s\", %p) failed, err=%m", path, static_cast<void *>(&st));
        return ORLO_ERR_STAT_PATH;
    }
    if (!S_ISREG(st.st_mode)) {
        ORLO_LOG_ERR("Not a regular file. path: %s", path);
        return ORLO_ERR_BAD_FILE_TYPE;
    }
    uint64_t orig = static_cast<uint64_t>(st.st_size);
    if (size < orig) {
        ORLO_LOG_ERR("Trunc file size is smaller than original file size. trunc: %llu, orig: %llu",
                     static_cast<unsigned long long>(size), static_cast<unsigned long long>(orig));
        return kErrBadFileSize;
    }
    if (size == orig) return ORLO_OK;
    return grow->grow(path, size - orig, pu64Progress, st.st_size);
}
