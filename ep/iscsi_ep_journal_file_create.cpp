// Makes the EP journal "<root>/EP_JNL": the journal area of "vaai_journal_size_in_megabyte"
// MiB (64 when unset, none when 0) plus the 1 MiB head, space allocated where the file
// system allows, stamped as file type 5 with a new UUID, the area in 512-byte sectors in
// its type header and the compression setting in its variable block 0.  A journal that
// already fits the setting and whose head is intact is kept, since the kernel may still
// have writes in it; any other file there is removed and made anew.  A journal left
// half made by a failure is removed.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace {

using orlo::ep::Get32;
using orlo::ep::Get64;

// The journal area in MiB; false (logged) when the setting cannot be read or parsed.
bool AreaMegabytes(uint64_t *mb) {
    char value[32];
    *mb = EP_JNL_DEFAULT_MB;
    if (!OLIBCFileExist(SZF_ORLO_INFO_DEFAULTS)) return true;
    int n = OLIBCFileGetKeyValue(SZF_ORLO_INFO_DEFAULTS, SZK_JOURNAL_SIZE_MB, value, sizeof(value));
    if (n < 0) {
        if (OLIBCErrGet() == OLIBC_ERR_NOT_FOUND) return true;
        ORLO_LOG_PLATFORM("OLIBCFileGetKeyValue(SZF_ORLO_INFO_DEFAULTS, SZK_JOURNAL_SIZE_MB, %p, %zu, 0)",
                          static_cast<void *>(value), sizeof(value));
        return false;
    }
    char *end = nullptr;
    errno = 0;
    unsigned long long v = strtoull(value, &end, 10);
    // A journal of a terabyte or more is a typing error, not a setting.
    if (n == 0 || end == value || *end != '\0' || value[0] == '-' || errno != 0 || v >= (1ULL << 20)) {
        ORLO_LOG_ERR("Bad %s: \"%s\"", SZK_JOURNAL_SIZE_MB, value);
        return false;
    }
    *mb = v;
    return true;
}

// The compression setting: /etc/orloinfo.conf, else the defaults, else 0.
uint32_t Compression() {
    char value[32];
    for (const char *file : {SZF_ORLO_INFO, SZF_ORLO_INFO_DEFAULTS}) {
        if (!OLIBCFileExist(file)) continue;
        int n = OLIBCFileGetKeyValue(file, SZK_JOURNAL_COMPRESSION, value, sizeof(value));
        if (n >= 0) return static_cast<uint32_t>(strtoul(value, nullptr, 10));
        if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND) {
            ORLO_LOG_ERR("OLIBCFileGetKeyValue(SZF_ORLO_INFO, SZK_JOURNAL_COMPRESSION, %p, %zu, 0) failed",
                         static_cast<void *>(value), sizeof(value));
            return 0;
        }
    }
    return 0;
}

// An existing journal is kept when its length fits the setting and its head is whole.
bool Workable(const char *path, uint64_t fileSize, uint64_t area) {
    struct stat st;
    if (orlo::os::Lstat(path, &st) != 0 || !S_ISREG(st.st_mode) || static_cast<uint64_t>(st.st_size) != fileSize)
        return false;
    unsigned char head[2 * EP_BLOCK_SIZE];
    unsigned char var0[EP_BLOCK_SIZE];
    if (orlo::ep::FilePread(path, head, sizeof(head), EP_OFF_HEADER) != ORLO_OK ||
        orlo::ep::FilePread(path, var0, sizeof(var0), EP_OFF_VAR0) != ORLO_OK)
        return false;
    const unsigned char *type = head + EP_OFF_TYPE_HEADER;
    return Get32(head, EP_HDR_OFF_MAGIC) == EP_MAGIC_WORD0 && Get32(head, EP_HDR_OFF_MAGIC + 4) == EP_MAGIC_WORD1 &&
           Get32(head, EP_HDR_OFF_TYPE) == EP_FILE_TYPE_JNL && Get32(head, 0) == orlo::ep::BlockChecksum(head) &&
           Get32(type, 0) == orlo::ep::BlockChecksum(type) && Get64(type, EP_JNL_OFF_SECTORS) == area / EP_SECTOR_SIZE &&
           Get32(var0, 0) == orlo::ep::BlockChecksum(var0);
}

