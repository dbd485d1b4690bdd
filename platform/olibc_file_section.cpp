// Section files: "[name]" headers, each followed by its key lines.
//
// Readers take the first section of a name (names are unique in files this library
// writes; a hand-edited duplicate does not break reading).  Writers read the file once,
// express the change as edits on its lines and replace the file atomically once:
//   - replacing a section rewrites its header and key lines in place and drops any later
//     duplicate of it; comment and blank lines inside it are kept, after the new keys;
//   - removing a section drops its header, key, blank and other lines but keeps its
//     comment lines, exactly as the library's own list removal does;
//   - appending puts the section at the end (after a newline if the last line lacks one).
// A malformed header ("[]" or "[" alone) makes every section operation refuse the file
// with OLIBC_ERR_BAD_FORMAT and leave it as it is.
#include <atomic>
#include <cstring>
#include <string_view>

#include "platform/olibc_file_cache.h"
#include "platform/olibc_file_internal.h"

namespace {

using orlo::olibc::AddEdit;
using orlo::olibc::Edit;
using orlo::olibc::FileImage;
using orlo::olibc::Header;
using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;
using orlo::olibc::SectionFile;

// Every pair must be writable as one key line.
bool ArePairsValid(const OLIBC_SZHASH *hash) {
    const char *key = nullptr;
    const char *value = nullptr;
    for (int i = 0; OLIBCSzHashEnum(hash, i, &key, &value); ++i)
        if (!orlo::olibc::IsValidKey(key) || !orlo::olibc::IsValidValue(value)) return false;
    return true;
}

// "[name]\n" and one line per pair, in the hash's order.
std::string SectionText(const char *name, const OLIBC_SZHASH *hash, const char *fmt) {
    std::string text;
    text.reserve(64 + static_cast<size_t>(OLIBCSzHashCount(hash)) * 48);
    text.append("[").append(name).append("]\n");
    const char *key = nullptr;
    const char *value = nullptr;
    for (int i = 0; OLIBCSzHashEnum(hash, i, &key, &value); ++i) orlo::olibc::AppendLine(&text, fmt, key, value);
    return text;
}

// Text inserted at the end of an image: a newline first when its last line lacks one.
std::string AtEnd(const std::string &data, std::string text) {
    if (!data.empty() && data.back() != '\n') text.insert(text.begin(), '\n');
    return text;
}

int BadFormat() {
    OLIBCErrSet(OLIBC_ERR_BAD_FORMAT);
    return -1;
}

// The headers of an image; -1 (OLIBC_ERR_BAD_FORMAT) when one is malformed.
int ReadHeaders(const std::string &data, std::vector<Header> *headers) {
    orlo::olibc::ScanHeaders(data, headers);
    for (const Header &h : *headers)
        if (h.name.empty()) return BadFormat();
    return 0;
}

int BadParam() {
    OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
    return -1;
}

// Writes the edited image over path, unless it would be the same bytes: an unchanged file
// keeps its inode and times, costs no temporary file and no sync, and keeps the parses
// that readers hold.  0, or -1 with the platform error set.
int WriteEdited(const char *path, const FileImage &image, const struct stat *st, const std::vector<Edit> &edits) {
    if (orlo::olibc::ChangesNothing(image.data, edits)) return 0;
    if (orlo::olibc::ReplaceFile(path, st, orlo::olibc::EditedPieces(image.data, edits)) != 0) return -1;
    orlo::olibc::SectionFileForget(path);
    return 0;
}

}  // namespace

namespace orlo {
namespace olibc {

// Whether applying edits to data gives data again.  Only the edited stretches are
// compared: the text between edits is the image itself, at an offset shifted by what the
// edits before it added or removed.
bool ChangesNothing(std::string_view data, const std::vector<Edit> &edits) {
    size_t size = data.size();
    for (const Edit &e : edits) size = size - (e.end - e.begin) + e.text.size();
    if (size != data.size()) return false;
    size_t in = 0;   // next byte of data not yet placed
    size_t out = 0;  // where it lands in the result
    auto same = [&](const char *piece, size_t n) {
        bool ok = memcmp(piece, data.data() + out, n) == 0;
        out += n;
        return ok;
    };
    for (const Edit &e : edits) {
        if (in == out)
            out += e.begin - in;  // the image against itself
        else if (!same(data.data() + in, e.begin - in))
            return false;
        if (!same(e.text.data(), e.text.size())) return false;
        in = e.end;
    }
    return true;  // the sizes agree, so the tail is the image against itself
}

namespace {
std::atomic<uint64_t> g_parsed{0};
std::atomic<uint64_t> g_listed{0};
}  // namespace

SectionStats SectionStatsGet() {
    return SectionStats{g_parsed.load(std::memory_order_relaxed), g_listed.load(std::memory_order_relaxed)};
}

void SectionStatsAdd(uint64_t parsed, uint64_t listed) {
    if (parsed != 0) g_parsed.fetch_add(parsed, std::memory_order_relaxed);
    if (listed != 0) g_listed.fetch_add(listed, std::memory_order_relaxed);
}
}  // namespace olibc
}  // namespace orlo

