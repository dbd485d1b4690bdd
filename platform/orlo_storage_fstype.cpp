// File-system type of a path: the statfs magic number mapped to the appliance's own
// numbering (ORLO_FSTYPE_* in orlo_storage.h).
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/sysmacros.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "olibc.h"
#include "orlo_storage.h"
#include "platform/orlo_storage_internal.h"
#include "platform/os_seam.h"

namespace {

// Magic numbers that the kernel headers do not all carry.
constexpr unsigned long kNtfsMagic = 0x5346544EUL;   // "NTFS", the old driver
constexpr unsigned long kNtfs3Magic = 0x7366746EUL;  // "ntfs", the ntfs3 driver
constexpr unsigned long kHfsPlusMagic = 0x482BUL;
constexpr unsigned long kExfatMagic = 0x2011BAB0UL;
constexpr unsigned long kUdfMagic = 0x15013346UL;
constexpr unsigned long kCifsMagic = 0xFF534D42UL;
constexpr unsigned long kSmb2Magic = 0xFE534D42UL;
constexpr unsigned long kXfsMagic = 0x58465342UL;
constexpr unsigned long kExtMagic = 0xEF53UL;  // ext2, ext3 and ext4 share it

struct MagicType {
    unsigned long magic;
    int type;
};

constexpr MagicType kMagicTypes[] = {
    {BTRFS_SUPER_MAGIC, ORLO_FSTYPE_BTRFS},
    {kXfsMagic, ORLO_FSTYPE_XFS},
    {MSDOS_SUPER_MAGIC, ORLO_FSTYPE_VFAT},
    {kNtfsMagic, ORLO_FSTYPE_NTFS},
    {kNtfs3Magic, ORLO_FSTYPE_NTFS},
    {kHfsPlusMagic, ORLO_FSTYPE_HFSPLUS},
    {kExfatMagic, ORLO_FSTYPE_EXFAT},
    {ISOFS_SUPER_MAGIC, ORLO_FSTYPE_ISO9660},
    {kUdfMagic, ORLO_FSTYPE_UDF},
    {NFS_SUPER_MAGIC, ORLO_FSTYPE_NFS},
    {kCifsMagic, ORLO_FSTYPE_CIFS},
    {kSmb2Magic, ORLO_FSTYPE_CIFS},
    {F2FS_SUPER_MAGIC, ORLO_FSTYPE_F2FS},
    {TMPFS_MAGIC, ORLO_FSTYPE_TMPFS},
};

struct NameType {
    const char *name;
    int type;
};

constexpr NameType kExtNames[] = {
    {"ext2", ORLO_FSTYPE_EXT2},
    {"ext3", ORLO_FSTYPE_EXT3},
    {"ext4", ORLO_FSTYPE_EXT4},
};

// ext2, ext3 and ext4 cannot be told apart by statfs; the mount table names the
// driver that mounted the device.  Falls back to ext4, the appliance's own format.
int ExtTypeOf(const char *path) {
    struct stat st;
    if (orlo::os::Stat(path, &st) != 0) return ORLO_FSTYPE_EXT4;
    FILE *f = orlo::os::Fopen("/proc/self/mountinfo", "re");
    if (f == nullptr) return ORLO_FSTYPE_EXT4;
    int type = ORLO_FSTYPE_EXT4;
    char *line = nullptr;
    size_t cap = 0;
    while (getline(&line, &cap, f) > 0) {
        unsigned int maj = 0, min = 0;
        if (sscanf(line, "%*d %*d %u:%u", &maj, &min) != 2) continue;
        if (makedev(maj, min) != st.st_dev) continue;
        const char *sep = strstr(line, " - ");
        if (sep == nullptr) continue;
        char fstype[32];
        if (sscanf(sep + 3, "%31s", fstype) != 1) continue;
        for (const NameType &n : kExtNames) {
            if (strcmp(fstype, n.name) == 0) type = n.type;
        }
        break;
    }
    free(line);
    fclose(f);
    return type;
}

}  // namespace

extern "C" {

ORLO_EXPORT int ORLOGetFSType(const char *path) {
    if (path == nullptr || path[0] == '\0') {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = EINVAL;
        return -1;
    }
    struct statfs sfs;
    if (orlo::os::Statfs(path, &sfs) != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_IO);
        return -1;
    }
    unsigned long magic = static_cast<unsigned long>(sfs.f_type) & 0xFFFFFFFFUL;
    if (magic == kExtMagic) return ExtTypeOf(path);
    for (const MagicType &m : kMagicTypes) {
        if (m.magic == magic) return m.type;
    }
    return ORLO_FSTYPE_UNKNOWN;
}

}  // extern "C"
