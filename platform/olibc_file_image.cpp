// Reading, editing and atomically replacing whole section and key=value files, and the
// small file calls built on them (OLIBCFileExist, OLIBCFileTouch, OLIBCIFileIsSection).
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <new>

#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace olibc {

namespace {

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

constexpr size_t kKeptBufferMin = 64 * 1024;
constexpr size_t kKeptBufferMax = 16 * 1024 * 1024;
constexpr size_t kKeptBuffers = 2;
// Only ever touched by explicit calls (never from the destructor of another thread-local
// object), so its own destruction at thread exit comes after its last use.
thread_local std::vector<std::string> tlsBuffers;

bool HasLineBreak(const char *s) { return strpbrk(s, "\n\r") != nullptr; }

}  // namespace

bool IsValidSectionName(const char *name) {
    return name != nullptr && name[0] != '\0' && strpbrk(name, "]\n\r") == nullptr;
}

bool IsValidKey(const char *key) {
    if (key == nullptr || key[0] == '\0') return false;
    if (strpbrk(key, "=\n\r") != nullptr) return false;
    if (key[0] == '[' || key[0] == '#' || key[0] == ';') return false;
    size_t n = strlen(key);
    return !IsBlank(key[0]) && !IsBlank(key[n - 1]);
}

bool IsValidValue(const char *value) { return value != nullptr && !HasLineBreak(value); }

bool IsValidLineFormat(const char *fmt) {
    if (fmt == nullptr) return false;
    int conversions = 0;
    bool equalsBetween = false;
    size_t n = strlen(fmt);
    if (n == 0 || fmt[n - 1] != '\n') return false;
    for (size_t i = 0; i + 1 < n; ++i) {
        char c = fmt[i];
        if (c == '\n' || c == '\r') return false;
        if (c == '%') {
            if (fmt[i + 1] == '%') {
                ++i;
            } else if (fmt[i + 1] == 's') {
                ++conversions;
                ++i;
            } else {
                return false;
            }
            continue;
        }
        if (conversions == 0 && !IsBlank(c)) return false;
        if (conversions == 1 && c == '=') equalsBetween = true;
    }
    return conversions == 2 && equalsBetween;
}

void AppendLine(std::string *out, const char *fmt, const char *key, const char *value) {
    int conversion = 0;
    for (const char *p = fmt; *p != '\0'; ++p) {
        if (p[0] == '%' && p[1] == '%') {
            out->push_back('%');
            ++p;
        } else if (p[0] == '%' && p[1] == 's') {
            out->append(conversion++ == 0 ? key : value);
            ++p;
        } else {
            out->push_back(*p);
        }
    }
}

std::string Printable(const char *s) {
    std::string out;
    if (s == nullptr) return "(null)";
    for (const unsigned char *p = reinterpret_cast<const unsigned char *>(s); *p != '\0'; ++p) {
        if (*p == '\n') {
            out += "\\n";
        } else if (*p == '\r') {
            out += "\\r";
        } else if (*p == '\t') {
            out += "\\t";
        } else if (*p < 0x20 || *p == 0x7F) {
            char buf[8];
            snprintf(buf, sizeof(buf), "\\x%02X", *p);
            out += buf;
        } else {
            out.push_back(static_cast<char>(*p));
        }
    }
    return out;
}

