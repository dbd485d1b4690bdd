// Releases a configuration snapshot: every element of its three lists.
#include <cstddef>

#include "base/conf_snapshot_internal.h"

extern "C" ORLO_EXPORT void ORLOiSCSIConfFree(ORLOiSCSIConf *conf) {
    if (conf == nullptr) return;
    // Mappings first: they point into the other two lists.
    ORLOiSCSIListFree(&conf->mappings, offsetof(ORLOiSCSIMapping, link));
    ORLOiSCSIListFree(&conf->targets, offsetof(ORLOiSCSITarget, link));
    ORLOiSCSIListFree(&conf->luns, offsetof(ORLOiSCSILunElem, link));
}
