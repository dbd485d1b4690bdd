// Whether a LUN is the child of a mirror relation; a map file that cannot be read says no.
#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

extern "C" ORLO_EXPORT bool ORLOiSCSIEpChildLunIsMirror(const char *mapPath) {
    uint32_t attr = 0;
    uint32_t ret = ORLOiSCSIEpMapFileChildAttributeGet(mapPath, &attr);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMapFileChildAttributeGet(\"%s\", %p) failed, err=%s", mapPath != nullptr ? mapPath : "",
                     static_cast<void *>(&attr), ORLOiSCSIErrStr(ret));
        return false;
    }
    return (attr & EP_CHILD_ATTR_MIRROR) != 0;
}