bool LineScanner::Next(Line *line) {
    if (pos_ >= limit_) return false;
    const char *base = data_.data();
    line->begin = pos_;
    const void *nl = memchr(base + pos_, '\n', limit_ - pos_);
    line->contentEnd = nl != nullptr ? static_cast<size_t>(static_cast<const char *>(nl) - base) : limit_;
    line->end = nl != nullptr ? line->contentEnd + 1 : limit_;
    if (line->contentEnd > line->begin && base[line->contentEnd - 1] == '\r') --line->contentEnd;
    pos_ = line->end;
    line->key = line->value = std::string_view();
    if (line->contentEnd > line->begin && base[line->begin] == '[') {
        size_t from = line->begin + 1;
        const void *close = memchr(base + from, ']', line->contentEnd - from);
        size_t to = close != nullptr ? static_cast<size_t>(static_cast<const char *>(close) - base) : line->contentEnd;
        line->name = data_.substr(from, to - from);
        line->kind = line->name.empty() ? LineKind::kBadHeader : LineKind::kHeader;
    } else {
        line->name = std::string_view();
        line->kind = LineKind::kUnparsed;
    }
    return true;
}

void LineScanner::Parse(Line *line) const {
    if (line->kind != LineKind::kUnparsed) return;
    const char *base = data_.data();
    size_t p = line->begin;
    size_t e = line->contentEnd;
    while (p < e && IsBlank(base[p])) ++p;
    if (p == e) {
        line->kind = LineKind::kBlank;
        return;
    }
    if (base[p] == '#' || base[p] == ';') {
        line->kind = LineKind::kComment;
        return;
    }
    const void *eq = memchr(base + p, '=', e - p);
    if (eq == nullptr) {
        line->kind = LineKind::kOther;
        return;
    }
    size_t at = static_cast<size_t>(static_cast<const char *>(eq) - base);
    size_t keyEnd = at;
    while (keyEnd > p && IsBlank(base[keyEnd - 1])) --keyEnd;
    if (keyEnd == p) {
        line->kind = LineKind::kOther;
        return;
    }
    size_t v = at + 1;
    while (v < e && IsBlank(base[v])) ++v;
    line->key = data_.substr(p, keyEnd - p);
    line->value = data_.substr(v, e - v);
    if (line->value.size() >= 2 && line->value.front() == '"' && line->value.back() == '"')
        line->value = line->value.substr(1, line->value.size() - 2);
    line->kind = LineKind::kKey;
}

void ScanHeaders(std::string_view data, std::vector<Header> *headers) {
    headers->clear();
    const char *base = data.data();
    size_t size = data.size();
    size_t pos = 0;
    while (pos < size) {
        const void *bracket = memchr(base + pos, '[', size - pos);
        if (bracket == nullptr) break;
        size_t at = static_cast<size_t>(static_cast<const char *>(bracket) - base);
        if (at > 0 && base[at - 1] != '\n') {  // inside a line: not a header
            pos = at + 1;
            continue;
        }
        LineScanner one(data, at, size);
        Line line;
        one.Next(&line);
        headers->push_back(Header{line.begin, line.end, line.name});
        pos = line.end;
    }
}

std::string TakeImageBuffer(size_t size) {
    std::string out;
    if (tlsBuffers.empty()) return out;
    // The smallest that fits, else the largest (it grows once).
    size_t pick = 0;
    for (size_t i = 1; i < tlsBuffers.size(); ++i) {
        const size_t have = tlsBuffers[i].capacity(), best = tlsBuffers[pick].capacity();
        if (best >= size ? (have >= size && have < best) : have > best) pick = i;
    }
    out.swap(tlsBuffers[pick]);
    tlsBuffers.erase(tlsBuffers.begin() + static_cast<std::ptrdiff_t>(pick));
    out.clear();
    return out;
}

void KeepImageBuffer(std::string *buffer) {
    const size_t capacity = buffer->capacity();
    if (capacity < kKeptBufferMin || capacity > kKeptBufferMax) return;
    if (tlsBuffers.size() >= kKeptBuffers) {
        auto smallest = std::min_element(tlsBuffers.begin(), tlsBuffers.end(),
                                         [](const std::string &a, const std::string &b) {
                                             return a.capacity() < b.capacity();
                                         });
        if (smallest->capacity() >= capacity) return;
        tlsBuffers.erase(smallest);
    }
    if (tlsBuffers.capacity() < kKeptBuffers) {
        try {
            tlsBuffers.reserve(kKeptBuffers);
        } catch (const std::bad_alloc &) {
            return;  // not kept, simply freed: called from destructors, so never throws
        }
    }
    tlsBuffers.emplace_back();
    tlsBuffers.back().swap(*buffer);
}

