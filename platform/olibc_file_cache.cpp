// The per-thread cache of parsed section files: finding the sections of one image, the
// key lines, hashes, indexes and facts of a parse built at first use, and the small
// least-recently-used table that ties each parse to the version of the file it came from.
#include "platform/olibc_file_cache.h"

#include <sys/stat.h>
#include <time.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <new>
#include <stdexcept>

#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace olibc {

namespace {

// Files changed this close before they were read are compared by content at each use:
// timestamps advance in ticks (a jiffy of the coarse clock, up to a second on some file
// systems), and an edit within the tick of the one we read would keep every stat field.
constexpr time_t kRacySeconds = 2;
thread_local time_t tlsRacySeconds = kRacySeconds;

const std::vector<uint32_t> kNoCandidates;

}  // namespace

SectionFile::~SectionFile() {
    for (POLIBC_SZHASH h : hashes_) OLIBCSzHashFree(h);
}

void SectionFile::Parse(std::string data) {
    data_ = std::move(data);
    sections_.clear();
    byName_.clear();
    for (POLIBC_SZHASH h : hashes_) OLIBCSzHashFree(h);
    hashes_.clear();
    indexes_.clear();
    facts_.clear();
    hasBadHeader_ = false;
    hasNulInName_ = false;
    if (data_.size() > UINT32_MAX / 2) throw std::bad_alloc();  // offsets are 32-bit
    // What the strings of a file can take: a header line stores its name and a NUL, no
    // more than the line's "[", "]" or newline; a key line stores key, NUL, value, NUL,
    // no more than the line with its "=" and newline.  Only the last line may lack its
    // newline (one byte more), and offset 0 holds the empty name of a malformed header.
    // The buffer is left uninitialised: only the bytes written are ever touched.
    capacity_ = data_.size() + 2;
    strings_.reset(new char[capacity_]);
    strings_[0] = '\0';
    used_ = 1;
    std::vector<Header> headers;
    ScanHeaders(data_, &headers);
    sections_.reserve(headers.size());
    size_t slots = 1;
    while (slots < 2 * headers.size()) slots *= 2;
    byName_.assign(slots, 0);
    for (size_t i = 0; i < headers.size(); ++i) {
        const Header &h = headers[i];
        Section s{};
        s.badHeader = h.name.empty();
        s.nameOff = s.badHeader ? 0 : Store(h.name);
        s.nameDataOff = static_cast<uint32_t>(h.name.data() - data_.data());
        s.nameLen = static_cast<uint32_t>(h.name.size());
        s.bodyBegin = static_cast<uint32_t>(h.end);
        s.bodyEnd = static_cast<uint32_t>(BodyEnd(headers, i, data_.size()));
        hasBadHeader_ = hasBadHeader_ || s.badHeader;
        hasNulInName_ = hasNulInName_ || h.name.find('\0') != std::string_view::npos;
        sections_.push_back(s);
        if (s.badHeader) continue;
        size_t k = SlotOf(h.name);
        while (byName_[k] != 0 && NameInData(byName_[k] - 1) != h.name) k = (k + 1) & (byName_.size() - 1);
        if (byName_[k] == 0) {
            byName_[k] = static_cast<uint32_t>(i + 1);
            sections_.back().firstOfName = true;
        }
    }
    hashes_.assign(sections_.size(), nullptr);
}

uint32_t SectionFile::Store(std::string_view s) const {
    s = s.substr(0, s.find('\0'));
    // The bound taken at load makes this hold; were it ever broken, the string would
    // read empty rather than be written past the buffer.
    if (used_ + s.size() + 1 > capacity_) return 0;
    const uint32_t off = static_cast<uint32_t>(used_);
    memcpy(strings_.get() + used_, s.data(), s.size());
    strings_[used_ + s.size()] = '\0';
    used_ += s.size() + 1;
    return off;
}

const SectionFile::Section &SectionFile::Body(size_t i) const {
    Section &s = sections_[i];
    if (s.parsed) return s;
    s.pairsOff = static_cast<uint32_t>(used_);
    LineScanner body(data_, s.bodyBegin, s.bodyEnd);
    Line line;
    while (body.Next(&line)) {
        body.Parse(&line);
        if (line.kind != LineKind::kKey) continue;
        Store(line.key);
        Store(line.value);
        ++s.pairCount;
    }
    s.parsed = true;
    return s;
}

