// Paths of a snapshot's objects and its event-log entries.
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "orlo_storage.h"
#include "orloiscsi_configfs.h"
#include "service/lio_version.h"
#include "snapshot/snapshot_internal.h"
#include "snapshot/snapshot_objects.h"

namespace orlo {
namespace snap {

namespace {

uint32_t Format(char *buf, size_t size, const char *fmt, const char *a, const char *b = nullptr,
                const char *c = nullptr, const char *d = nullptr, const char *e = nullptr) {
    int n = snprintf(buf, size, fmt, a, b, c, d, e);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        if (size > 0) buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

}  // namespace

uint32_t LunSnapshotDir(const char *volume, int32_t type, const char *lunUuid, char *buf, size_t size) {
    return Format(buf, size, "%s/@iSCSI/Snapshot/%s/%s", volume, TypeWord(type), lunUuid);
}

uint32_t BlunSubvolPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    return Format(buf, size, "%s/@iSCSI/Snapshot/%s/%s/%s", snap->rootpath, "BLUN", snap->parent_uuid, snap->uuid);
}

uint32_t AdvSnapshotDir(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    return Format(buf, size, "%s/@iSCSI/Snapshot/%s/%s/%s", snap->rootpath, "ADV", snap->parent_uuid, snap->uuid);
}

uint32_t AdvMapPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    if (snap->conf_flags & kConfTrash) return Format(buf, size, "%s/@iSCSI/EP_unmap/%s", snap->rootpath, snap->uuid);
    return Format(buf, size, "%s/@iSCSI/Snapshot/%s/%s/%s/%s_00000", snap->rootpath, "ADV", snap->parent_uuid,
                  snap->uuid, snap->uuid);
}

uint32_t KernelObjectName(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    const char *fmt = (snap->conf_flags & kConfTrash)    ? "UNMAP_LUN_%s_SN_%s"
                      : (snap->conf_flags & kConfUnsync) ? "UNSYNC_LUN_%s_SN_%s"
                                                         : "LUN_%s_SN_%s";
    return Format(buf, size, fmt, snap->parent_uuid, snap->uuid);
}

uint32_t ConfigfsDirPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    char name[160];
    uint32_t ret = KernelObjectName(snap, name, sizeof(name));
    if (ret != ORLO_OK) return ret;
    const char *host = (snap->conf_flags & kConfTrash) ? getTCMHBATrash() : getTCMHBAEPIO();
    return Format(buf, size, "%s/%s", host, name);
}

uint32_t BlunSourcePath(const ORLOiSCSILun *lun, char *buf, size_t size) {
    if (lun->stateFlags & ORLO_ISCSI_LUN_STATE_TMP) return Format(buf, size, "%s/@iSCSI/tmp/%s", lun->rootPath, lun->uuid);
    return Format(buf, size, "%s/@iSCSI/LUN/%s/%s", lun->rootPath, ORLOiSCSILunTypeName(lun->type), lun->uuid);
}

void Event(unsigned int id, const ORLOiSCSILun *lun, const char *text) {
    const uint32_t type = lun->type;
    if (!IsAdvFamily(type) && type != ORLO_ISCSI_LUN_TYPE_CINDER && type != ORLO_ISCSI_LUN_TYPE_BLUN) return;
    char dr[16] = "";
    OLIBCFileGetKeyValue(kOrloInfoDefaults, "support_dr_snap", dr, sizeof(dr));
    const char *level = strcmp(dr, "yes") == 0 ? "level=9" : "level=1";
    if (ORLOLogSet1(id, lun->name, text, level) != 0)
        ORLO_LOG_PLATFORM("ORLOLogSet1(0x%08X, \"%s\", \"%s\", \"%s\")", id, lun->name, text, level);
}

const char *LunName(const ORLOiSCSILun *lun) { return lun != nullptr ? lun->name : "(none)"; }

}  // namespace snap
}  // namespace orlo