int CodeOfErrno(int err, int fallback) {
    switch (err) {
        case ENOENT:
        case ENOTDIR:
            return OLIBC_ERR_NOT_FOUND;
        case ENAMETOOLONG:
            return OLIBC_ERR_TOO_LONG;
        case ENOSPC:
        case EDQUOT:
            return OLIBC_ERR_NO_SPACE;
        case ENOMEM:
            return OLIBC_ERR_OUT_OF_MEM;
        default:
            return fallback;
    }
}

int ReadImage(const char *path, FileImage *image, bool forWrite) {
    // O_NONBLOCK: a FIFO at the path must not hang the caller; it is refused below.
    int flags = O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK | (forWrite ? O_NOFOLLOW : 0);
    int fd = os::Open(path, flags);
    if (fd < 0) {
        OLIBCErrSet(CodeOfErrno(errno, OLIBC_ERR_FOPEN));
        return -1;
    }
    struct FdCloser {
        int fd;
        ~FdCloser() { close(fd); }
    } closer{fd};
    if (fstat(fd, &image->st) != 0) {
        OLIBCErrSet(OLIBC_ERR_IO);
        return -1;
    }
    if (!S_ISREG(image->st.st_mode)) {
        errno = S_ISDIR(image->st.st_mode) ? EISDIR : EINVAL;
        OLIBCErrSet(OLIBC_ERR_FOPEN);
        return -1;
    }
    // The size is a hint only: the file may be growing under a careless writer.
    size_t capacity = static_cast<size_t>(image->st.st_size) + 1;
    if (image->data.capacity() < capacity) image->data = TakeImageBuffer(capacity);
    image->data.resize(capacity);
    size_t used = 0;
    for (;;) {
        if (used == image->data.size()) image->data.resize(image->data.size() * 2);
        ssize_t n = read(fd, &image->data[used], image->data.size() - used);
        if (n < 0) {
            if (errno == EINTR) continue;
            OLIBCErrSet(OLIBC_ERR_IO);
            return -1;
        }
        if (n == 0) break;
        used += static_cast<size_t>(n);
    }
    image->data.resize(used);
    return 0;
}

int ReplaceFile(const char *path, const struct stat *st, std::string_view content) {
    return ReplaceFile(path, st, std::vector<std::string_view>{content});
}

int ReplaceFile(const char *path, const struct stat *st, const std::vector<std::string_view> &pieces) {
    std::string tmp = std::string(path) + ".XXXXXX";
    if (tmp.size() >= PATH_MAX) {
        errno = ENAMETOOLONG;
        OLIBCErrSet(OLIBC_ERR_TOO_LONG);
        return -1;
    }
    SweepReplacements(path);
    int fd = MakeReplacement(&tmp);
    if (fd < 0) {
        OLIBCErrSet(CodeOfErrno(errno, OLIBC_ERR_CONF));
        return -1;
    }
    // Until the rename succeeds the temporary file is ours to remove.
    auto fail = [&](int code) {
        int saved = errno;
        if (fd >= 0) close(fd);
        os::Unlink(tmp.c_str());
        errno = saved;
        OLIBCErrSet(code);
        return -1;
    };
    for (std::string_view piece : pieces) {
        const char *p = piece.data();
        size_t left = piece.size();
        while (left > 0) {
            ssize_t n = write(fd, p, left);
            if (n < 0) {
                if (errno == EINTR) continue;
                return fail(CodeOfErrno(errno, OLIBC_ERR_IO));
            }
            p += n;
            left -= static_cast<size_t>(n);
        }
    }
    if (st != nullptr) {
        // Owner first: fchown clears set-id bits that fchmod then restores.
        if ((st->st_uid != geteuid() || st->st_gid != getegid()) && fchown(fd, st->st_uid, st->st_gid) != 0)
            return fail(OLIBC_ERR_CONF);
        if (fchmod(fd, st->st_mode & 07777) != 0) return fail(OLIBC_ERR_CONF);
    } else if (fchmod(fd, 0644) != 0) {
        return fail(OLIBC_ERR_CONF);
    }
    if (fsync(fd) != 0) return fail(CodeOfErrno(errno, OLIBC_ERR_IO));
    int closing = fd;
    fd = -1;
    if (close(closing) != 0) return fail(CodeOfErrno(errno, OLIBC_ERR_IO));
    if (os::Rename(tmp.c_str(), path) != 0) return fail(CodeOfErrno(errno, OLIBC_ERR_CONF));
    return 0;
}

