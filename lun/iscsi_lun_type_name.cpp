// The name a LUN type is shown by in log lines and directory names.
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT const char *ORLOiSCSILunTypeName(uint32_t type) {
    const orlo::lun::TypeInfo *t = orlo::lun::TypeFind(type);
    return t != nullptr ? t->name : "UNKNOWN";
}