extern "C" {

ORLO_EXPORT int OLIBCFileEnumSection(const char *path, POLIBC_SZLIST *ppList) {
    if (!orlo::olibc::IsValidPath(path) || ppList == nullptr) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        std::shared_ptr<const SectionFile> file = orlo::olibc::SectionFileLoad(path);
        if (file == nullptr) return -1;
        if (file->HasBadHeader()) return BadFormat();
        int count = 0;
        for (size_t i = 0; i < file->Count(); ++i) count += file->IsFirstOfName(i) ? 1 : 0;
        bool ours = *ppList == nullptr;
        if (ours) {
            *ppList = OLIBCSzListAlloc(count);
            if (*ppList == nullptr) return -1;
        } else {
            OLIBCSzListRemoveAll(*ppList);
        }
        for (size_t i = 0; i < file->Count(); ++i) {
            if (!file->IsFirstOfName(i)) continue;
            if (OLIBCSzListPush(ppList, file->Name(i)) < 0) {
                if (ours) {
                    OLIBCSzListFree(*ppList);
                    *ppList = nullptr;
                } else {
                    OLIBCSzListRemoveAll(*ppList);
                }
                return -1;
            }
        }
        orlo::olibc::SectionStatsAdd(0, static_cast<uint64_t>(count));
        return count;
    });
}

ORLO_EXPORT int OLIBCFileGetSection(const char *path, const char *section, POLIBC_SZHASH *ppHash) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(section) || ppHash == nullptr)
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        std::shared_ptr<const SectionFile> file = orlo::olibc::SectionFileLoad(path);
        if (file == nullptr) return -1;
        if (file->HasBadHeader()) return BadFormat();
        long i = file->Find(section);
        if (i < 0) return 0;
        return file->CopyInto(static_cast<size_t>(i), ppHash) != 0 ? -1 : 1;
    });
}

ORLO_EXPORT int OLIBCFileSetSection(const char *path, const char *oldName, const char *newName,
                                    const OLIBC_SZHASH *pHash, const char *lineFmt) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(oldName) ||
        !orlo::olibc::IsValidSectionName(newName) || pHash == nullptr || !orlo::olibc::IsValidLineFormat(lineFmt) ||
        !ArePairsValid(pHash))
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        std::vector<Header> headers;
        if (orlo::olibc::ReadImage(path, &image, true) != 0 || ReadHeaders(image.data, &headers) != 0) return -1;
        bool renaming = strcmp(oldName, newName) != 0;
        bool found = false;
        std::vector<Edit> edits;
        for (size_t i = 0; i < headers.size(); ++i) {
            if (renaming && headers[i].name == newName) {
                OLIBCErrSet(OLIBC_ERR_CONF);  // renaming onto a section that exists
                return -1;
            }
            if (headers[i].name != oldName) continue;
            // The first copy becomes the new section; later duplicates go.
            AddEdit(&edits, headers[i].begin, headers[i].end,
                    found ? std::string() : SectionText(newName, pHash, lineFmt));
            found = true;
            LineScanner body(image.data, headers[i].end, orlo::olibc::BodyEnd(headers, i, image.data.size()));
            Line line;
            while (body.Next(&line)) {
                body.Parse(&line);
                if (line.kind != LineKind::kComment && line.kind != LineKind::kBlank)
                    AddEdit(&edits, line.begin, line.end);
            }
        }
        if (!found) return 0;
        if (WriteEdited(path, image, &image.st, edits) != 0) return -1;
        return 1;
    });
}

ORLO_EXPORT int OLIBCFileAddSection(const char *path, const char *section, const OLIBC_SZHASH *pHash,
                                    const char *lineFmt) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(section) || pHash == nullptr ||
        !orlo::olibc::IsValidLineFormat(lineFmt) || !ArePairsValid(pHash))
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        std::vector<Header> headers;
        if (orlo::olibc::ReadImage(path, &image, true) != 0 || ReadHeaders(image.data, &headers) != 0) return -1;
        for (const Header &h : headers) {
            if (h.name == section) {
                OLIBCErrSet(OLIBC_ERR_CONF);  // already there: replace it instead
                return -1;
            }
        }
        std::vector<Edit> edits;
        AddEdit(&edits, image.data.size(), image.data.size(), AtEnd(image.data, SectionText(section, pHash, lineFmt)));
        if (WriteEdited(path, image, &image.st, edits) != 0) return -1;
        return 1;
    });
}

