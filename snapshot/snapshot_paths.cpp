// The snapshot files' paths, and the checks a record passes before its fields name files
// or are written into a section.
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_internal.h"
#include "snapshot/snapshot_internal.h"

namespace orlo {
namespace snap {

namespace {

uint32_t Format(char *buf, size_t size, const char *fmt, ...) __attribute__((format(printf, 3, 4)));

uint32_t Format(char *buf, size_t size, const char *fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    int n = vsnprintf(buf, size, fmt, ap);
    va_end(ap);
    if (n < 0 || static_cast<size_t>(n) >= size) {
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", size);
        if (size > 0) buf[0] = '\0';
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

bool IsControl(unsigned char c) { return c < 0x20 || c == 0x7F; }

// Whether a value reads back as written: the section reader drops blanks after "=" and
// one pair of enclosing double quotes.
bool RoundTrips(const char *value, size_t n) {
    if (n == 0) return true;
    if (value[0] == ' ' || value[0] == '\t') return false;
    return !(n >= 2 && value[0] == '"' && value[n - 1] == '"');
}

// A text field: terminated inside its array, one line, and read back as written.
bool IsTextUsable(const char *field, size_t size) {
    size_t n = strnlen(field, size);
    return n < size && strpbrk(field, "\n\r") == nullptr && RoundTrips(field, n);
}

uint32_t BadField(const char *what, const char *field, size_t size) {
    std::string shown(field, strnlen(field, size));
    ORLO_LOG_ERR("Bad parameters. Invalid snapshot %s: \"%s\"", what, orlo::olibc::Printable(shown.c_str()).c_str());
    OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
    return ORLO_ERR_BAD_PARAMETER;
}

// Why a name cannot be stored, or nullptr when it can.
const char *NameFault(const char *name, size_t size) {
    size_t n = strnlen(name, size);
    if (n == size) return "longer than 255 characters";
    if (n == 0) return "empty";
    if (!orlo::IsUtf8(name, n)) return "not UTF-8";
    for (size_t i = 0; i < n; ++i) {
        if (IsControl(static_cast<unsigned char>(name[i]))) return "a control character";
        if (name[i] == ']') return "\"]\"";
    }
    if (!RoundTrips(name, n)) return "leading blank or enclosing quotes";
    return nullptr;
}

}  // namespace

uint32_t ConfPath(const char *volume, const char *lunUuid, char *buf, size_t size) {
    return Format(buf, size, "%s/@iSCSI/Snapshot/iscsi_snapshot_%s.conf", volume, lunUuid);
}

uint32_t ConfLockPath(const char *lunUuid, char *buf, size_t size) {
    return Format(buf, size, "/tmp/iscsi/snapshot_conf_lock/iscsi_snapshot_%s.conf.lock", lunUuid);
}

uint32_t CachePath(const char *uuid, char *buf, size_t size) {
    return Format(buf, size, "/tmp/iscsi/snapshot_cache/iscsi_snapshot_%c%c%c.conf.cache", uuid[0], uuid[1],
                  uuid[2]);
}

uint32_t CacheLockPath(const char *uuid, char *buf, size_t size) {
    return Format(buf, size, "/tmp/iscsi/snapshot_cache_lock/iscsi_snapshot_%c%c%c.conf.cache.lock", uuid[0],
                  uuid[1], uuid[2]);
}

uint32_t SectionName(const char *uuid, char *buf, size_t size) { return Format(buf, size, kSectionFmt, uuid); }

uint32_t OpLockPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    if (snap->conf_flags & ORLO_ISCSI_SNAPSHOT_CONF_UNSYNC)
        return Format(buf, size, "/tmp/iscsi/snapshot_unsync_lock/SN_%s_unsync.lock", snap->uuid);
    return Format(buf, size, "/tmp/iscsi/snapshot_lock/SN_%s.lock", snap->uuid);
}

uint32_t ProgressPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    return Format(buf, size, "/tmp/iscsi/SN_%s.progress", snap->uuid);
}

uint32_t AppKeyPath(const ORLOiSCSISnapshot *snap, char *buf, size_t size) {
    return Format(buf, size, "/tmp/iscsi/snapshot_app_lock/SN_%s.app.lock", snap->uuid);
}

bool IsUuidUsable(const char *uuid, size_t size) {
    size_t n = strnlen(uuid, size);
    if (n == size || n < 3) return false;
    for (size_t i = 0; i < n; ++i) {
        unsigned char c = static_cast<unsigned char>(uuid[i]);
        if (IsControl(c) || c == '/' || c == ']' || c == ' ') return false;
    }
    return true;
}

uint32_t CheckPathFields(const ORLOiSCSISnapshot *snap, bool lunFile) {
    if (!IsUuidUsable(snap->uuid, sizeof(snap->uuid))) {
        std::string shown(snap->uuid, strnlen(snap->uuid, sizeof(snap->uuid)));
        ORLO_LOG_ERR("Bad parameters. Invalid snapshot UUID: \"%s\"", orlo::olibc::Printable(shown.c_str()).c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadUuid;
    }
    if (!lunFile) return ORLO_OK;
    if (!IsUuidUsable(snap->parent_uuid, sizeof(snap->parent_uuid))) {
        std::string shown(snap->parent_uuid, strnlen(snap->parent_uuid, sizeof(snap->parent_uuid)));
        ORLO_LOG_ERR("Bad parameters. Invalid parent LUN UUID: \"%s\"", orlo::olibc::Printable(shown.c_str()).c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadParentUuid;
    }
    if (snap->rootpath[0] != '/' || !IsTextUsable(snap->rootpath, sizeof(snap->rootpath)))
        return BadField("rootpath", snap->rootpath, sizeof(snap->rootpath));
    return ORLO_OK;
}

uint32_t CheckRecord(const ORLOiSCSISnapshot *snap, bool lunFile) {
    if (const char *fault = NameFault(snap->name, sizeof(snap->name))) {
        std::string shown(snap->name, strnlen(snap->name, sizeof(snap->name)));
        ORLO_LOG_ERR("Bad snapshot name (%s): \"%s\"", fault, orlo::olibc::Printable(shown.c_str()).c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadName;
    }
    if (!IsTextUsable(snap->note, sizeof(snap->note))) {
        std::string shown(snap->note, strnlen(snap->note, sizeof(snap->note)));
        ORLO_LOG_ERR("Bad snapshot note: \"%s\"", orlo::olibc::Printable(shown.c_str()).c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadNote;
    }
    uint32_t ret = CheckPathFields(snap, lunFile);
    if (ret != ORLO_OK) return ret;
    // Fields written as text but naming nothing: they only have to read back.
    if (!IsTextUsable(snap->parent_uuid, sizeof(snap->parent_uuid)))
        return BadField("parent_uuid", snap->parent_uuid, sizeof(snap->parent_uuid));
    if (!IsTextUsable(snap->rootpath, sizeof(snap->rootpath)))
        return BadField("rootpath", snap->rootpath, sizeof(snap->rootpath));
    if (!IsTextUsable(snap->status, sizeof(snap->status)))
        return BadField("status", snap->status, sizeof(snap->status));
    if (!IsTextUsable(snap->taken_by, sizeof(snap->taken_by)))
        return BadField("taken_by", snap->taken_by, sizeof(snap->taken_by));
    if (!IsTextUsable(snap->version, sizeof(snap->version)))
        return BadField("version", snap->version, sizeof(snap->version));
    return ORLO_OK;
}

uint32_t CheckLun(const ORLOiSCSILun *lun) {
    if (!IsUuidUsable(lun->uuid, sizeof(lun->uuid))) {
        std::string shown(lun->uuid, strnlen(lun->uuid, sizeof(lun->uuid)));
        ORLO_LOG_ERR("Bad parameters. Invalid parent LUN UUID: \"%s\"", orlo::olibc::Printable(shown.c_str()).c_str());
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return kErrBadParentUuid;
    }
    if (strnlen(lun->rootPath, sizeof(lun->rootPath)) == sizeof(lun->rootPath) ||
        strpbrk(lun->rootPath, "\n\r") != nullptr) {
        ORLO_LOG_ERR("Bad parameters. Invalid LUN root path. lid: %d", lun->lid);
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    return ORLO_OK;
}

const char *TypeWord(int32_t type) {
    switch (type) {
        case ORLO_ISCSI_SNAPSHOT_TYPE_ADV:
            return "ADV";
        case ORLO_ISCSI_SNAPSHOT_TYPE_BLUN:
            return "BLUN";
        default:
            return "UNKNOWN";
    }
}

}  // namespace snap
}  // namespace orlo
