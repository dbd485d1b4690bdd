// The map file of an advanced LUN: its data file number 0.
#include "lun/lun_internal.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunMapPathGet(const ORLOiSCSILun *lun, char *buf, size_t size) {
    return ORLOiSCSILunDataPathGet(lun, 0, buf, size);
}
