// What the platform knows of volumes and devices: volume numbers, the device and mount
// behind a path, administratively disabled storage objects, md RAID stripe-cache
// tuning, and the appliance's event log.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysinfo.h>
#include <sys/sysmacros.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "olibc.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"

namespace {

const char kDisabledSpaces[] = "/usr/orlo/etc/space_disabled.conf";
const char kEventLog[] = "/var/log/orlo/event.log";
const char kEventLogDir[] = "/var/log/orlo";

bool CopyTo(char *dst, size_t size, const std::string &src) {
    if (src.size() >= size) return false;
    memcpy(dst, src.c_str(), src.size() + 1);
    return true;
}

// Undoes the octal escapes of /proc/self/mountinfo ("\040" for a blank).
std::string Unescape(const char *s) {
    std::string out;
    for (; *s != '\0'; ++s) {
        if (s[0] == '\\' && s[1] >= '0' && s[1] <= '7' && s[2] >= '0' && s[2] <= '7' && s[3] >= '0' && s[3] <= '7') {
            out += static_cast<char>((s[1] - '0') * 64 + (s[2] - '0') * 8 + (s[3] - '0'));
            s += 3;
        } else {
            out += *s;
        }
    }
    return out;
}

// The mount whose device number is dev: its mount point (real path) and source device.
bool FindMount(dev_t dev, std::string *mountPoint, std::string *source) {
    FILE *f = orlo::os::Fopen("/proc/self/mountinfo", "re");
    if (f == nullptr) return false;
    char *line = nullptr;
    size_t cap = 0;
    bool found = false;
    while (!found && getline(&line, &cap, f) > 0) {
        unsigned int maj = 0, min = 0;
        char mnt[4096], src[4096];
        if (sscanf(line, "%*d %*d %u:%u %*s %4095s", &maj, &min, mnt) != 3) continue;
        if (makedev(maj, min) != dev) continue;
        const char *sep = strstr(line, " - ");
        if (sep == nullptr || sscanf(sep + 3, "%*s %4095s", src) != 1) continue;
        *mountPoint = Unescape(mnt);
        *source = Unescape(src);
        found = true;
    }
    free(line);
    fclose(f);
    return found;
}

// The mount whose mount point is the longest leading part of realPath.  Btrfs reports
// a device number of its own for each subvolume in stat, which matches no mount entry,
// so its mounts are found by path.
bool FindMountByPath(const std::string &realPath, std::string *mountPoint, std::string *source) {
    FILE *f = orlo::os::Fopen("/proc/self/mountinfo", "re");
    if (f == nullptr) return false;
    char *line = nullptr;
    size_t cap = 0;
    bool found = false;
    while (getline(&line, &cap, f) > 0) {
        char mnt[4096], src[4096];
        if (sscanf(line, "%*d %*d %*u:%*u %*s %4095s", mnt) != 1) continue;
        const char *sep = strstr(line, " - ");
        if (sep == nullptr || sscanf(sep + 3, "%*s %4095s", src) != 1) continue;
        std::string point = Unescape(mnt);
        const bool under = point == "/" || realPath == point ||
                           (realPath.compare(0, point.size(), point) == 0 && realPath[point.size()] == '/');
        if (!under || (found && point.size() < mountPoint->size())) continue;
        *mountPoint = point;
        *source = Unescape(src);
        found = true;
    }
    free(line);
    fclose(f);
    return found;
}

}  // namespace

