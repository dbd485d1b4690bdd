/*
 * Shared machinery of the platform's section and key=value files (private to platform/
 * and to the library's own configuration-file code).
 *
 * A file is read whole into memory (one read pass), walked line by line without
 * copying, and every change is expressed as a list of edits on the byte ranges of its
 * lines; the edited image is then written to a temporary file beside the old one,
 * flushed to disk and renamed over it (one write pass).  The old file is thus either
 * fully replaced or left exactly as it was.
 *
 * Line grammar (what the readers accept):
 *   - a line whose first byte is "[" is a section header; the name is everything after
 *     it up to the first "]" (or to the end of the line); an empty name ("[]", "[") is a
 *     malformed header and section operations refuse the file;
 *   - after optional blanks (space, tab), "#" or ";" starts a comment line;
 *   - a line of blanks only is a blank line;
 *   - a line holding "=" is a key line: the key is what stands before the first "=",
 *     the value what follows it, blanks around the "=" removed (the value keeps its
 *     trailing blanks); a value enclosed in double quotes is unquoted;
 *   - anything else is kept as it stands and otherwise ignored.
 * A "\r" before the newline is ignored.  Lines may be of any length.
 */
#ifndef ORLO_PLATFORM_OLIBC_FILE_INTERNAL_H
#define ORLO_PLATFORM_OLIBC_FILE_INTERNAL_H

#include <stdint.h>
#include <sys/stat.h>

#include <new>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "olibc.h"

namespace orlo {
namespace olibc {

// ---- Temporary files that replace a file ----
// Removes the temporary files of path ("<path>.XXXXXX") that writers killed before their
// rename left behind; those of living writers stay.  errno is kept.
void SweepReplacements(const char *path);
// mkstemp on *tmpl ("<path>.XXXXXX", rewritten with the name made) that keeps an
// exclusive flock on the file for as long as the descriptor is open, so that sweepers
// leave it alone.  The descriptor, or -1 with errno set.
int MakeReplacement(std::string *tmpl);

// ---- What may be written into a file ----
// A section name: not empty, no "]" and no line break.
bool IsValidSectionName(const char *name);
// A key: not empty, no "=" and no line break, not starting with "[", "#" or ";", and no
// blanks at either end (they would not survive a read).
bool IsValidKey(const char *key);
// A value: no line break.
bool IsValidValue(const char *value);
// A line format: exactly two "%s" (key, then value) with "=" between them, only blanks
// before the key, "%%" for a percent sign, no other conversion, one final newline.
bool IsValidLineFormat(const char *fmt);
// Appends one line: fmt with its two "%s" filled by key and value.
void AppendLine(std::string *out, const char *fmt, const char *key, const char *value);
// A copy fit for a log line: control characters shown as \n, \r, \t or \xNN.
std::string Printable(const char *s);

// ---- Lines ----
enum class LineKind { kUnparsed, kHeader, kBadHeader, kBlank, kComment, kKey, kOther };

struct Line {
    size_t begin = 0;       // first byte
    size_t contentEnd = 0;  // end of the text (newline and a "\r" before it excluded)
    size_t end = 0;         // one past the newline (or the end of the file)
    LineKind kind = LineKind::kUnparsed;
    std::string_view name;   // kHeader: the section name
    std::string_view key;    // kKey
    std::string_view value;  // kKey: unquoted
};

// Walks an image line by line.  Next() only tells headers from other lines (enough to
// find a section); Parse() classifies the others when their content matters.
class LineScanner {
  public:
    explicit LineScanner(std::string_view data) : data_(data), limit_(data.size()) {}
    // Only the lines in [begin, end) (line boundaries), offsets still those of data.
    LineScanner(std::string_view data, size_t begin, size_t end) : data_(data), pos_(begin), limit_(end) {}
    bool Next(Line *line);
    void Parse(Line *line) const;
    std::string_view Text(const Line &line) const { return data_.substr(line.begin, line.end - line.begin); }