long SectionFile::Find(std::string_view name) const {
    if (byName_.empty()) return -1;
    for (size_t k = SlotOf(name);; k = (k + 1) & (byName_.size() - 1)) {
        const uint32_t v = byName_[k];
        if (v == 0) return -1;
        if (NameInData(v - 1) == name) return static_cast<long>(v - 1);
    }
}

const char *SectionFile::ValueOf(size_t i, const char *key) const {
    const char *found = nullptr;
    ForEachPair(i, [&](const char *k, const char *v) {
        if (strcmp(k, key) == 0) found = v;
    });
    return found;
}

int SectionFile::CopyInto(size_t i, POLIBC_SZHASH *ppHash) const {
    const bool ours = *ppHash == nullptr;
    if (ours) {
        *ppHash = OLIBCSzHashAlloc(static_cast<int>(PairCount(i)));
        if (*ppHash == nullptr) return -1;
    } else {
        OLIBCSzHashRemoveAll(*ppHash);
    }
    bool failed = false;
    ForEachPair(i, [&](const char *key, const char *value) {
        if (!failed && OLIBCSzHashSetValue(ppHash, key, value) != 0) failed = true;
    });
    if (failed) {
        if (ours) {
            OLIBCSzHashFree(*ppHash);
            *ppHash = nullptr;
        } else {
            OLIBCSzHashRemoveAll(*ppHash);
        }
        return -1;
    }
    return 0;
}

const OLIBC_SZHASH *SectionFile::Hash(size_t i) const {
    if (hashes_[i] == nullptr) {
        POLIBC_SZHASH h = nullptr;
        if (CopyInto(i, &h) != 0) return nullptr;
        hashes_[i] = h;
    }
    return hashes_[i];
}

