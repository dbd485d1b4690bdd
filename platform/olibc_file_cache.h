/*
 * Parsed section files, kept per thread (private to platform/ and to the library's own
 * configuration readers).
 *
 * Bringing the service up asks the same few configuration files the same questions once
 * per target; parsing a whole file for each answer made the start grow with the square of
 * the configuration.  This cache keeps, for each thread, the parse of the last few files it
 * read (at most kSectionFileCacheSize paths, the least recently used one dropped), so a
 * question costs one stat of the file plus a lookup.
 *
 * A parse is tied to one version of its file: on every use the file is looked at again
 * (device, inode, size, modification and change times with nanoseconds).  Writers replace
 * files by rename, so a change gives a new inode and a new change time.  A file whose
 * change time is too recent to be trusted (within two seconds before it was read: a later
 * edit in the same timestamp tick would look the same) is compared byte for byte at each
 * use until it is old enough; an in-place edit that keeps the size is thus seen too.
 *
 * A SectionFile holds every header line of the file in file order (duplicates and
 * malformed headers included; lines before the first header belong to no section) with
 * the key lines of its body, exactly as the section readers parse them.  Loading a file
 * finds its headers only (a byte search for "[" at line starts); the key lines of a
 * section are parsed when that section is first asked about.  A writer that reads one
 * section and then replaces the file thus pays for the headers, not for every line.
 * A parse is immutable except for what it builds on first use (a section's key lines,
 * its hash, indexes, facts), and belongs to the thread that loaded it: the library takes
 * no in-process lock, and each thread has a cache of its own.  Callers hold the file's
 * lock file while they use a parse, as they did when they read the file themselves.
 *
 * Functions here never throw: a failed allocation sets OLIBC_ERR_OUT_OF_MEM and yields
 * nullptr (or false).
 */
#ifndef ORLO_PLATFORM_OLIBC_FILE_CACHE_H
#define ORLO_PLATFORM_OLIBC_FILE_CACHE_H

#include <stddef.h>
#include <stdint.h>

#include <cstring>
#include <memory>
#include <string>
#include <functional>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "olibc.h"
#include "platform/olibc_file_internal.h"

namespace orlo {
namespace olibc {

constexpr size_t kSectionFileCacheSize = 8;

class SectionFile {
  public:
    // Derives a number from section i (the value of a key, or what its name holds); false
    // when the section has none.
    using KeyOf = bool (*)(const SectionFile &file, size_t i, int64_t *key);
    // A statement about a whole file version.
    using Fact = bool (*)(const SectionFile &file);

    SectionFile() = default;
    SectionFile(const SectionFile &) = delete;
    SectionFile &operator=(const SectionFile &) = delete;
    ~SectionFile();

    // Parses an image.  Throws std::bad_alloc.
    void Parse(std::string data);

    const std::string &Data() const { return data_; }
    // Hands the image's buffer over for the next whole-file read (KeepImageBuffer).  For
    // the cache alone, as it drops the last reference to a parse: the parse is empty after.
    void GiveBackImage() { KeepImageBuffer(&data_); }
    // Header lines, in file order.
    size_t Count() const { return sections_.size(); }
    // The name (NUL-terminated, so cut at a NUL byte it may hold; "" for a malformed
    // header).
    const char *Name(size_t i) const { return strings_.get() + sections_[i].nameOff; }
    size_t NameLength(size_t i) const { return sections_[i].nameLen; }
    bool IsBadHeader(size_t i) const { return sections_[i].badHeader; }
    // Whether no earlier header has this section's name: the section that name-based
    // readers (enumeration, get) see.
    bool IsFirstOfName(size_t i) const { return sections_[i].firstOfName; }
    bool HasBadHeader() const { return hasBadHeader_; }
    // No malformed header and no NUL byte in a name: every section can be named by a C
    // string, so reading the parse and reading by name agree.
    bool IsPlain() const { return !hasBadHeader_ && !hasNulInName_; }
    // The first section named name, or -1.
    long Find(std::string_view name) const;

    // The number of key lines of section i, duplicates included.
    size_t PairCount(size_t i) const { return Body(i).pairCount; }
    // Calls visit(key, value) for each key line of section i in file order, duplicates
    // included (NUL-terminated copies, cut at a NUL byte the file may hold).
    template <typename Visit>
    void ForEachPair(size_t i, Visit visit) const {
        const Section &s = Body(i);
        const char *p = strings_.get() + s.pairsOff;
        for (uint32_t k = 0; k < s.pairCount; ++k) {
            const char *key = p;
            p += strlen(p) + 1;
            const char *value = p;
            p += strlen(p) + 1;
            visit(key, value);
        }
    }
    // What the section's hash holds for key (the last line of the key), or nullptr.
    const char *ValueOf(size_t i, const char *key) const;

    // The section's keys as a hash, built at first use and kept with the parse; callers
    // only read it.  nullptr (platform error set) when it cannot be built.
    const OLIBC_SZHASH *Hash(size_t i) const;
    // Puts the section's keys into *ppHash the way OLIBCFileGetSection does: a null
    // handle gets a new hash, an existing one is emptied first.  0, or -1 (platform error
    // set; a hash made here is freed, an existing one left empty).
    int CopyInto(size_t i, POLIBC_SZHASH *ppHash) const;

