// The OS seam: maps the appliance's absolute paths under ORLO_SYSROOT and wraps every
// path-taking or process-starting system call the library makes.
#include "platform/os_seam.h"

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace orlo {
namespace os {

namespace {

// Paths that always mean the running machine, sandbox or not.
bool IsNeverMapped(const char *p) {
    static const char *const kPrefixes[] = {"/dev", "/proc", "/sys"};
    for (const char *pre : kPrefixes) {
        size_t n = strlen(pre);
        if (strncmp(p, pre, n) == 0 && (p[n] == '\0' || p[n] == '/')) return true;
    }
    return false;
}

// Holds a mapped path for the duration of one call.
class Mapped {
  public:
    explicit Mapped(const char *logical) {
        if (logical == nullptr) {
            ok_ = false;
            errno = EFAULT;
            return;
        }
        ok_ = MapPath(logical, buf_, sizeof(buf_)) == 0;
    }
    bool ok() const { return ok_; }
    const char *c_str() const { return buf_; }

  private:
    char buf_[PATH_MAX];
    bool ok_;
};

}  // namespace

std::string SysRoot() {
    const char *root = secure_getenv("ORLO_SYSROOT");
    if (root == nullptr || root[0] == '\0') return std::string();
    std::string r(root);
    while (r.size() > 1 && r.back() == '/') r.pop_back();
    if (r == "/") return std::string();
    return r;
}

int MapPath(const char *logical, char *out, size_t size) {
    if (logical == nullptr || out == nullptr || size == 0) {
        errno = EINVAL;
        return -1;
    }
    std::string root = SysRoot();
    int n;
    if (root.empty() || logical[0] != '/' || IsNeverMapped(logical)) {
        n = snprintf(out, size, "%s", logical);
    } else {
        n = snprintf(out, size, "%s%s", root.c_str(), logical);
    }
    if (n < 0 || static_cast<size_t>(n) >= size) {
        out[0] = '\0';
        errno = ENAMETOOLONG;
        return -1;
    }
    return 0;
}

std::string Map(const char *logical) {
    Mapped m(logical);
    return m.ok() ? std::string(m.c_str()) : std::string();
}

std::string Unmap(const char *mapped) {
    if (mapped == nullptr) return std::string();
    std::string root = SysRoot();
    size_t n = root.size();
    if (!root.empty() && strncmp(mapped, root.c_str(), n) == 0 && (mapped[n] == '/' || mapped[n] == '\0')) {
        return mapped[n] == '\0' ? std::string("/") : std::string(mapped + n);
    }
    return std::string(mapped);
}

#define ORLO_MAP_OR_FAIL(var, path, failval) \
    Mapped var(path);                        \
    if (!var.ok()) return failval

int Open(const char *path, int flags, mode_t mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::open(m.c_str(), flags, mode);
}

int OpenAt(int dirfd, const char *name, int flags, mode_t mode) { return ::openat(dirfd, name, flags, mode); }

FILE *Fopen(const char *path, const char *mode) {
    ORLO_MAP_OR_FAIL(m, path, nullptr);
    return ::fopen(m.c_str(), mode);
}

int Mkdir(const char *path, mode_t mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::mkdir(m.c_str(), mode);
}

int Rmdir(const char *path) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::rmdir(m.c_str());
}

int Unlink(const char *path) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::unlink(m.c_str());
}

int Rename(const char *from, const char *to) {
    ORLO_MAP_OR_FAIL(a, from, -1);
    ORLO_MAP_OR_FAIL(b, to, -1);
    return ::rename(a.c_str(), b.c_str());
}

int Symlink(const char *target, const char *link) {
    ORLO_MAP_OR_FAIL(t, target, -1);
    ORLO_MAP_OR_FAIL(l, link, -1);
    return ::symlink(t.c_str(), l.c_str());
}

ssize_t Readlink(const char *path, char *buf, size_t size) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    if (buf == nullptr || size == 0) {
        errno = EINVAL;
        return -1;
    }
    char raw[PATH_MAX];
    ssize_t n = ::readlink(m.c_str(), raw, sizeof(raw) - 1);
    if (n < 0) return -1;
    raw[n] = '\0';
    std::string logical = raw[0] == '/' ? Unmap(raw) : std::string(raw);
    size_t len = logical.size() < size ? logical.size() : size;
    memcpy(buf, logical.data(), len);  // like readlink: no NUL, possibly cut at size
    return static_cast<ssize_t>(len);
}

int Stat(const char *path, struct stat *st) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::stat(m.c_str(), st);
}

int Lstat(const char *path, struct stat *st) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::lstat(m.c_str(), st);
}

int Access(const char *path, int mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::access(m.c_str(), mode);
}

DIR *Opendir(const char *path) {
    ORLO_MAP_OR_FAIL(m, path, nullptr);
    return ::opendir(m.c_str());
}

