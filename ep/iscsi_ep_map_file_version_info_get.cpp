// Everything the head of a map file says about an object's version and relations, read
// in one go so the fields belong together.
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMapFileVersionInfoGet(const char *mapPath,
                                                                 ORLOiSCSIEpMapVersionInfo *info) {
    if (mapPath == nullptr || mapPath[0] == '\0' || info == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    using orlo::ep::Get32;
    using orlo::ep::Get64;
    unsigned char head[EP_MAP_HEAD_SIZE];
    uint32_t ret = ORLOiSCSIEpFileMapGetAll(mapPath, head);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileMapGetAll(\"%s\", %p) failed, err=%s", mapPath, static_cast<void *>(head),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (Get32(head, EP_HDR_OFF_TYPE) != EP_FILE_TYPE_MAP) {
        ORLO_LOG_ERR("Not a map file: %s (file type %u)", mapPath, Get32(head, EP_HDR_OFF_TYPE));
        return EP_ERR_BAD_EP_FILE_TYPE;
    }
    const unsigned char *map = head + EP_OFF_TYPE_HEADER;
    const unsigned char *var0 = head + EP_OFF_VAR0;
    const unsigned char *var2 = head + EP_OFF_VAR2;
    ORLOiSCSIEpMapVersionInfo out;
    memset(&out, 0, sizeof(out));
    if ((ret = orlo::ep::UuidFormat(head + EP_HDR_OFF_UUID, out.uuid)) != ORLO_OK ||
        (ret = orlo::ep::UuidFormat(map + EP_MAP_OFF_PARENT_UUID, out.parentUuid)) != ORLO_OK ||
        (ret = orlo::ep::UuidFormat(var2 + EP_MAP_VAR2_OFF_BASE_VER, out.baseVersion)) != ORLO_OK)
        return ret;
    out.createTime = Get32(head, EP_HDR_OFF_CTIME);
    out.attribute = Get32(map, EP_MAP_OFF_ATTR);
    out.totalCount = Get64(map, EP_MAP_OFF_TOTAL);
    out.parentTotalCount = Get64(map, EP_MAP_OFF_PARENT_TOTAL);
    out.mappedCount = Get64(var0, EP_MAP_VAR0_OFF_MAPPED);
    out.syncedCount = Get64(var2, EP_MAP_VAR2_OFF_SYNCED);
    out.childAttribute = Get32(var2, EP_MAP_VAR2_OFF_CHILD_ATTR);
    *info = out;
    return ORLO_OK;
}
