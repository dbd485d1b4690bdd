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
#include <unordered_set>

#include "platform/olibc_file_internal.h"

namespace {

using orlo::olibc::AddEdit;
using orlo::olibc::Edit;
using orlo::olibc::FileImage;
using orlo::olibc::Header;
using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;

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

}  // namespace

namespace orlo {
namespace olibc {
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
        FileImage image;
        std::vector<Header> headers;
        if (orlo::olibc::ReadImage(path, &image, false) != 0 || ReadHeaders(image.data, &headers) != 0) return -1;
        std::vector<std::string_view> names;
        std::unordered_set<std::string_view> seen;
        for (const Header &h : headers)
            if (seen.insert(h.name).second) names.push_back(h.name);
        bool ours = *ppList == nullptr;
        if (ours) {
            *ppList = OLIBCSzListAlloc(static_cast<int>(names.size()));
            if (*ppList == nullptr) return -1;
        } else {
            OLIBCSzListRemoveAll(*ppList);
        }
        std::string name;
        for (std::string_view n : names) {
            name.assign(n);
            if (OLIBCSzListPush(ppList, name.c_str()) < 0) {
                if (ours) {
                    OLIBCSzListFree(*ppList);
                    *ppList = nullptr;
                } else {
                    OLIBCSzListRemoveAll(*ppList);
                }
                return -1;
            }
        }
        orlo::olibc::SectionStatsAdd(0, names.size());
        return static_cast<int>(names.size());
    });
}

ORLO_EXPORT int OLIBCFileGetSection(const char *path, const char *section, POLIBC_SZHASH *ppHash) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidSectionName(section) || ppHash == nullptr)
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        std::vector<Header> headers;
        if (orlo::olibc::ReadImage(path, &image, false) != 0 || ReadHeaders(image.data, &headers) != 0) return -1;
        size_t i = 0;
        while (i < headers.size() && headers[i].name != section) ++i;
        if (i == headers.size()) return 0;
        orlo::olibc::SectionStatsAdd(1, 0);
        std::vector<std::pair<std::string_view, std::string_view>> pairs;
        LineScanner body(image.data, headers[i].end, orlo::olibc::BodyEnd(headers, i, image.data.size()));
        Line line;
        while (body.Next(&line)) {
            body.Parse(&line);
            if (line.kind == LineKind::kKey) pairs.emplace_back(line.key, line.value);
        }
        bool ours = *ppHash == nullptr;
        if (ours) {
            *ppHash = OLIBCSzHashAlloc(static_cast<int>(pairs.size()));
            if (*ppHash == nullptr) return -1;
        } else {
            OLIBCSzHashRemoveAll(*ppHash);
        }
        std::string key;
        std::string value;
        for (const auto &kv : pairs) {
            key.assign(kv.first);
            value.assign(kv.second);
            if (OLIBCSzHashSetValue(ppHash, key.c_str(), value.c_str()) != 0) {
                if (ours) {
                    OLIBCSzHashFree(*ppHash);
                    *ppHash = nullptr;
                } else {
                    OLIBCSzHashRemoveAll(*ppHash);
                }
                return -1;
            }
        }
        return 1;
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
        if (orlo::olibc::ReplaceFile(path, &image.st, orlo::olibc::ApplyEdits(image.data, edits)) != 0) return -1;
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
        if (orlo::olibc::ReplaceFile(path, &image.st, orlo::olibc::ApplyEdits(image.data, edits)) != 0) return -1;
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
        if (orlo::olibc::ReplaceFile(path, &image.st, orlo::olibc::ApplyEdits(image.data, edits)) != 0) return -1;
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
        std::string content = orlo::olibc::ApplyEdits(image.data, edits);
        return orlo::olibc::ReplaceFile(path, exists ? &image.st : nullptr, content) != 0 ? -1 : 0;
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
