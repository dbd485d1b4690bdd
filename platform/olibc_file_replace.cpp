// Temporary files that replace a file: "<file>.XXXXXX" beside it, written, synced and
// renamed over it.  A writer killed before its rename leaves its temporary file behind;
// nothing else would ever remove it.  So each temporary file carries an exclusive flock
// for as long as its writer lives (the kernel drops it when the writer dies, however it
// dies), and every writer first sweeps the directory for temporary files of the same
// file whose flock it can take: those writers are gone.
#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstring>
#include <string>

#include "platform/olibc_file_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace olibc {

namespace {

constexpr size_t kSuffixLen = 6;  // what mkstemp puts in place of "XXXXXX"

// Whether name is base + "." + six letters or digits.
bool IsReplacementOf(const char *name, const std::string &base) {
    size_t n = strlen(name);
    if (n != base.size() + 1 + kSuffixLen || strncmp(name, base.c_str(), base.size()) != 0 || name[base.size()] != '.')
        return false;
    for (size_t i = n - kSuffixLen; i < n; ++i)
        if (!isalnum(static_cast<unsigned char>(name[i]))) return false;
    return true;
}

}  // namespace

void SweepReplacements(const char *path) {
    if (path == nullptr) return;
    int saved = errno;
    std::string p(path);
    size_t slash = p.rfind('/');
    std::string dir = slash == std::string::npos ? "." : (slash == 0 ? "/" : p.substr(0, slash));
    std::string base = slash == std::string::npos ? p : p.substr(slash + 1);
    DIR *d = os::Opendir(dir.c_str());
    if (d == nullptr) {
        errno = saved;
        return;
    }
    while (struct dirent *e = readdir(d)) {
        if (!IsReplacementOf(e->d_name, base)) continue;
        std::string stale = (dir == "/" ? "" : dir) + "/" + e->d_name;
        int fd = os::Open(stale.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC | O_NOCTTY);
        if (fd < 0) continue;
        struct stat held, now;
        // Only a regular file whose writer is gone (its flock is free), and only while the
        // name still leads to it.
        if (fstat(fd, &held) == 0 && S_ISREG(held.st_mode) && flock(fd, LOCK_EX | LOCK_NB) == 0 &&
            os::Lstat(stale.c_str(), &now) == 0 && now.st_dev == held.st_dev && now.st_ino == held.st_ino)
            os::Unlink(stale.c_str());
        close(fd);
    }
    closedir(d);
    errno = saved;
}

int MakeReplacement(std::string *tmpl) {
    const std::string pattern = *tmpl;
    for (int attempt = 0; attempt < 100; ++attempt) {
        *tmpl = pattern;
        int fd = os::Mkstemp(&(*tmpl)[0]);
        if (fd < 0) return -1;
        struct stat held, now;
        // A sweeper may have taken the new file for a dead writer's in the moment before
        // the flock: then it is gone (or another file has its name) and a new one is made.
        if (flock(fd, LOCK_EX | LOCK_NB) == 0 && fstat(fd, &held) == 0 && held.st_nlink > 0 &&
            os::Lstat(tmpl->c_str(), &now) == 0 && now.st_dev == held.st_dev && now.st_ino == held.st_ino)
            return fd;
        close(fd);
    }
    errno = EAGAIN;
    return -1;
}

}  // namespace olibc
}  // namespace orlo
