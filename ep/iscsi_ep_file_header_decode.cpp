// Decodes the common header of an extent-pool file for people and tools: every field,
// and whether its checksum and magic (and the type header's checksum) hold.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderDecode(const char *path, ORLOiSCSIEpFileHeaderInfo *info) {
    if (path == nullptr || path[0] == '\0' || info == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    using orlo::ep::Get32;
    unsigned char header[EP_BLOCK_SIZE];
    uint32_t ret = ORLOiSCSIEpFileHeaderGet(path, header);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderGet(\"%s\", %p) failed, err=%s", path, static_cast<void *>(header),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIEpFileHeaderInfo out;
    memset(&out, 0, sizeof(out));
    out.checksumStored = Get32(header, EP_HDR_OFF_CHECKSUM);
    out.checksumComputed = orlo::ep::BlockChecksum(header);
    out.checksumOk = out.checksumStored == out.checksumComputed;
    out.version = Get32(header, EP_HDR_OFF_VERSION);
    out.magic0 = Get32(header, EP_HDR_OFF_MAGIC);
    out.magic1 = Get32(header, EP_HDR_OFF_MAGIC + 4);
    out.magicOk = out.magic0 == EP_MAGIC_WORD0 && out.magic1 == EP_MAGIC_WORD1;
    out.fileType = Get32(header, EP_HDR_OFF_TYPE);
    ret = orlo::ep::UuidFormat(header + EP_HDR_OFF_UUID, out.uuid);
    if (ret != ORLO_OK) return ret;
    out.headSize = Get32(header, EP_HDR_OFF_HEAD_SIZE);
    out.createTime = Get32(header, EP_HDR_OFF_CTIME);

    // A file cut after its common header is reported as such (no type header) rather
    // than as a failure of the decode.
    unsigned char type[EP_BLOCK_SIZE];
    if (orlo::ep::FilePread(path, type, sizeof(type), EP_OFF_TYPE_HEADER) == ORLO_OK) {
        out.typeHeaderPresent = true;
        out.typeChecksumStored = Get32(type, 0);
        out.typeChecksumComputed = orlo::ep::BlockChecksum(type);
        out.typeChecksumOk = out.typeChecksumStored == out.typeChecksumComputed;
    }
    *info = out;
    return ORLO_OK;
}