const std::vector<uint32_t> *SectionFile::Candidates(KeyOf keyOf, int64_t key) const {
    try {
        const Index *index = nullptr;
        for (const auto &entry : indexes_)
            if (entry.first == keyOf) index = entry.second.get();
        if (index == nullptr) {
            auto built = std::make_unique<Index>();
            for (size_t i = 0; i < sections_.size(); ++i) {
                int64_t k = 0;
                if (keyOf(*this, i, &k)) (*built)[k].push_back(static_cast<uint32_t>(i));
            }
            index = built.get();
            indexes_.emplace_back(keyOf, std::move(built));
        }
        auto it = index->find(key);
        return it == index->end() ? &kNoCandidates : &it->second;
    } catch (const std::bad_alloc &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
}

bool SectionFile::Holds(Fact fact) const {
    for (const auto &entry : facts_)
        if (entry.first == fact) return entry.second;
    bool holds = fact(*this);
    try {
        facts_.emplace_back(fact, holds);
    } catch (const std::bad_alloc &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return false;
    }
    return holds;
}

bool CandidatesOf(const SectionFile &file, SectionFile::KeyOf keyOf, const std::vector<int64_t> &keys,
                  std::vector<uint32_t> *out) {
    try {
        out->clear();
        for (int64_t key : keys) {
            const std::vector<uint32_t> *c = file.Candidates(keyOf, key);
            if (c == nullptr) return false;
            out->insert(out->end(), c->begin(), c->end());
        }
        std::sort(out->begin(), out->end());
        out->erase(std::unique(out->begin(), out->end()), out->end());
        return true;
    } catch (const std::bad_alloc &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return false;
    }
}

namespace {

struct Identity {
    dev_t dev = 0;
    ino_t ino = 0;
    off_t size = 0;
    struct timespec mtime {};
    struct timespec ctime {};
};

// How finely timestamps tell versions apart: exact here, coarser in tests that play a
// file system whose timestamps advance in ticks.
thread_local int64_t tlsTickNs = 1;

bool operator==(const struct timespec &a, const struct timespec &b) {
    const int64_t na = static_cast<int64_t>(a.tv_sec) * 1000000000 + a.tv_nsec;
    const int64_t nb = static_cast<int64_t>(b.tv_sec) * 1000000000 + b.tv_nsec;
    return na / tlsTickNs == nb / tlsTickNs;
}

bool operator==(const Identity &a, const Identity &b) {
    return a.dev == b.dev && a.ino == b.ino && a.size == b.size && a.mtime == b.mtime && a.ctime == b.ctime;
}

Identity IdentityOf(const struct stat &st) {
    Identity id;
    id.dev = st.st_dev;
    id.ino = st.st_ino;
    id.size = st.st_size;
    id.mtime = st.st_mtim;
    id.ctime = st.st_ctim;
    return id;
}

struct timespec Now() {
    struct timespec now {};
    clock_gettime(CLOCK_REALTIME, &now);
    return now;
}

// Whether a file changed at ctime may still change without its stat telling, as seen by
// a read that started at readStart.
bool IsRacy(const struct timespec &ctime, const struct timespec &readStart) {
    time_t limit = readStart.tv_sec - tlsRacySeconds;
    return ctime.tv_sec > limit || (ctime.tv_sec == limit && ctime.tv_nsec >= readStart.tv_nsec);
}

struct Entry {
    std::string mapped;  // the path as the seam maps it: a new sandbox root is a new file
    Identity id;
    bool racy = false;
    std::shared_ptr<SectionFile> file;
};

// Most recently used first.
thread_local std::vector<Entry> tlsEntries;

// Called before an entry is dropped: a parse nobody else holds gives its image's buffer
// to the next read (a writer drops the parse of the file it replaced, and the next read
// of that file needs a buffer of the same size).
void Recycle(Entry &e) {
    if (e.file != nullptr && e.file.use_count() == 1) e.file->GiveBackImage();
}

std::shared_ptr<SectionFile> ParseImage(FileImage *image) {
    auto file = std::make_shared<SectionFile>();
    file->Parse(std::move(image->data));
    SectionStatsAdd(file->Count(), 0);
    return file;
}

std::shared_ptr<const SectionFile> Load(const char *path) {
    std::string mapped = os::Map(path);
    if (mapped.empty()) {  // cannot be mapped: let the read report why
        FileImage image;
        if (ReadImage(path, &image, false) != 0) return nullptr;
        return ParseImage(&image);
    }
    auto it = std::find_if(tlsEntries.begin(), tlsEntries.end(),
                           [&mapped](const Entry &e) { return e.mapped == mapped; });
    struct stat st;
    if (it != tlsEntries.end()) {
        if (os::Stat(path, &st) == 0 && IdentityOf(st) == it->id && !it->racy) {
            std::rotate(tlsEntries.begin(), it, it + 1);
            return tlsEntries.front().file;
        }
    }
    const struct timespec readStart = Now();
    FileImage image;
    if (ReadImage(path, &image, false) != 0) {
        if (it != tlsEntries.end()) {
            Recycle(*it);
            tlsEntries.erase(it);
        }
        return nullptr;
    }
    const Identity id = IdentityOf(image.st);
    const bool racy = IsRacy(id.ctime, readStart);
    if (it != tlsEntries.end() && it->file->Data() == image.data) {
        // The same bytes (a racy file unchanged, or a file rewritten as it was): the kept
        // parse still holds, and is trusted by stat alone once the file is old enough.
        it->id = id;
        it->racy = racy;
        std::rotate(tlsEntries.begin(), it, it + 1);
        return tlsEntries.front().file;
    }
    std::shared_ptr<SectionFile> file = ParseImage(&image);
    if (it != tlsEntries.end()) {
        Recycle(*it);
        tlsEntries.erase(it);
    }
    if (tlsEntries.size() >= kSectionFileCacheSize) {
        Recycle(tlsEntries.back());
        tlsEntries.pop_back();
    }
    Entry entry;
    entry.mapped = std::move(mapped);
    entry.id = id;
    entry.racy = racy;
    entry.file = file;
    tlsEntries.insert(tlsEntries.begin(), std::move(entry));
    return file;
}

}  // namespace

std::shared_ptr<const SectionFile> SectionFileLoad(const char *path) {
    if (!IsValidPath(path)) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return nullptr;
    }
    try {
        return Load(path);
    } catch (const std::bad_alloc &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    } catch (const std::length_error &) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
}

void SectionFileForget(const char *path) {
    if (!IsValidPath(path)) return;
    try {
        std::string mapped = os::Map(path);
        tlsEntries.erase(std::remove_if(tlsEntries.begin(), tlsEntries.end(),
                                        [&mapped](Entry &e) {
                                            if (e.mapped != mapped) return false;
                                            Recycle(e);
                                            return true;
                                        }),
                         tlsEntries.end());
    } catch (const std::bad_alloc &) {
        tlsEntries.clear();  // cannot tell which: forget them all
    }
}

void SectionFileCacheClear() { tlsEntries.clear(); }

size_t SectionFileCacheEntries() { return tlsEntries.size(); }

void SectionFileCacheSetTimestampTick(int64_t ns) { tlsTickNs = ns > 0 ? ns : 1; }

void SectionFileCacheSetRacySeconds(int seconds) { tlsRacySeconds = seconds >= 0 ? seconds : kRacySeconds; }

}  // namespace olibc
}  // namespace orlo
