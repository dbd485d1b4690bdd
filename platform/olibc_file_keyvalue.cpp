// Flat key=value files (no sections): the appliance's information files, isns.conf and
// progress files.  Every key line of the file counts, wherever it stands; section
// headers, comments and other lines are kept as they are and otherwise ignored.  When a
// key appears more than once the last line wins on reading, and setting it rewrites the
// first line and drops the others.
#include <cstring>
#include <string_view>
#include <utility>

#include "platform/olibc_file_internal.h"

namespace {

using orlo::olibc::AddEdit;
using orlo::olibc::Edit;
using orlo::olibc::FileImage;
using orlo::olibc::Line;
using orlo::olibc::LineKind;
using orlo::olibc::LineScanner;

int BadParam() {
    OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
    return -1;
}

// The value of key (the last of its lines).  1 found, 0 absent.
int FindValue(const std::string &data, const char *key, std::string_view *value) {
    int found = 0;
    LineScanner scanner(data);
    Line line;
    while (scanner.Next(&line)) {
        if (line.kind != LineKind::kUnparsed) continue;
        scanner.Parse(&line);
        if (line.kind == LineKind::kKey && line.key == key) {
            *value = line.value;
            found = 1;
        }
    }
    return found;
}

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBCFileGetKeyValue(const char *path, const char *key, char *buf, size_t size) {
    if (!orlo::olibc::IsValidPath(path) || key == nullptr || key[0] == '\0' || buf == nullptr || size == 0)
        return BadParam();
    buf[0] = '\0';
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        if (orlo::olibc::ReadImage(path, &image, false) != 0) return -1;
        std::string_view value;
        if (!FindValue(image.data, key, &value)) {
            OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
            return -1;
        }
        if (value.size() >= size) {
            OLIBCErrSet(OLIBC_ERR_TOO_LONG);  // refused, never cut
            return -1;
        }
        memcpy(buf, value.data(), value.size());
        buf[value.size()] = '\0';
        return static_cast<int>(value.size());
    });
}

ORLO_EXPORT int OLIBCFileSetKeyValue(const char *path, const char *key, const char *value, const char *lineFmt) {
    if (!orlo::olibc::IsValidPath(path) || !orlo::olibc::IsValidKey(key) || !orlo::olibc::IsValidValue(value) ||
        !orlo::olibc::IsValidLineFormat(lineFmt))
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        bool exists = true;
        if (orlo::olibc::ReadImage(path, &image, true) != 0) {
            if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND) return -1;
            exists = false;
        }
        std::string keyLine;
        orlo::olibc::AppendLine(&keyLine, lineFmt, key, value);
        bool found = false;
        std::vector<Edit> edits;
        LineScanner scanner(image.data);
        Line line;
        while (scanner.Next(&line)) {
            if (line.kind != LineKind::kUnparsed) continue;
            scanner.Parse(&line);
            if (line.kind != LineKind::kKey || line.key != key) continue;
            AddEdit(&edits, line.begin, line.end, found ? std::string() : keyLine);
            found = true;
        }
        if (!found) {
            if (!image.data.empty() && image.data.back() != '\n') keyLine.insert(keyLine.begin(), '\n');
            AddEdit(&edits, image.data.size(), image.data.size(), std::move(keyLine));
        }
        std::string content = orlo::olibc::ApplyEdits(image.data, edits);
        return orlo::olibc::ReplaceFile(path, exists ? &image.st : nullptr, content) != 0 ? -1 : 0;
    });
}

ORLO_EXPORT int OLIBCFileGetKeys(const char *path, POLIBC_SZHASH *ppHash) {
    if (!orlo::olibc::IsValidPath(path) || ppHash == nullptr) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        if (orlo::olibc::ReadImage(path, &image, false) != 0) return -1;
        std::vector<std::pair<std::string, std::string>> pairs;
        LineScanner scanner(image.data);
        Line line;
        while (scanner.Next(&line)) {
            if (line.kind != LineKind::kUnparsed) continue;
            scanner.Parse(&line);
            if (line.kind == LineKind::kKey) pairs.emplace_back(std::string(line.key), std::string(line.value));
        }
        bool ours = *ppHash == nullptr;
        if (ours) {
            *ppHash = OLIBCSzHashAlloc(static_cast<int>(pairs.size()));
            if (*ppHash == nullptr) return -1;
        } else {
            OLIBCSzHashRemoveAll(*ppHash);
        }
        for (const auto &kv : pairs) {
            if (OLIBCSzHashSetValue(ppHash, kv.first.c_str(), kv.second.c_str()) != 0) {
                if (ours) {
                    OLIBCSzHashFree(*ppHash);
                    *ppHash = nullptr;
                } else {
                    OLIBCSzHashRemoveAll(*ppHash);
                }
                return -1;
            }
        }
        return OLIBCSzHashCount(*ppHash);
    });
}

ORLO_EXPORT int OLIBCFileCheckKeyValue(const char *path, const char *key, const char *value) {
    if (!orlo::olibc::IsValidPath(path) || key == nullptr || key[0] == '\0' || value == nullptr) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        if (orlo::olibc::ReadImage(path, &image, false) != 0) return OLIBCErrGet() == OLIBC_ERR_NOT_FOUND ? 0 : -1;
        std::string_view found;
        return FindValue(image.data, key, &found) && found == value ? 1 : 0;
    });
}

}  // extern "C"
