// The record checks shared by the builders of a LUN's paths on its volume.
#ifndef ORLO_LUN_LUN_PATH_CHECK_H
#define ORLO_LUN_LUN_PATH_CHECK_H

#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

// Returns 18990004 from the calling function, logged there, when the record cannot name a
// path on a volume: no absolute root path, or a uuid that cannot be part of a path.
#define ORLO_LUN_CHECK_PATH_RECORD(lun)                                                            \
    do {                                                                                           \
        if (strnlen((lun)->rootPath, sizeof((lun)->rootPath)) == sizeof((lun)->rootPath) ||       \
            (lun)->rootPath[0] != '/') {                                                           \
            ORLO_LOG_ERR("invalid LUN root path. lid: %d", (lun)->lid);                            \
            return ORLO_ERR_BAD_PARAMETER;                                                         \
        }                                                                                          \
        if (!orlo::lun::IsUuidUsable(lun)) {                                                       \
            ORLO_LOG_ERR("invalid LUN UUID. lid: %d", (lun)->lid);                                 \
            return ORLO_ERR_BAD_PARAMETER;                                                         \
        }                                                                                          \
    } while (0)

#endif