uint32_t Build(const char *root, const char *path, uint64_t fileSize, uint64_t area, uint32_t compression) {
    unsigned int mode = ORLO_ISCSI_TRUNC_MODE_ZERO;
    if (ORLOiSCSIFileTruncModeGet(0, ORLOGetFSType(root), &mode) != 0) mode = ORLO_ISCSI_TRUNC_MODE_ZERO;
    uint32_t ret = ORLOiSCSIFileTrunc(path, fileSize, nullptr, mode);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIFileTrunc(\"%s\", %llu, NULL, %u) failed, err=%s", path,
                     static_cast<unsigned long long>(fileSize), mode, ORLOiSCSIErrStr(ret));
        return ret;
    }
    struct stat st;
    if (orlo::os::Stat(path, &st) != 0) {
        ORLO_LOG_ERR("stat(\"%s\") failed, err=%m", path);
        return ORLO_ERR_STAT_PATH;
    }
    if (static_cast<uint64_t>(st.st_size) != fileSize) {
        ORLO_LOG_ERR("Failed to TRUNC %s, request size %llu, final size: %llu", path,
                     static_cast<unsigned long long>(fileSize), static_cast<unsigned long long>(st.st_size));
        return ORLO_ERR_TRUNCATE_FILE;
    }
    char uuid[ORLO_EP_UUID_BUF_SIZE] = "";
    ret = ORLOiSCSIEpFileHeaderFill(path, uuid, EP_FILE_TYPE_JNL, 0);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderFill(\"%s\", \"%s\", EP_FILE_TYPE_JNL, 0) failed, err=%s", path, uuid,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    unsigned char block[EP_BLOCK_SIZE];
    memset(block, 0, sizeof(block));
    orlo::ep::Put64(block, EP_JNL_OFF_SECTORS, area / EP_SECTOR_SIZE);
    ret = ORLOiSCSIEpFileJnlHeaderSet(path, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileJnlHeaderSet(\"%s\", %p) failed, err=%s", path, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    memset(block, 0, sizeof(block));
    orlo::ep::Put32(block, EP_JNL_VAR0_OFF_COMPRESSION, compression);
    ret = ORLOiSCSIEpFileJnlSetVar0(path, block);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSIEpFileJnlSetVar0(\"%s\", %p) failed, err=%s", path, static_cast<void *>(block),
                     ORLOiSCSIErrStr(ret));
    return ret;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpJournalFileCreate(void) {
    int32_t lockFd = -1;
    uint32_t ret = ORLOiSCSIEpJournalLock(&lockFd);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpJournalLock(%p) failed, err=%s", static_cast<void *>(&lockFd), ORLOiSCSIErrStr(ret));
        return ret;
    }
    auto unlock = orlo::MakeScopeExit([&] {
        uint32_t r = ORLOiSCSIEpJournalUnlock(lockFd);
        if (r != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpJournalUnlock(%d) failed, err=%s", lockFd, ORLOiSCSIErrStr(r));
    });

    char root[EP_PATH_SIZE];
    if (ORLOiSCSIEpJournalRootPathGet(root, sizeof(root), false) != 0) {
        ORLO_LOG_ERR("ORLOiSCSIEpJournalRootPathGet(%p, %zu, false) failed", static_cast<void *>(root), sizeof(root));
        return EP_ERR_CREATE_JOURNAL;
    }
    int rc = OLIBCExec("/bin/mkdir", "-p", root, nullptr, nullptr);
    if (rc != 0) {
        ORLO_LOG_ERR("Failed to do command 'mkdir -p %s', ret=%d", root, rc);
        return ORLO_ERR_RMDIR;
    }
    char path[EP_PATH_SIZE];
    ret = orlo::ep::JnlPath(root, path, sizeof(path));
    if (ret != ORLO_OK) return ret;

    uint64_t mb = 0;
    if (!AreaMegabytes(&mb)) return EP_ERR_CREATE_JOURNAL;
    if (mb == 0) return ORLO_OK;  // the journal is switched off
    const uint64_t area = mb << 20;
    const uint64_t fileSize = area + EP_HEAD_SIZE;
    const uint32_t compression = Compression();

    struct stat st;
    if (orlo::os::Lstat(path, &st) == 0) {
        if (Workable(path, fileSize, area)) return ORLO_OK;
        ORLO_LOG_ERR("EP journal file '%s' is not workable, remove it", path);
        if (orlo::os::Unlink(path) != 0) {
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
            return ORLO_ERR_UNLINK_FILE;
        }
    }
    ret = Build(root, path, fileSize, area, compression);
    if (ret != ORLO_OK && orlo::os::Unlink(path) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    return ret;
}
