// The LUN types, the names they are shown by and the "devtype" each is stored as, and
// the small helpers every LUN file shares.
#include <strings.h>

#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_internal.h"

namespace orlo {
namespace lun {

namespace {

// Every valid type.  FILE, THIN, ADV, BKP_THIN and BKP_ADV share devtype 1: on reading
// they are told apart by "pre_alloc", "vaai_support" and "bkp_obj".
const TypeInfo kTypes[] = {
    {ORLO_ISCSI_LUN_TYPE_BLOCK, "BLOCK", 2},
    {ORLO_ISCSI_LUN_TYPE_FILE, "FILE", 1},
    {ORLO_ISCSI_LUN_TYPE_THIN, "THIN", 1},
    {ORLO_ISCSI_LUN_TYPE_ADV, "ADV", 1},
    {ORLO_ISCSI_LUN_TYPE_SINK, "SINK", 3},
    {ORLO_ISCSI_LUN_TYPE_VDISK_ADV, "VDISK_ADV", 6},
    {ORLO_ISCSI_LUN_TYPE_BKP_THIN, "BKP_THIN", 1},
    {ORLO_ISCSI_LUN_TYPE_BKP_ADV, "BKP_ADV", 1},
    {ORLO_ISCSI_LUN_TYPE_CINDER, "CINDER", 4},
    {ORLO_ISCSI_LUN_TYPE_BLUN, "BLUN", 5},
    {ORLO_ISCSI_LUN_TYPE_VDISK_BLUN, "VDISK_BLUN", 7},
};

}  // namespace

const TypeInfo *TypeFind(uint32_t type) {
    for (const TypeInfo &t : kTypes)
        if (t.type == type) return &t;
    return nullptr;
}

int DevtypeOf(uint32_t type) {
    const TypeInfo *t = TypeFind(type);
    if (t != nullptr) return t->devtype;
    return ORLO_ISCSI_LUN_IS_FILE_BACKED(type) ? 1 : -1;
}

uint32_t TypeOfDevtype(long devtype) {
    if (devtype == 1) return 0;
    for (const TypeInfo &t : kTypes)
        if (t.devtype == devtype) return t.type;
    return 0;
}

bool IsUuidUsable(const ORLOiSCSILun *lun) {
    size_t n = strnlen(lun->uuid, sizeof(lun->uuid));
    return n > 0 && n < sizeof(lun->uuid) && strpbrk(lun->uuid, "]/\n\r") == nullptr;
}

bool IsYes(const char *value) { return value != nullptr && strcasecmp(value, "yes") == 0; }

uint32_t VolumeConfPath(const char *volume, char *buf, size_t size) {
    if (volume == nullptr || volume[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    int n = snprintf(buf, size, kVolumeConfFmt, volume);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

bool LockFilePath(const ORLOiSCSILun *lun, char *buf, size_t size) {
    const char *fmt = (lun->stateFlags & ORLO_ISCSI_LUN_STATE_UNSYNC) ? "/tmp/iscsi/lun_unsync/LUN_%s_unsync.lock"
                                                                      : "/tmp/iscsi/lun_lock/LUN_%s.lock";
    int n = snprintf(buf, size, fmt, lun->uuid);
    return n > 0 && static_cast<size_t>(n) < size;
}

bool ProgressFilePath(const ORLOiSCSILun *lun, char *buf, size_t size) {
    int n = snprintf(buf, size, "/tmp/iscsi/LUN_%s.progress", lun->uuid);
    return n > 0 && static_cast<size_t>(n) < size;
}

}  // namespace lun
}  // namespace orlo
