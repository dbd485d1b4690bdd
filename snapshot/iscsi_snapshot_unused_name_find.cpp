// A default name no snapshot of a LUN has: "SnapShot-<n>" with the smallest free n from 1.
// When 1..256 are all taken the number is 0, a name that may well be taken too: callers
// that care check it (ORLOiSCSISnapshotIsNameUsed).
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "snapshot/snapshot_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSISnapshotUnusedNameFind(int32_t lid, char *buf, size_t size) {
    if (buf == nullptr || size < 1) {
        ORLO_LOG_BAD_PARAMS();
        return orlo::snap::kErrInvalidInput;
    }
    ORLOiSCSISnapshotList list;
    ORLOiSCSIListInit(&list);
    auto freeList = orlo::MakeScopeExit([&list]() { ORLOiSCSISnapshotListFree(&list); });
    uint32_t ret = ORLOiSCSISnapshotConfGetByLid(lid, &list);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to get snapshots' info for lid: %d", lid);
        return ret;
    }
    bool taken[ORLO_ISCSI_SID_MAX + 1] = {};
    ORLOiSCSIListLink *link;
    ORLOiSCSISnapshot *snap;
    ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, snap) {
        int n = 0;
        if (sscanf(snap->name, ORLO_ISCSI_SNAPSHOT_DEFAULT_NAME "%d", &n) == 1 && n >= 1 && n <= ORLO_ISCSI_SID_MAX)
            taken[n] = true;
    }
    int number = 0;
    for (int n = 1; n <= ORLO_ISCSI_SID_MAX && number == 0; ++n)
        if (!taken[n]) number = n;
    int written = snprintf(buf, size, "%s%d", ORLO_ISCSI_SNAPSHOT_DEFAULT_NAME, number);
    if (written < 0 || static_cast<size_t>(written) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}
