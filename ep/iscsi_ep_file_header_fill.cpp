// Builds and writes the common header of an extent-pool file: version, magic, file type,
// UUID (given, or new and handed back), head size and creation time.
#include <cstring>
#include <ctime>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_file.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpFileHeaderFill(const char *path, char *uuid, uint32_t fileType,
                                                          uint32_t createTime) {
    if (path == nullptr || path[0] == '\0' || uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    using orlo::ep::Put32;
    unsigned char header[EP_BLOCK_SIZE];
    memset(header, 0, sizeof(header));
    Put32(header, EP_HDR_OFF_VERSION, EP_FILE_VERSION);
    Put32(header, EP_HDR_OFF_MAGIC, EP_MAGIC_WORD0);
    Put32(header, EP_HDR_OFF_MAGIC + 4, EP_MAGIC_WORD1);
    Put32(header, EP_HDR_OFF_TYPE, fileType);
    Put32(header, EP_HDR_OFF_HEAD_SIZE, EP_HEAD_SIZE);
    Put32(header, EP_HDR_OFF_RESERVED, 0);
    Put32(header, EP_HDR_OFF_CTIME, createTime != 0 ? createTime : static_cast<uint32_t>(time(nullptr)));

    if (uuid[0] != '\0') {
        // A string that is no UUID leaves the field zero: the file stays usable, and
        // the zero UUID shows what happened.
        unsigned char bin[16];
        if (orlo::ep::UuidParse(uuid, bin)) memcpy(header + EP_HDR_OFF_UUID, bin, sizeof(bin));
    } else {
        unsigned char bin[16];
        uint32_t ret = ORLOiSCSIUuidGen(bin);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIUuidGen(%p) failed, err=%s", static_cast<void *>(bin), ORLOiSCSIErrStr(ret));
            return ret;
        }
        memcpy(header + EP_HDR_OFF_UUID, bin, sizeof(bin));
        char text[ORLO_EP_UUID_BUF_SIZE];
        if (orlo::ep::UuidFormat(bin, text) != ORLO_OK || strlen(text) != 36) {
            ORLO_LOG_ERR("Failed to format UUID of %s", path);
            return ORLO_ERR_UUID;
        }
        memcpy(uuid, text, sizeof(text));
    }
    uint32_t ret = ORLOiSCSIEpFileHeaderSet(path, header);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderSet(\"%s\", %p) failed, err=%s", path, static_cast<void *>(header),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
