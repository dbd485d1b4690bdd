// Stamps a clone's map file from its source: file type 4 with a new UUID and the
// source's creation time; the source as parent (its UUID and total count) and the
// source's total as the clone's own; the source's base version; nothing mapped or
// synced yet.  The kernel then fills the map as the clone runs.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpCloneMapMetaDataFillUp(const char *childMapPath,
                                                                  const char *parentMapPath) {
    if (childMapPath == nullptr || childMapPath[0] == '\0' || parentMapPath == nullptr || parentMapPath[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    using orlo::ep::Get32;
    using orlo::ep::Get64;
    using orlo::ep::Put64;
    unsigned char head[EP_MAP_HEAD_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapGetAll(parentMapPath, head);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapGetAll(\"%s\", %p) failed, err=%s", parentMapPath, static_cast<void *>(head),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (Get32(head, EP_HDR_OFF_MAGIC) != EP_MAGIC_WORD0 || Get32(head, EP_HDR_OFF_MAGIC + 4) != EP_MAGIC_WORD1 ||
        Get32(head, EP_HDR_OFF_TYPE) != EP_FILE_TYPE_MAP) {
        ORLO_LOG_ERR("Not a map file: %s", parentMapPath);
        return EP_ERR_BAD_EP_FILE_TYPE;
    }
    const uint64_t total = Get64(head + EP_OFF_TYPE_HEADER, EP_MAP_OFF_TOTAL);

    char uuid[ORLO_EP_UUID_BUF_SIZE] = "";
    ret = ORLOiSCSIEpFileHeaderFill(childMapPath, uuid, EP_FILE_TYPE_MAP, Get32(head, EP_HDR_OFF_CTIME));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderFill(\"%s\", \"%s\", EP_FILE_TYPE_MAP, %u) failed, err=%s", childMapPath,
                     uuid, Get32(head, EP_HDR_OFF_CTIME), ORLOiSCSIErrStr(ret));
        return ret;
    }
    unsigned char block[EP_BLOCK_SIZE];
    memset(block, 0, sizeof(block));
    Put64(block, EP_MAP_OFF_TOTAL, total);
    memcpy(block + EP_MAP_OFF_PARENT_UUID, head + EP_HDR_OFF_UUID, 16);
    Put64(block, EP_MAP_OFF_PARENT_TOTAL, total);
    ret = ORLOiSCSIEpFileMapHeaderSet(childMapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapHeaderSet(\"%s\", %p) failed, err=%s", childMapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    memset(block, 0, sizeof(block));
    ret = ORLOiSCSIEpFileMapSetVar0(childMapPath, block);
    if (ret == ORLO_OK) ret = ORLOiSCSIEpFileMapSetVar1(childMapPath, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to clear the variable blocks of %s, err=%s", childMapPath, ORLOiSCSIErrStr(ret));
        return ret;
    }
    memcpy(block + EP_MAP_VAR2_OFF_BASE_VER, head + EP_OFF_VAR2 + EP_MAP_VAR2_OFF_BASE_VER, 16);
    ret = ORLOiSCSIEpFileMapSetVar2(childMapPath, block);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapSetVar2(\"%s\", %p) failed, err=%s", childMapPath, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
    return ret;
}
