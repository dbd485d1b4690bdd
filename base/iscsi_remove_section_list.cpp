// Removes a list of sections from a configuration file in one rewrite: the kept lines
// go to a temporary file beside the old one, which then replaces it, so a crash at any
// moment leaves either the old file or the new one.  Comment lines inside a removed
// section are kept on purpose (they often describe what follows).  The caller holds the
// file's lock.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace {

constexpr size_t kPathBufferSize = 4096;
constexpr size_t kWriteBufferSize = 1 << 16;

// Reads the rest of fd into data.  0 or -1 (errno set).
int ReadAll(int fd, size_t sizeHint, std::string *data) {
    data->resize(sizeHint + 1);
    size_t used = 0;
    for (;;) {
        if (used == data->size()) data->resize(data->size() * 2);
        ssize_t n = read(fd, &(*data)[used], data->size() - used);
        if (n < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        if (n == 0) break;
        used += static_cast<size_t>(n);
    }
    data->resize(used);
    return 0;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIRemoveSectionList(const char *path, const OLIBC_SZLIST *pList) try {
    if (path == nullptr || path[0] == '\0' || pList == nullptr) {
        ORLO_LOG_ERR("Null input pointer");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_NULL_POINTER;
    }
    for (int i = 0; i < pList->nItem; ++i) {
        if (!orlo::olibc::IsValidSectionName(pList->ppszItem[i])) {
            ORLO_LOG_ERR("Bad parameters, invalid section name: \"%s\"",
                         orlo::olibc::Printable(pList->ppszItem[i]).c_str());
            OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
            return ORLO_ERR_BAD_PARAMETER;
        }
    }
    char tmpPath[kPathBufferSize];
    int n = snprintf(tmpPath, sizeof(tmpPath), "%s.XXXXXX", path);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(tmpPath)) {
        ORLO_LOG_ERR("Path too long: %s", path);
        return ORLO_ERR_PARSE_STRING;
    }

    orlo::FdGuard in(orlo::os::Open(path, O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    if (in.get() < 0) {
        ORLO_LOG_ERR("Failed to open file: %s", path);
        return ORLO_ERR_OPEN_FILE;
    }
    struct stat st;
    if (fstat(in.get(), &st) != 0) {
        ORLO_LOG_ERR("Failed to fstat file: %s", path);
        return ORLO_ERR_STAT_PATH;
    }
    if (!S_ISREG(st.st_mode)) {
        ORLO_LOG_ERR("Not a file. path: %s", path);
        return ORLO_ERR_BAD_FILE_TYPE;
    }

    // Temporary files of writers killed before their rename go first; ours keeps a flock
    // for its whole life so that other writers leave it alone.
    orlo::olibc::SweepReplacements(path);
    std::string tmpName(tmpPath);
    int tmpFd = orlo::olibc::MakeReplacement(&tmpName);
    if (tmpFd >= 0) memcpy(tmpPath, tmpName.c_str(), tmpName.size() + 1);
    if (tmpFd < 0) {
        ORLO_LOG_ERR("Failed to mkstemp file: %s", tmpPath);
        return ORLO_ERR_OPEN_FILE;
    }
    // Until the rename the temporary file is ours: remove it on every failure.
    bool renamed = false;
    auto removeTmp = orlo::MakeScopeExit([&]() {
        if (!renamed) orlo::os::Unlink(tmpPath);
    });
    orlo::FileGuard out(fdopen(tmpFd, "w"));
    if (out.get() == nullptr) {
        close(tmpFd);
        ORLO_LOG_ERR("Failed to fdopen file: %s", tmpPath);
        return ORLO_ERR_OPEN_FILE;
    }
    setvbuf(out.get(), nullptr, _IOFBF, kWriteBufferSize);

    // Sorted copy of the names, so that each header is a binary search.
    orlo::SzListGuard names(OLIBCSzListAlloc(pList->nItem));
    if (names.get() == nullptr) {
        ORLO_LOG_ERR("OLIBCSzListAlloc(%d) failed", pList->nItem);
        return ORLO_ERR_OUT_OF_MEMORY;
    }
    for (int i = 0; i < pList->nItem; ++i) {
        if (OLIBCSzListPush(names.addr(), pList->ppszItem[i]) < 0) {
            ORLO_LOG_PLATFORM("OLIBCSzListPush(%p, \"%s\")", static_cast<void *>(names.addr()), pList->ppszItem[i]);
            return ORLO_ERR_OUT_OF_MEMORY;
        }
    }
    OLIBCSzListSortItems(names.get(), 0);

    std::string data;
    if (ReadAll(in.get(), static_cast<size_t>(st.st_size), &data) != 0) {
        ORLO_LOG_ERR("Failed to read file: %s", path);
        return ORLO_ERR_READ_FILE;
    }

    // Walk the sections; kept lines are written in runs.  Inside a removed section only
    // its comment lines are kept.
    std::vector<orlo::olibc::Header> headers;
    orlo::olibc::ScanHeaders(data, &headers);
    std::string name;
    size_t runBegin = 0;
    auto flushRun = [&](size_t upTo) {
        size_t len = upTo - runBegin;
        return len == 0 || fwrite(data.data() + runBegin, 1, len, out.get()) == len;
    };
    auto drop = [&](size_t begin, size_t end) {
        if (begin != runBegin && !flushRun(begin)) return false;
        runBegin = end;
        return true;
    };
    for (size_t i = 0; i < headers.size(); ++i) {
        const orlo::olibc::Header &h = headers[i];
        if (h.name.empty()) {
            std::string line(data, h.begin, h.end - h.begin);
            ORLO_LOG_ERR("Bad section header in %s: \"%s\"", path, orlo::olibc::Printable(line.c_str()).c_str());
            return ORLO_ERR_PARSE_STRING;
        }
        name.assign(h.name);
        if (OLIBCSzListBinaryFind(names.get(), name.c_str()) < 0) continue;
        bool written = drop(h.begin, h.end);
        orlo::olibc::LineScanner body(data, h.end, orlo::olibc::BodyEnd(headers, i, data.size()));
        orlo::olibc::Line line;
        while (written && body.Next(&line)) {
            char first = data[line.begin];
            if (first != '#' && first != ';') written = drop(line.begin, line.end);
        }
        if (!written) {
            ORLO_LOG_ERR("Failed to write file: %s", tmpPath);
            return ORLO_ERR_WRITE_FILE;
        }
    }
    if (!flushRun(data.size())) {
        ORLO_LOG_ERR("Failed to write file: %s", tmpPath);
        return ORLO_ERR_WRITE_FILE;
    }

    if (fflush(out.get()) != 0) {
        ORLO_LOG_ERR("Failed to fflush file: %s", tmpPath);
        return ORLO_ERR_CLOSE_FILE;
    }
    int fd = fileno(out.get());
    if (fsync(fd) != 0 || fchown(fd, st.st_uid, st.st_gid) != 0 || fchmod(fd, st.st_mode & 0xFFF) != 0) {
        ORLO_LOG_ERR("Failed to fsync file: %s", tmpPath);
        return ORLO_ERR_CLOSE_FILE;
    }
    if (fclose(out.release()) != 0) {
        ORLO_LOG_ERR("Failed to fclose file: %s", tmpPath);
        return ORLO_ERR_CLOSE_FILE;
    }
    if (orlo::os::Rename(tmpPath, path) != 0) {
        ORLO_LOG_ERR("Failed to rename file. from %s to %s", tmpPath, path);
        return ORLO_ERR_RENAME_FILE;
    }
    renamed = true;
    return ORLO_OK;
} catch (const std::bad_alloc &) {
    ORLO_LOG_ERR("Out of memory while rewriting %s", path);
    OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
    return ORLO_ERR_OUT_OF_MEMORY;
}
