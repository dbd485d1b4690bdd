// Line files: one entry per line, no sections, no keys (the application keys that hold a
// snapshot).  Readers read the file whole; writers read it once, edit the image and replace
// the file atomically through a temporary file beside it, like the section writers.  A
// line is compared as it stands before its newline, byte for byte.
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "platform/olibc_file_internal.h"

namespace {

using orlo::olibc::FileImage;

int BadParam() {
    OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
    return -1;
}

// The file whole; a missing file reads as empty (*exists false).  0 or -1.
int Read(const char *path, FileImage *image, bool forWrite, bool *exists) {
    *exists = true;
    if (orlo::olibc::ReadImage(path, image, forWrite) == 0) return 0;
    if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND) return -1;
    *exists = false;
    image->data.clear();
    return 0;
}

// Calls visit(begin, contentEnd, end) for every line of data: its first byte, the end of
// its text, one past its newline.  A false from visit stops the walk.
template <typename Visit>
void ForEachLine(const std::string &data, Visit visit) {
    size_t pos = 0;
    while (pos < data.size()) {
        const void *nl = memchr(data.data() + pos, '\n', data.size() - pos);
        size_t contentEnd = nl != nullptr ? static_cast<size_t>(static_cast<const char *>(nl) - data.data()) : data.size();
        size_t end = nl != nullptr ? contentEnd + 1 : data.size();
        if (!visit(pos, contentEnd, end)) return;
        pos = end;
    }
}

bool Equals(const std::string &data, size_t begin, size_t contentEnd, std::string_view line) {
    return contentEnd - begin == line.size() && memcmp(data.data() + begin, line.data(), line.size()) == 0;
}

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBCFileMatchLineNo(const char *path, const char *line) {
    if (!orlo::olibc::IsValidPath(path) || line == nullptr) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        bool exists = false;
        if (Read(path, &image, false, &exists) != 0) return -1;
        int number = 0;
        int found = 0;
        ForEachLine(image.data, [&](size_t begin, size_t contentEnd, size_t) {
            ++number;
            if (!Equals(image.data, begin, contentEnd, line)) return true;
            found = number;
            return false;
        });
        return found;
    });
}

ORLO_EXPORT int OLIBCFileAddLine(const char *path, const char *line) {
    if (!orlo::olibc::IsValidPath(path) || line == nullptr || strpbrk(line, "\n\r") != nullptr ||
        strlen(line) > OLIBC_FILE_LINE_MAX - 1)
        return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        bool exists = false;
        if (Read(path, &image, true, &exists) != 0) return -1;
        std::string content = image.data;
        if (!content.empty() && content.back() != '\n') content.push_back('\n');
        content.append(line).push_back('\n');
        return orlo::olibc::ReplaceFile(path, exists ? &image.st : nullptr, content) != 0 ? -1 : 0;
    });
}

ORLO_EXPORT int OLIBCFileRemoveLine(const char *path, const char *line) {
    if (!orlo::olibc::IsValidPath(path) || line == nullptr) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        bool exists = false;
        if (Read(path, &image, true, &exists) != 0) return -1;
        std::vector<orlo::olibc::Edit> edits;
        int removed = 0;
        ForEachLine(image.data, [&](size_t begin, size_t contentEnd, size_t end) {
            if (Equals(image.data, begin, contentEnd, line)) {
                orlo::olibc::AddEdit(&edits, begin, end);
                ++removed;
            }
            return true;
        });
        if (removed == 0) return 0;
        std::string content = orlo::olibc::ApplyEdits(image.data, edits);
        return orlo::olibc::ReplaceFile(path, &image.st, content) != 0 ? -1 : removed;
    });
}

ORLO_EXPORT int OLIBCFileReadLines(const char *path, POLIBC_SZLIST *ppList) {
    if (!orlo::olibc::IsValidPath(path) || ppList == nullptr) return BadParam();
    return orlo::olibc::Guarded(-1, [&]() -> int {
        FileImage image;
        bool exists = false;
        if (Read(path, &image, false, &exists) != 0) return -1;
        const bool ours = *ppList == nullptr;
        if (ours) {
            *ppList = OLIBCSzListAlloc(16);
            if (*ppList == nullptr) return -1;
        }
        const int before = OLIBCSzListCount(*ppList);
        int count = 0;
        bool ok = true;
        std::string text;
        ForEachLine(image.data, [&](size_t begin, size_t, size_t end) {
            text.assign(image.data, begin, end - begin);
            ok = OLIBCSzListPush(ppList, text.c_str()) >= 0;
            count += ok;
            return ok;
        });
        if (ok) return count;
        if (ours) {
            OLIBCSzListFree(*ppList);
            *ppList = nullptr;
        } else {
            while (OLIBCSzListCount(*ppList) > before) OLIBCSzListPop(*ppList, nullptr, 0);
        }
        return -1;
    });
}

}  // extern "C"