extern "C" {

ORLO_EXPORT int ORLOVolIDParse(const char *path) { return ORLOVolumeNumGet(path); }

ORLO_EXPORT int ORLOSpaceInfoGet(const char *path, ORLO_SPACE_INFO *pInfo) {
    if (path == nullptr || path[0] != '/' || pInfo == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    memset(pInfo, 0, sizeof(*pInfo));
    struct stat st;
    if (strncmp(path, "/dev/", 5) == 0) {
        // A device path names the device itself (devices are never in a sandbox).
        if (orlo::os::Stat(path, &st) != 0) {
            OLIBCErrSet(errno == ENOENT ? OLIBC_ERR_NOT_FOUND : OLIBC_ERR_IO);
            return -1;
        }
        if (!CopyTo(pInfo->szDevice, sizeof(pInfo->szDevice), path)) {
            OLIBCErrSet(OLIBC_ERR_TOO_LONG);
            return -1;
        }
        pInfo->isBlockDevice = S_ISBLK(st.st_mode) ? 1 : 0;
        pInfo->fsType = -1;
        return 1;
    }
    struct statvfs vfs;
    if (orlo::os::Stat(path, &st) != 0 || orlo::os::Statvfs(path, &vfs) != 0) {
        OLIBCErrSet(errno == ENOENT ? OLIBC_ERR_NOT_FOUND : OLIBC_ERR_IO);
        return -1;
    }
    std::string mountPoint, source;
    char real[PATH_MAX];
    if (!FindMount(st.st_dev, &mountPoint, &source) &&
        (realpath(orlo::os::Map(path).c_str(), real) == nullptr || !FindMountByPath(real, &mountPoint, &source))) {
        OLIBCErrSet(OLIBC_ERR_NOT_FOUND);
        return -1;
    }
    if (!CopyTo(pInfo->szDevice, sizeof(pInfo->szDevice), source) ||
        !CopyTo(pInfo->szMountPoint, sizeof(pInfo->szMountPoint), orlo::os::Unmap(mountPoint.c_str()))) {
        OLIBCErrSet(OLIBC_ERR_TOO_LONG);
        return -1;
    }
    struct stat dst;
    pInfo->isBlockDevice = (orlo::os::Stat(source.c_str(), &dst) == 0 && S_ISBLK(dst.st_mode)) ? 1 : 0;
    pInfo->fsType = ORLOGetFSType(path);
    pInfo->totalBytes = static_cast<unsigned long long>(vfs.f_blocks) * vfs.f_frsize;
    pInfo->freeBytes = static_cast<unsigned long long>(vfs.f_bavail) * vfs.f_frsize;
    return 1;
}

ORLO_EXPORT int ORLOSpaceCanEnable(const char *name) {
    if (name == nullptr || name[0] == '\0') {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    FILE *f = orlo::os::Fopen(kDisabledSpaces, "re");
    if (f == nullptr) {
        if (errno == ENOENT) return 1;  // nothing disabled
        OLIBCErrSet(OLIBC_ERR_FOPEN);
        return -1;
    }
    char *line = nullptr;
    size_t cap = 0;
    ssize_t len;
    int ret = 1;
    while (ret == 1 && (len = getline(&line, &cap, f)) > 0) {
        while (len > 0 && (line[len - 1] == '\n' || line[len - 1] == ' ' || line[len - 1] == '\t')) line[--len] = '\0';
        if (strcmp(line, name) == 0) ret = 0;
    }
    free(line);
    fclose(f);
    return ret;
}

ORLO_EXPORT int ORLORAIDStripeCacheTune(const char *volume) {
    ORLO_SPACE_INFO info;
    if (ORLOSpaceInfoGet(volume, &info) < 1) return -1;
    // Only md arrays with parity (RAID 5 and 6) have a stripe cache; elsewhere there is
    // nothing to tune.
    const char *dev = strrchr(info.szDevice, '/');
    dev = dev != nullptr ? dev + 1 : info.szDevice;
    if (strncmp(dev, "md", 2) != 0) return 0;
    std::string knob = std::string("/sys/block/") + dev + "/md/stripe_cache_size";
    int fd = orlo::os::Open(knob.c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) {
        if (errno == ENOENT) return 0;
        OLIBCErrSet(OLIBC_ERR_FOPEN);
        return -1;
    }
    // Pages per member disk: larger caches pay off for sequential LUN writes, as far as
    // memory allows (each page costs 4 KiB per member).
    struct sysinfo si;
    unsigned long long ram = sysinfo(&si) == 0 ? static_cast<unsigned long long>(si.totalram) * si.mem_unit : 0;
    const char *value = ram >= (8ULL << 30) ? "8192" : ram >= (2ULL << 30) ? "4096" : "1024";
    ssize_t n = write(fd, value, strlen(value));
    close(fd);
    if (n != static_cast<ssize_t>(strlen(value))) {
        OLIBCErrSet(OLIBC_ERR_IO);
        return -1;
    }
    return 0;
}

ORLO_EXPORT int ORLOLogSet1(unsigned int eventId, const char *arg1, const char *arg2, const char *arg3) {
    for (const char *dir : {"/var", "/var/log", kEventLogDir}) {
        if (orlo::os::Mkdir(dir, 0755) != 0 && errno != EEXIST) {
            OLIBCErrSet(OLIBC_ERR_MKDIR);
            return -1;
        }
    }
    char when[32];
    time_t now = time(nullptr);
    struct tm tmv;
    strftime(when, sizeof(when), "%Y-%m-%dT%H:%M:%S", localtime_r(&now, &tmv));
    std::string entry = std::string(when) + "\t0x";
    char id[16];
    snprintf(id, sizeof(id), "%08X", eventId);
    entry += id;
    for (const char *a : {arg1, arg2, arg3}) {
        if (a == nullptr) continue;
        entry += '\t';
        // One entry is one line: control characters would break it.
        for (const char *c = a; *c != '\0'; ++c) entry += (static_cast<unsigned char>(*c) < 0x20) ? ' ' : *c;
    }
    entry += '\n';
    // O_APPEND makes each entry one atomic write, so concurrent writers never interleave.
    int fd = orlo::os::Open(kEventLog, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644);
    if (fd < 0) {
        OLIBCErrSet(OLIBC_ERR_FOPEN);
        return -1;
    }
    ssize_t n = write(fd, entry.data(), entry.size());
    close(fd);
    if (n != static_cast<ssize_t>(entry.size())) {
        OLIBCErrSet(OLIBC_ERR_IO);
        return -1;
    }
    return 0;
}

}  // extern "C"
