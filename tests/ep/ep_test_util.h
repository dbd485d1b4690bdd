// Helpers of the extent-pool tests: an independent CRC-32, little-endian fields, and
// files built byte by byte the way the kernel side would find them.
#ifndef ORLO_TESTS_EP_EP_TEST_UTIL_H
#define ORLO_TESTS_EP_EP_TEST_UTIL_H

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

namespace eptest {

// Bitwise CRC-32 (IEEE, reflected 0xEDB88320, init and final xor 0xFFFFFFFF).
inline uint32_t Crc32(const unsigned char *p, size_t n) {
    uint32_t c = 0xFFFFFFFFu;
    for (size_t i = 0; i < n; ++i) {
        c ^= p[i];
        for (int k = 0; k < 8; ++k) c = (c & 1u) ? (c >> 1) ^ 0xEDB88320u : c >> 1;
    }
    return c ^ 0xFFFFFFFFu;
}

inline uint32_t Le32(const unsigned char *p) {
    return uint32_t{p[0]} | uint32_t{p[1]} << 8 | uint32_t{p[2]} << 16 | uint32_t{p[3]} << 24;
}
inline uint64_t Le64(const unsigned char *p) { return uint64_t{Le32(p)} | uint64_t{Le32(p + 4)} << 32; }
inline void Put32(unsigned char *p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = static_cast<unsigned char>(v >> (8 * i));
}
inline void Put64(unsigned char *p, uint64_t v) {
    Put32(p, static_cast<uint32_t>(v));
    Put32(p + 4, static_cast<uint32_t>(v >> 32));
}

// The checksum a 64-byte block must carry: CRC-32 of it with word 0 taken as 0.
inline uint32_t BlockCrc(const unsigned char *block) {
    unsigned char copy[64];
    memcpy(copy, block, 64);
    Put32(copy, 0);
    return Crc32(copy, 64);
}
inline void Seal(unsigned char *block) { Put32(block, BlockCrc(block)); }

// Reads n bytes at off of a real file.
inline std::vector<unsigned char> ReadAt(const std::string &real, off_t off, size_t n) {
    std::vector<unsigned char> out(n);
    int fd = ::open(real.c_str(), O_RDONLY);
    if (fd < 0) return {};
    ssize_t got = pread(fd, out.data(), n, off);
    ::close(fd);
    if (got != static_cast<ssize_t>(n)) return {};
    return out;
}

inline bool WriteAt(const std::string &real, off_t off, const unsigned char *p, size_t n) {
    int fd = ::open(real.c_str(), O_WRONLY | O_CREAT, 0600);
    if (fd < 0) return false;
    bool ok = pwrite(fd, p, n, off) == static_cast<ssize_t>(n);
    ::close(fd);
    return ok;
}

inline off_t SizeOf(const std::string &real) {
    struct stat st;
    return ::stat(real.c_str(), &st) == 0 ? st.st_size : -1;
}

// A common header as the pool writes it, sealed.
inline void CommonHeader(unsigned char *h, uint32_t type, const unsigned char uuid[16], uint32_t ctime) {
    memset(h, 0, 64);
    Put32(h + 4, 0x00010000u);
    const unsigned char magic[8] = {0x33, 0x06, 0x14, 0x18, 0x52, 0x25, 0x86, 0x08};
    memcpy(h + 8, magic, 8);
    Put32(h + 16, type);
    if (uuid != nullptr) memcpy(h + 20, uuid, 16);
    Put32(h + 36, 0x00100000u);
    Put32(h + 44, ctime);
    Seal(h);
}

// A sandbox program standing in for /bin/mkdir: makes its directory inside the sandbox
// (ORLO_SYSROOT is inherited), as the real one does on the appliance.
inline std::string MkdirScript() {
    return "#!/bin/sh\n[ \"$1\" = \"-p\" ] || exit 64\nexec /bin/mkdir -p \"$ORLO_SYSROOT$2\"\n";
}

}  // namespace eptest

#endif