void AddEdit(std::vector<Edit> *edits, size_t begin, size_t end, std::string text) {
    if (text.empty() && !edits->empty()) {
        Edit &last = edits->back();
        if (last.end == begin && last.text.empty()) {
            last.end = end;
            return;
        }
    }
    edits->push_back(Edit{begin, end, std::move(text)});
}

std::vector<std::string_view> EditedPieces(std::string_view data, const std::vector<Edit> &edits) {
    std::vector<std::string_view> pieces;
    pieces.reserve(2 * edits.size() + 1);
    size_t pos = 0;
    for (const Edit &e : edits) {
        if (e.begin > pos) pieces.push_back(data.substr(pos, e.begin - pos));
        if (!e.text.empty()) pieces.push_back(e.text);
        pos = e.end;
    }
    if (pos < data.size()) pieces.push_back(data.substr(pos));
    return pieces;
}

std::string ApplyEdits(std::string_view data, const std::vector<Edit> &edits) {
    const std::vector<std::string_view> pieces = EditedPieces(data, edits);
    size_t size = 0;
    for (std::string_view piece : pieces) size += piece.size();
    std::string out;
    out.reserve(size);
    for (std::string_view piece : pieces) out.append(piece);
    return out;
}

}  // namespace olibc
}  // namespace orlo

extern "C" {

ORLO_EXPORT int OLIBCFileExist(const char *path) {
    if (!orlo::olibc::IsValidPath(path)) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return 0;
    }
    struct stat st;
    return orlo::os::Stat(path, &st) == 0 ? 1 : 0;
}

ORLO_EXPORT int OLIBCFileTouch(const char *path) {
    if (!orlo::olibc::IsValidPath(path)) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    int fd = orlo::os::Open(path, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOCTTY | O_NOFOLLOW, 0644);
    if (fd >= 0) {
        if (close(fd) != 0) {
            OLIBCErrSet(OLIBC_ERR_IO);
            return -1;
        }
        return 0;
    }
    if (errno != EEXIST) {
        OLIBCErrSet(orlo::olibc::CodeOfErrno(errno, OLIBC_ERR_FOPEN));
        return -1;
    }
    struct stat st;
    if (orlo::os::Stat(path, &st) != 0) {
        OLIBCErrSet(orlo::olibc::CodeOfErrno(errno, OLIBC_ERR_FOPEN));
        return -1;
    }
    if (!S_ISREG(st.st_mode)) {
        OLIBCErrSet(OLIBC_ERR_FOPEN);
        return -1;
    }
    return 0;
}

ORLO_EXPORT int OLIBCIFileIsSection(const char *line, size_t length) {
    if (line == nullptr || length == 0) return 0;
    orlo::olibc::LineScanner scanner(std::string_view(line, strnlen(line, length)));
    orlo::olibc::Line l;
    return scanner.Next(&l) && l.kind == orlo::olibc::LineKind::kHeader && l.end == strnlen(line, length) ? 1 : 0;
}

}  // extern "C"