    // The sections (all header lines, file order) for which keyOf yields key; the index
    // of keyOf is built at first use.  nullptr when it cannot be built.
    const std::vector<uint32_t> *Candidates(KeyOf keyOf, int64_t key) const;
    // Whether fact holds for this file version (evaluated once).  false when it cannot
    // be evaluated.
    bool Holds(Fact fact) const;

  private:
    struct Section {
        uint32_t nameOff;      // in strings_
        uint32_t nameDataOff;  // in data_
        uint32_t nameLen;
        uint32_t bodyBegin;  // the body's lines: [bodyBegin, bodyEnd) of data_
        uint32_t bodyEnd;
        uint32_t pairsOff;   // once parsed: "key\0value\0" per key line in strings_
        uint32_t pairCount;
        bool badHeader;
        bool firstOfName;
        bool parsed;
    };

    // Section i with its key lines parsed (at first use).  Never fails: the string
    // buffer is sized at load for every line of the file.
    const Section &Body(size_t i) const;
    // Copies s (up to a NUL byte in it) into strings_ with a terminating NUL; its offset.
    uint32_t Store(std::string_view s) const;
    // The name of section i as the file holds it (NUL bytes included).
    std::string_view NameInData(size_t i) const {
        return std::string_view(data_).substr(sections_[i].nameDataOff, sections_[i].nameLen);
    }
    // Where the probe for name starts in byName_.
    size_t SlotOf(std::string_view name) const { return std::hash<std::string_view>{}(name) & (byName_.size() - 1); }

    using Index = std::unordered_map<int64_t, std::vector<uint32_t>>;

    std::string data_;
    // Names, keys and values, each NUL-terminated.  Sized at load so that every line of
    // the file fits once: it never moves, and the strings handed out stay valid.
    mutable std::unique_ptr<char[]> strings_;
    mutable size_t used_ = 0;
    size_t capacity_ = 0;
    mutable std::vector<Section> sections_;
    // The first section of each name: an open-addressing table (linear probing) whose
    // slots hold a section's index + 1, or 0 when empty; a power of two at least twice
    // the sections, so one allocation serves a file of any size.
    std::vector<uint32_t> byName_;
    bool hasBadHeader_ = false;
    bool hasNulInName_ = false;
    mutable std::vector<POLIBC_SZHASH> hashes_;
    mutable std::vector<std::pair<KeyOf, std::unique_ptr<Index>>> indexes_;  // stable while the parse lives
    mutable std::vector<std::pair<Fact, bool>> facts_;
};

// The union of the candidates of several keys, in file order without repeats.  false
// when an index cannot be built.
bool CandidatesOf(const SectionFile &file, SectionFile::KeyOf keyOf, const std::vector<int64_t> &keys,
                  std::vector<uint32_t> *out);

// The thread's platform error state, kept across a look at the cache whose failure is
// handed to another reader to report.
struct ErrState {
    int code;
    const char *file;
    int line;
    static ErrState Save() { return ErrState{OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine()}; }
    void Restore() const { OLIBCErrSetEx(code, file, line); }
};

// The parse of the file at path as it is now: this thread's kept parse when the file has
// not changed since, else a fresh read and parse (which counts its sections as parsed).
// nullptr with the platform error set as a whole-file read sets it: OLIBC_ERR_NOT_FOUND,
// OLIBC_ERR_FOPEN (cannot be opened, or not a regular file), OLIBC_ERR_IO,
// OLIBC_ERR_TOO_LONG, OLIBC_ERR_OUT_OF_MEM.  A failure is never kept.
std::shared_ptr<const SectionFile> SectionFileLoad(const char *path);

// The parse of path for a reader that falls back to reading by name when the parse
// cannot serve it: nullptr when the file cannot be parsed or is not plain (a malformed
// header, a NUL in a name), with the platform error state left as it was before, so
// that the fallback reports what it finds as it always has.
inline std::shared_ptr<const SectionFile> PlainSectionFileLoad(const char *path) {
    const ErrState before = ErrState::Save();
    std::shared_ptr<const SectionFile> file = SectionFileLoad(path);
    if (file != nullptr && file->IsPlain()) return file;
    before.Restore();
    return nullptr;
}

// Calls visit(i) for each of candidates (every section when candidates is nullptr) that
// readers by name see, the first section of each name, in file order; the first result
// other than 0 ends the walk and is returned.
template <typename Visit>
uint32_t ForEachNamedSection(const SectionFile &file, const std::vector<uint32_t> *candidates, Visit visit) {
    const size_t n = candidates != nullptr ? candidates->size() : file.Count();
    for (size_t k = 0; k < n; ++k) {
        const size_t i = candidates != nullptr ? (*candidates)[k] : k;
        if (!file.IsFirstOfName(i)) continue;
        uint32_t ret = visit(i);
        if (ret != 0) return ret;
    }
    return 0;
}

// Drops this thread's parse of path (a writer of this thread has just replaced the file).
void SectionFileForget(const char *path);

// Drops every parse this thread keeps.
void SectionFileCacheClear();

// How many parses this thread keeps (for tests).
size_t SectionFileCacheEntries();

// For tests: how recent (in seconds before the read) a change must be for this thread to
// check the file by content rather than trust its stat; a negative value restores the
// default of two seconds.
void SectionFileCacheSetRacySeconds(int seconds);
// For tests: compares this thread's timestamps in ticks of ns nanoseconds, as on a file
// system whose timestamps are that coarse (0 or less: exactly).
void SectionFileCacheSetTimestampTick(int64_t ns);

}  // namespace olibc
}  // namespace orlo

#endif
