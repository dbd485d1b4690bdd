// Whether the LUN's volume has room for one more snapshot.  A snapshot shares the LUN's
// data until either side is written, so what it needs at once is its own metadata: for
// an advanced LUN a map file the size of the LUN's (its 1 MiB head and 8 bytes per extent),
// for a block LUN the subvolume's metadata, counted as 16 MiB.  On top of that the volume
// keeps 1 MiB for the section files that record the snapshot.  Space that cannot be read
// counts as none.
#include <cstdint>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "snapshot/snapshot_objects.h"

extern "C" ORLO_EXPORT bool ORLOiSCSISnapshotIsSpaceEnoughToCreate(const ORLOiSCSILun *lun) {
    namespace sn = orlo::snap;
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return false;
    }
    ORLO_SPACE_INFO info;
    if (ORLOSpaceInfoGet(lun->rootPath, &info) < 1) {
        ORLO_LOG_PLATFORM("ORLOSpaceInfoGet(\"%s\", %p)", lun->rootPath, static_cast<void *>(&info));
        return false;
    }
    uint64_t need = 1ULL << 20;
    if (sn::IsAdvFamily(lun->type)) {
        uint32_t extentSize = 0, shift = 0;
        if (ORLOiSCSIEpExtentSizeAndShiftGet(lun->rootPath, &extentSize, &shift) != ORLO_OK || extentSize == 0) {
            ORLO_LOG_ERR("Failed to get the extent size of %s", lun->rootPath);
            return false;
        }
        const uint64_t extents = (lun->size + static_cast<uint64_t>(extentSize) - 1) / static_cast<uint64_t>(extentSize);
        need += (1ULL << 20) + ((extents * 8 + 4095) / 4096) * 4096;
    } else {
        need += 16ULL << 20;
    }
    if (info.freeBytes < need) {
        ORLO_LOG_ERR("Not enough space for a snapshot of %s: %llu bytes free, %llu needed", lun->name,
                     static_cast<unsigned long long>(info.freeBytes), static_cast<unsigned long long>(need));
        return false;
    }
    return true;
}