ORLO_EXPORT int OLIBCFileRemoveSection(const char *path, const char *section) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(section)) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        std::vector<Header> headers;
        if (orlo::olibc::ReadImage(path, &image, true) != 0 || ReadHeaders(image.data, &headers) != 0) return -1;
        bool found = false;
        std::vector<Edit> edits;
        for (size_t i = 0; i < headers.size(); ++i) {
            if (headers[i].name != section) continue;
            found = true;
            AddEdit(&edits, headers[i].begin, headers[i].end);
            LineScanner body(image.data, headers[i].end, orlo::olibc::BodyEnd(headers, i, image.data.size()));
            Line line;
            while (body.Next(&line)) {
                body.Parse(&line);
                if (line.kind != LineKind::kComment) AddEdit(&edits, line.begin, line.end);
            }
        }
        if (!found) return 0;
        if (WriteEdited(path, image, &image.st, edits) != 0) return -1;
        return 1;
    });
}

ORLO_EXPORT int OLIBCFileSetSectionValue(const char *path, const char *section, const char *key, const char *value,
                                         const char *lineFmt) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(section) ||
        !orlo::olibc::IsValidKey(key) || !orlo::olibc::IsValidValue(value) || !orlo::olibc::IsValidLineFormat(lineFmt))
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        bool exists = true;
        if (orlo::olibc::ReadImage(path, &image, true) != 0) {
            if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND) return -1;
            exists = false;  // created with the section
        }
        std::vector<Header> headers;
        if (ReadHeaders(image.data, &headers) != 0) return -1;
        std::string keyLine;
        orlo::olibc::AppendLine(&keyLine, lineFmt, key, value);
        size_t i = 0;
        while (i < headers.size() && headers[i].name != section) ++i;
        std::vector<Edit> edits;
        if (i == headers.size()) {
            std::string text = std::string("[") + section + "]\n" + keyLine;
            AddEdit(&edits, image.data.size(), image.data.size(), AtEnd(image.data, std::move(text)));
        } else {
            bool keyFound = false;
            size_t insertAt = headers[i].end;  // after the section's last key line
            LineScanner body(image.data, headers[i].end, orlo::olibc::BodyEnd(headers, i, image.data.size()));
            Line line;
            while (body.Next(&line)) {
                body.Parse(&line);
                if (line.kind != LineKind::kKey) continue;
                insertAt = line.end;
                if (line.key != key) continue;
                AddEdit(&edits, line.begin, line.end, keyFound ? std::string() : keyLine);
                keyFound = true;
            }
            if (!keyFound) {
                if (insertAt == image.data.size()) keyLine = AtEnd(image.data, std::move(keyLine));
                AddEdit(&edits, insertAt, insertAt, std::move(keyLine));
            }
        }
        return WriteEdited(path, image, exists ? &image.st : nullptr, edits);
    });
}

ORLO_EXPORT int OLIBCFileGetSectionValue(const char *path, const char *section, const char *key, char *buf,
                                         size_t size) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(section) || key == nullptr ||
        key[0] == '\0' || buf == nullptr || size == 0)
        return BadParam();
    buf[0] = '\0';
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        std::vector<Header> headers;
        if (orlo::olibc::ReadImage(path, &image, false) != 0 || ReadHeaders(image.data, &headers) != 0) return -1;
        size_t i = 0;
        while (i < headers.size() && headers[i].name != section) ++i;
        bool keyFound = false;
        std::string_view value;
        if (i < headers.size()) {
            LineScanner body(image.data, headers[i].end, orlo::olibc::BodyEnd(headers, i, image.data.size()));
            Line line;
            while (body.Next(&line)) {
                body.Parse(&line);
                if (line.kind == LineKind::kKey && line.key == key) {
                    value = line.value;  // the last of duplicates wins, as in a section's hash
                    keyFound = true;
                }
            }
        }
        if (!keyFound) {
            OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
            return -1;
        }
        if (value.size() >= size) {
            OLIBCErrSet(OLIBC_ERR_TOO_LONG);
            return -1;
        }
        memcpy(buf, value.data(), value.size());
        buf[value.size()] = '\0';
        return static_cast<int>(value.size());
    });
}

}  // extern "C"
