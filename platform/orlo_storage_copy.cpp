// File copy for moves across file systems: regular files only, holes kept (a sparse
// LUN file stays sparse), mode and, where permitted, owner kept, and the destination
// replaced atomically through a temporary file beside it.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <vector>

#include "olibc.h"
#include "orlo_storage.h"
#include "platform/orlo_storage_internal.h"
#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace {

constexpr size_t kChunk = 1u << 20;  // bytes per read/write when copy_file_range cannot

// Copies [off, end) from in to out at the same offsets.
int CopyRange(int in, int out, off_t off, off_t end, std::vector<char> *buf) {
    bool useCfr = true;
    while (off < end) {
        size_t want = static_cast<size_t>(end - off < static_cast<off_t>(kChunk) ? end - off : kChunk);
        if (useCfr) {
            loff_t inOff = off, outOff = off;
            ssize_t n = copy_file_range(in, &inOff, out, &outOff, want, 0);
            if (n > 0) {
                off += n;
                continue;
            }
            if (n == 0) {  // the source shrank under us
                errno = EIO;
                return -1;
            }
            if (errno == EINTR) continue;
            if (errno != EXDEV && errno != ENOSYS && errno != EINVAL && errno != EOPNOTSUPP) return -1;
            useCfr = false;
        }
        if (buf->empty()) buf->resize(kChunk);
        ssize_t r = pread(in, buf->data(), want, off);
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) {
            if (r == 0) errno = EIO;
            return -1;
        }
        size_t done = 0;
        while (done < static_cast<size_t>(r)) {
            ssize_t w = pwrite(out, buf->data() + done, static_cast<size_t>(r) - done, off + static_cast<off_t>(done));
            if (w < 0 && errno == EINTR) continue;
            if (w <= 0) {
                if (w == 0) errno = ENOSPC;
                return -1;
            }
            done += static_cast<size_t>(w);
        }
        off += r;
    }
    return 0;
}

// Copies the data of in to out, skipping holes; out ends up size bytes long.
int CopyData(int in, int out, off_t size) {
    std::vector<char> buf;
    off_t off = 0;
    while (off < size) {
        off_t data = lseek(in, off, SEEK_DATA);
        if (data < 0) {
            if (errno == ENXIO) break;  // only a hole remains
            if (errno != EINVAL && errno != EOPNOTSUPP) return -1;
            // No hole support: copy everything that is left.
            if (CopyRange(in, out, off, size, &buf) != 0) return -1;
            off = size;
            break;
        }
        if (data >= size) break;
        off_t hole = lseek(in, data, SEEK_HOLE);
        if (hole < 0 || hole > size) hole = size;
        if (CopyRange(in, out, data, hole, &buf) != 0) return -1;
        off = hole;
    }
    return ftruncate(out, size);
}

}  // namespace

extern "C" {

ORLO_EXPORT int ORLOFileCopy(const char *src, const char *dst) {
    if (src == nullptr || dst == nullptr || src[0] == '\0' || dst[0] == '\0') {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    int in = orlo::os::Open(src, O_RDONLY | O_CLOEXEC);
    if (in < 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_FOPEN);
        return -1;
    }
    struct stat st;
    if (fstat(in, &st) != 0) {
        int err = errno;
        ::close(in);
        ORLO_STORAGE_FAIL(err, OLIBC_ERR_IO);
        return -1;
    }
    if (!S_ISREG(st.st_mode)) {
        ::close(in);
        ORLO_STORAGE_FAIL(S_ISDIR(st.st_mode) ? EISDIR : EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    char tmp[PATH_MAX];
    int n = snprintf(tmp, sizeof(tmp), "%s.XXXXXX", dst);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(tmp)) {
        ::close(in);
        ORLO_STORAGE_FAIL(ENAMETOOLONG, OLIBC_ERR_TOO_LONG);
        return -1;
    }
    orlo::olibc::SweepReplacements(dst);
    std::string tmpName(tmp);
    int out = orlo::olibc::MakeReplacement(&tmpName);
    if (out >= 0) memcpy(tmp, tmpName.c_str(), tmpName.size() + 1);
    if (out < 0) {
        int err = errno;
        ::close(in);
        ORLO_STORAGE_FAIL(err, OLIBC_ERR_FOPEN);
        return -1;
    }
    int rc = CopyData(in, out, st.st_size);
    if (rc == 0 && fchown(out, st.st_uid, st.st_gid) != 0 && errno != EPERM) rc = -1;
    if (rc == 0) rc = fchmod(out, st.st_mode & 07777);
    if (rc == 0) rc = fsync(out);
    int err = errno;
    if (::close(out) != 0 && rc == 0) {
        rc = -1;
        err = errno;
    }
    ::close(in);
    if (rc == 0 && orlo::os::Rename(tmp, dst) != 0) {
        rc = -1;
        err = errno;
    }
    if (rc != 0) {
        orlo::os::Unlink(tmp);
        ORLO_STORAGE_FAIL(err, OLIBC_ERR_IO);
        return -1;
    }
    return 0;
}

}  // extern "C"
