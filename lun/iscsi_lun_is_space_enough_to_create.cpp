// Whether a LUN's volume has room for it.  A thick LUN's whole size is allocated at
// creation, so it needs its size free; a thin LUN takes space as it is written, and an
// advanced LUN takes it from the shared extent pool, so they need only their metadata.
// Every volume keeps a reserve (1% of its size, at most 1 GiB) that no LUN may take.
// A BLOCK LUN is its own device: nothing to check on a volume.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"
#include "orlo_storage.h"

namespace {

int Mebibytes(uint64_t bytes, bool roundUp) {
    uint64_t mib = (bytes + (roundUp ? (1ULL << 20) - 1 : 0)) >> 20;
    return mib > 0x7FFFFFFFULL ? 0x7FFFFFFF : static_cast<int>(mib);
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunIsSpaceEnoughToCreate(const ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (!ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type)) return ORLO_OK;
    ORLO_SPACE_INFO info;
    if (ORLOSpaceInfoGet(lun->rootPath, &info) < 1) {
        ORLO_LOG_PLATFORM("ORLOSpaceInfoGet(\"%s\", %p)", lun->rootPath, static_cast<void *>(&info));
        return orlo::lun::kErrVolumeInfo;
    }
    const uint64_t needed = orlo::lun::SpaceNeeded(lun, info.totalBytes);
    if (needed <= info.freeBytes) return ORLO_OK;
    if (ORLO_ISCSI_LUN_IS_ADV(lun->type))
        ORLO_LOG_ERR("Not enough space for EP lun.");
    else  // in MiB: what the LUN needs with the reserve, and what the volume has free
        ORLO_LOG_ERR("Not enough space. %d >= %d", Mebibytes(needed, true), Mebibytes(info.freeBytes, false));
    return orlo::lun::kErrSpaceCheck;
}