  private:
    std::string_view data_;
    size_t pos_ = 0;
    size_t limit_;
};

// A section header line of an image.
struct Header {
    size_t begin;           // first byte of the header line
    size_t end;             // one past its newline
    std::string_view name;  // empty for a malformed header
};
// Every header line of data, in order.  Headers are found by looking for "[" at the
// start of a line, so the lines between them cost a byte search rather than a parse.
void ScanHeaders(std::string_view data, std::vector<Header> *headers);
// Where the body of headers[i] ends: the next header, or the end of the image.
inline size_t BodyEnd(const std::vector<Header> &headers, size_t i, size_t size) {
    return i + 1 < headers.size() ? headers[i + 1].begin : size;
}

// ---- Whole files ----
// Buffers of whole-file reads, kept per thread for the next read.  A buffer the size of
// a large configuration file would otherwise come fresh from the kernel at each read and
// be faulted in page by page, which costs more than the read itself; a writer that reads
// a section and then rewrites the file needs two at a time, so two are kept.  Buffers
// under 64 KiB are left to the allocator, those over 16 MiB are not kept.
std::string TakeImageBuffer(size_t size);
void KeepImageBuffer(std::string *buffer);

struct FileImage {
    std::string data;
    struct stat st {};
    FileImage() = default;
    FileImage(const FileImage &) = delete;
    FileImage &operator=(const FileImage &) = delete;
    ~FileImage() { KeepImageBuffer(&data); }
};

// Reads a regular file whole.  forWrite also refuses a symbolic link at path (a writer
// would replace the link, not its target).  0, or -1 with the platform error set:
// OLIBC_ERR_NOT_FOUND (missing), OLIBC_ERR_FOPEN (cannot be opened, or not a regular
// file), OLIBC_ERR_IO, OLIBC_ERR_TOO_LONG (path), OLIBC_ERR_OUT_OF_MEM.
int ReadImage(const char *path, FileImage *image, bool forWrite);

// Replaces path by content atomically: temporary file "<path>.XXXXXX" beside it, write,
// fsync, owner/group/mode of st (0644 and the caller's ids when st is null), rename.
// On failure the temporary file is removed and path is untouched.  0, or -1 with the
// platform error set (OLIBC_ERR_NO_SPACE, OLIBC_ERR_IO, OLIBC_ERR_TOO_LONG, OLIBC_ERR_CONF).
int ReplaceFile(const char *path, const struct stat *st, std::string_view content);
// The same with the content given as pieces written one after another (an edited image
// is written from the old image and the edits' texts, without building it first).
int ReplaceFile(const char *path, const struct stat *st, const std::vector<std::string_view> &pieces);

// A change to an image: bytes [begin, end) become text (an insertion when begin == end).
struct Edit {
    size_t begin;
    size_t end;
    std::string text;
};
// Adds an edit after the ones already there, merging back-to-back deletions.
void AddEdit(std::vector<Edit> *edits, size_t begin, size_t end, std::string text = std::string());
// The image with every edit applied (edits in ascending, non-overlapping order).
std::string ApplyEdits(std::string_view data, const std::vector<Edit> &edits);
// The same as the pieces that make it up, in order: stretches of data and edit texts
// (views into data and edits, valid while both are).
std::vector<std::string_view> EditedPieces(std::string_view data, const std::vector<Edit> &edits);
// Whether ApplyEdits(data, edits) would be data again, found without building it: the
// section writers leave a file alone rather than write the same bytes.
bool ChangesNothing(std::string_view data, const std::vector<Edit> &edits);

// Maps an errno to the platform code that describes it best, else fallback.
int CodeOfErrno(int err, int fallback);

// Counts kept by the section readers, for benchmarks that report how much configuration
// a run parsed: sections parsed (every section of a file each time the file is parsed,
// whether into a kept parse or by the line-by-line LUN reader), and section names listed.
// Relaxed atomics: a reader pays one uncontended increment.
struct SectionStats {
    uint64_t parsed;
    uint64_t listed;
};
SectionStats SectionStatsGet();
void SectionStatsAdd(uint64_t parsed, uint64_t listed);

// Common argument check: a non-empty path.
inline bool IsValidPath(const char *path) { return path != nullptr && path[0] != '\0'; }

// Runs body; an exhausted heap becomes OLIBC_ERR_OUT_OF_MEM and failValue.
template <typename F>
int Guarded(int failValue, F body) {
    try {
        return body();
    } catch (const std::bad_alloc &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return failValue;
    } catch (const std::length_error &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return failValue;
    }
}

}  // namespace olibc
}  // namespace orlo

#endif
