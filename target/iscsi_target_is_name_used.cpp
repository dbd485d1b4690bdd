// How many targets carry a name (backup-object targets included).
#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

extern "C" ORLO_EXPORT int ORLOiSCSITargetIsNameUsed(const char *name) {
    if (name == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    ORLOiSCSITargetList list = {};
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSITargetListFree(&list); });
    if (ORLOiSCSITargetConfGetByName(name, 0, &list) != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get config");
        return -1;
    }
    return list.count;
}