int Mkstemp(char *tmpl) {
    if (tmpl == nullptr) {
        errno = EINVAL;
        return -1;
    }
    size_t len = strlen(tmpl);
    if (len < 6 || strcmp(tmpl + len - 6, "XXXXXX") != 0) {
        errno = EINVAL;
        return -1;
    }
    char mapped[PATH_MAX];
    if (MapPath(tmpl, mapped, sizeof(mapped)) != 0) return -1;
    int fd = ::mkstemp(mapped);
    if (fd < 0) return -1;
    memcpy(tmpl + len - 6, mapped + strlen(mapped) - 6, 6);  // same suffix, logical prefix
    return fd;
}

int Mkfifo(const char *path, mode_t mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::mkfifo(m.c_str(), mode);
}

int Statvfs(const char *path, struct statvfs *st) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::statvfs(m.c_str(), st);
}

int Statfs(const char *path, struct statfs *st) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::statfs(m.c_str(), st);
}

int Truncate(const char *path, off_t length) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::truncate(m.c_str(), length);
}

int Chmod(const char *path, mode_t mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::chmod(m.c_str(), mode);
}

int Chown(const char *path, uid_t uid, gid_t gid) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return ::chown(m.c_str(), uid, gid);
}

char *Realpath(const char *path, char *resolved) {
    ORLO_MAP_OR_FAIL(m, path, nullptr);
    char real[PATH_MAX];
    if (::realpath(m.c_str(), real) == nullptr) return nullptr;
    std::string logical = Unmap(real);
    if (logical.size() >= PATH_MAX) {
        errno = ENAMETOOLONG;
        return nullptr;
    }
    memcpy(resolved, logical.c_str(), logical.size() + 1);
    return resolved;
}

pid_t Spawn(const std::vector<std::string> &argv, int stdinFd, int stdoutFd) {
    if (argv.empty()) {
        errno = EINVAL;
        return -1;
    }
    std::string prog = Map(argv[0].c_str());
    if (prog.empty()) return -1;
    std::vector<char *> args;
    args.reserve(argv.size() + 1);
    for (const std::string &a : argv) args.push_back(const_cast<char *>(a.c_str()));
    args.push_back(nullptr);

    posix_spawn_file_actions_t fa;
    posix_spawn_file_actions_init(&fa);
    if (stdinFd >= 0) posix_spawn_file_actions_adddup2(&fa, stdinFd, STDIN_FILENO);
    if (stdoutFd >= 0) posix_spawn_file_actions_adddup2(&fa, stdoutFd, STDOUT_FILENO);
    pid_t pid = -1;
    int rc = posix_spawn(&pid, prog.c_str(), &fa, nullptr, args.data(), environ);
    posix_spawn_file_actions_destroy(&fa);
    if (rc != 0) {
        errno = rc;
        return -1;
    }
    return pid;
}

int Run(const std::vector<std::string> &argv) {
    pid_t pid = Spawn(argv);
    if (pid < 0) return -1;
    int status = 0;
    while (waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR) return -1;
    }
    if (WIFEXITED(status)) return WEXITSTATUS(status);
    errno = EINTR;
    return -1;
}

int DeleteModule(const char *name, unsigned int flags) {
    if (name == nullptr || name[0] == '\0') {
        errno = EINVAL;
        return -1;
    }
    if (SysRoot().empty()) return static_cast<int>(syscall(__NR_delete_module, name, flags));
    // Sandboxed: the simulated kernel target keeps the module table.
    int fd = Open("/config/.sim/modules", O_WRONLY | O_CLOEXEC);
    if (fd < 0) {
        errno = ENOENT;
        return -1;
    }
    std::string cmd = std::string("remove ") + name + "\n";
    ssize_t n = ::write(fd, cmd.c_str(), cmd.size());
    int saved = errno;
    ::close(fd);
    if (n != static_cast<ssize_t>(cmd.size())) {
        errno = n < 0 ? saved : EIO;
        return -1;
    }
    return 0;
}

int ModuleLoaded(const char *name) {
    if (name == nullptr || name[0] == '\0') {
        errno = EINVAL;
        return -1;
    }
    // /proc/modules lines start with the name and a blank; the simulator lists one
    // name a line.
    FILE *f = SysRoot().empty() ? ::fopen("/proc/modules", "re") : Fopen("/config/.sim/modules", "re");
    if (f == nullptr) return -1;
    char line[512];
    size_t n = strlen(name);
    int found = 0;
    while (found == 0 && fgets(line, sizeof(line), f) != nullptr) {
        if (strncmp(line, name, n) == 0 && (line[n] == ' ' || line[n] == '\n' || line[n] == '\0')) found = 1;
    }
    fclose(f);
    return found;
}

}  // namespace os
}  // namespace orlo
