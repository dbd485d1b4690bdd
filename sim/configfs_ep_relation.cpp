// The extent-pool module's side of clones and mirrors, as far as the library can see it:
// what the kernel writes into a child backstore's map file.  The layout is the pool
// files' (docs/extent-pool.md): little-endian words, 64-byte blocks each checked by the
// CRC-32 of the block with its first word zero, the map header at 64, variable blocks 0
// and 2 at 4096 and 4224, and one 8-byte entry per extent after the 1 MiB head.
//
// A clone or mirror that reaches its end leaves the child with the parent's extent
// entries (the extents are shared), the parent's mapped count, a synced count equal to
// its own total, the parent as parent, and the parent's UUID as the version of what it
// holds.  A mirror child is marked (child attribute 0x2) at its start and as stable (0x4)
// when it is promoted.
#include <fcntl.h>
#include <unistd.h>
#include <zlib.h>

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "configfs_sim.h"

namespace orlosim {

namespace {

constexpr off_t kMapHeader = 64;
constexpr off_t kVar0 = 4096;
constexpr off_t kVar2 = 4224;
constexpr off_t kHeadSize = 1 << 20;
constexpr size_t kBlock = 64;
constexpr off_t kUuidInHeader = 20;      // the file's own UUID, in the common header
constexpr size_t kTotalInMap = 12;       // u64 total count, map header
constexpr size_t kParentUuidInMap = 20;  // 16 bytes, map header
constexpr size_t kParentTotalInMap = 36; // u64, map header
constexpr size_t kMappedInVar0 = 4;      // u64
constexpr size_t kSyncedInVar2 = 4;      // u64
constexpr size_t kChildAttrInVar2 = 12;  // u32
constexpr size_t kBaseVersionInVar2 = 16;  // 16 bytes
constexpr uint32_t kMirrorChild = 0x2;
constexpr uint32_t kStable = 0x4;

// A map file opened for the kernel's edits of its blocks.
class MapFile {
  public:
    explicit MapFile(const std::string &path) : fd_(open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW)) {}
    ~MapFile() {
        if (fd_ >= 0) close(fd_);
    }
    bool ok() const { return fd_ >= 0; }
    bool Read(off_t off, void *buf, size_t n) const { return pread(fd_, buf, n, off) == static_cast<ssize_t>(n); }
    // Writes a block back with its checksum made anew.
    bool WriteBlock(off_t off, uint8_t *block) const {
        memset(block, 0, 4);
        uint32_t crc = static_cast<uint32_t>(crc32(0L, block, static_cast<uInt>(kBlock)));
        for (int i = 0; i < 4; ++i) block[i] = static_cast<uint8_t>(crc >> (8 * i));
        return pwrite(fd_, block, kBlock, off) == static_cast<ssize_t>(kBlock);
    }
    off_t Size() const { return lseek(fd_, 0, SEEK_END); }
    int fd() const { return fd_; }

  private:
    int fd_;
};

uint64_t Get64(const uint8_t *p) {
    uint64_t v = 0;
    for (int i = 7; i >= 0; --i) v = (v << 8) | p[i];
    return v;
}
void Put64(uint8_t *p, uint64_t v) {
    for (int i = 0; i < 8; ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}
uint32_t Get32(const uint8_t *p) { return static_cast<uint32_t>(Get64(p) & 0xFFFFFFFFu); }
void Put32(uint8_t *p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}

std::string MapPathOf(Sim &sim, const Node &dev) {
    auto it = dev.params.find("ep_dev_name");
    return it == dev.params.end() || it->second.empty() ? std::string() : sim.HostPath(it->second);
}

// The parent backstore a child names: a sibling under the same host, else any host's.
const Node *ParentOf(Sim &sim, const Node &dev) {
    const std::string &name = dev.clone.parentName;
    auto sib = dev.parent->children.find(name);
    if (sib != dev.parent->children.end() && !sib->second->IsLink()) return sib->second.get();
    Node *core = sim.Find("/target/core");
    if (core == nullptr) return nullptr;
    for (auto &host : core->children) {
        if (host.second->IsLink()) continue;
        auto it = host.second->children.find(name);
        if (it != host.second->children.end() && !it->second->IsLink()) return it->second.get();
    }
    return nullptr;
}

bool SetChildAttr(Sim &sim, Node &dev, uint32_t bits) {
    MapFile child(MapPathOf(sim, dev));
    uint8_t var2[kBlock];
    if (!child.ok() || !child.Read(kVar2, var2, kBlock)) return false;
    Put32(var2 + kChildAttrInVar2, Get32(var2 + kChildAttrInVar2) | bits);
    return child.WriteBlock(kVar2, var2);
}

}  // namespace

void EpRelationStarted(Sim &sim, Node &dev) {
    if (dev.clone.relation == "mirror") SetChildAttr(sim, dev, kMirrorChild);
}

void EpRelationPromoted(Sim &sim, Node &dev) { SetChildAttr(sim, dev, kStable); }

void EpRelationDone(Sim &sim, Node &dev) {
    dev.clone.synced = true;
    const Node *parent = ParentOf(sim, dev);
    if (parent == nullptr) return;
    MapFile from(MapPathOf(sim, *parent));
    MapFile to(MapPathOf(sim, dev));
    if (!from.ok() || !to.ok()) return;
    uint8_t parentHeader[kBlock], parentMap[kBlock], parentVar0[kBlock];
    uint8_t childMap[kBlock], childVar0[kBlock], childVar2[kBlock];
    if (!from.Read(0, parentHeader, kBlock) || !from.Read(kMapHeader, parentMap, kBlock) ||
        !from.Read(kVar0, parentVar0, kBlock) || !to.Read(kMapHeader, childMap, kBlock) ||
        !to.Read(kVar0, childVar0, kBlock) || !to.Read(kVar2, childVar2, kBlock))
        return;
    // The extent entries: the parent's, as far as the child's file reaches.
    const off_t fromSize = from.Size(), toSize = to.Size();
    const off_t end = fromSize < toSize ? fromSize : toSize;
    std::vector<uint8_t> chunk(1 << 20);
    for (off_t off = kHeadSize; off < end;) {
        size_t n = static_cast<size_t>(end - off < static_cast<off_t>(chunk.size()) ? end - off : chunk.size());
        ssize_t got = pread(from.fd(), chunk.data(), n, off);
        if (got <= 0 || pwrite(to.fd(), chunk.data(), static_cast<size_t>(got), off) != got) return;
        off += got;
    }
    memcpy(childMap + kParentUuidInMap, parentHeader + kUuidInHeader, 16);
    Put64(childMap + kParentTotalInMap, Get64(parentMap + kTotalInMap));
    Put64(childVar0 + kMappedInVar0, Get64(parentVar0 + kMappedInVar0));
    Put64(childVar2 + kSyncedInVar2, Get64(childMap + kTotalInMap));
    memcpy(childVar2 + kBaseVersionInVar2, parentHeader + kUuidInHeader, 16);
    to.WriteBlock(kMapHeader, childMap);
    to.WriteBlock(kVar0, childVar0);
    to.WriteBlock(kVar2, childVar2);
    fdatasync(to.fd());
}

}  // namespace orlosim
