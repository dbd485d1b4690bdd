// A new binary UUID for LUNs, snapshots and extent-pool files.
#include <uuid/uuid.h>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIUuidGen(unsigned char uuid[16]) {
    if (uuid == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uuid_generate(uuid);
    return ORLO_OK;
}
