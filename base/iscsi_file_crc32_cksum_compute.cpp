// CRC-32 (IEEE 802.3, reflected polynomial 0xEDB88320) of the extent-pool file headers
// and of whole files read in pieces: zlib's crc32, which is this very checksum and
// chains the same way (pass the previous result to continue it).
#include <zlib.h>

#include <cstdint>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIFileCRC32CksumCompute(uint32_t crc, const void *buf, size_t len) {
    if (buf == nullptr) {
        if (len != 0) ORLO_LOG_BAD_PARAMS();
        return crc;  // zlib would answer its initial value instead
    }
    return static_cast<uint32_t>(crc32_z(crc, static_cast<const Bytef *>(buf), len));
}
