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

bool IsFailure(int r) { return r < 0; }
bool IsFailure(FILE *f) { return f == nullptr; }

// Directories every appliance has from its first boot on (the runtime tree under
// /tmp/iscsi is made by the library at start-up and kept).  Under a sandbox root they may
// be missing: a fresh "mktemp -d" is a valid root.  A call that makes something beneath
// one of them and fails because it is missing makes the directory (with its parents,
// inside the root only) and tries once more.  Mount points (/config, /volumeN) are not
// among them on purpose: making one would hide a missing mount and let the library write
// plain files where the kernel or a volume was meant to be.
struct StandingDir {
    const char *path;
    mode_t mode;
};
const StandingDir kStandingDirs[] = {
    {"/tmp", 01777},
    {"/tmp/iscsi", 0700},
    {"/tmp/iscsi/lun_lock", 0700},
    {"/tmp/iscsi/lun_unsync", 0700},
    {"/tmp/iscsi/snapshot_conf_lock", 0700},
    {"/tmp/iscsi/snapshot_cache", 0700},
    {"/tmp/iscsi/snapshot_lock", 0700},
    {"/tmp/iscsi/snapshot_cache_lock", 0700},
    {"/tmp/iscsi/snapshot_app_lock", 0700},
    {"/tmp/iscsi/snapshot_unsync_lock", 0700},
    {"/usr/orlo/etc", 0755},
    {"/usr/orlo/plugins", 0755},
    {"/etc", 0755},
    {"/etc/cron.d", 0755},
    {"/etc.defaults", 0755},
    {"/root", 0700},
    {"/var/run", 0755},
    {"/var/log", 0755},
    {"/var/lock", 0755},
    {"/var/crash", 0700},
    {"/var/target", 0700},
};

mode_t StandingMode(const std::string &logical) {
    for (const StandingDir &d : kStandingDirs)
        if (logical == d.path) return d.mode;
    return 0755;
}

// Makes, under the sandbox root, the standing directory that holds logical (the longest
// one that is a proper prefix of it), component by component.  True when it is there
// afterwards; false on the appliance itself (no root), for a path under no standing
// directory, or when it cannot be made.  errno is kept.
bool MakeStandingParent(const char *logical) {
    int saved = errno;
    std::string root = SysRoot();
    if (root.empty() || logical == nullptr || logical[0] != '/') return false;
    struct stat st;
    if (::stat(root.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) {
        errno = saved;
        return false;  // the root itself is never made
    }
    const StandingDir *best = nullptr;
    size_t bestLen = 0;
    for (const StandingDir &d : kStandingDirs) {
        size_t n = strlen(d.path);
        if (n > bestLen && strncmp(logical, d.path, n) == 0 && logical[n] == '/') {
            best = &d;
            bestLen = n;
        }
    }
    bool ok = best != nullptr;
    for (size_t i = 1; ok && i <= bestLen; ++i) {
        if (i < bestLen && best->path[i] != '/') continue;
        std::string part(best->path, i);
        std::string mapped = root + part;
        mode_t mode = StandingMode(part);
        if (::mkdir(mapped.c_str(), mode) == 0) {
            ::chmod(mapped.c_str(), mode);  // the umask may have taken bits (/tmp's sticky bit)
        } else if (errno != EEXIST) {
            ok = false;
        }
    }
    ok = ok && ::stat((root + best->path).c_str(), &st) == 0 && S_ISDIR(st.st_mode);
    errno = saved;
    return ok;
}

// Runs a call that makes logical (or something in its directory); when it fails for a
// missing standing directory, makes that directory and runs the call once more.
template <typename Call>
auto MakingStandingParent(const char *logical, Call call) -> decltype(call()) {
    auto r = call();
    if (IsFailure(r) && errno == ENOENT && MakeStandingParent(logical)) r = call();
    return r;
}

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
    if ((flags & O_CREAT) == 0) return ::open(m.c_str(), flags, mode);
    return MakingStandingParent(path, [&] { return ::open(m.c_str(), flags, mode); });
}

int OpenAt(int dirfd, const char *name, int flags, mode_t mode) { return ::openat(dirfd, name, flags, mode); }

FILE *Fopen(const char *path, const char *mode) {
    ORLO_MAP_OR_FAIL(m, path, nullptr);
    if (mode == nullptr || (mode[0] != 'w' && mode[0] != 'a')) return ::fopen(m.c_str(), mode);
    return MakingStandingParent(path, [&] { return ::fopen(m.c_str(), mode); });
}

int Mkdir(const char *path, mode_t mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return MakingStandingParent(path, [&] { return ::mkdir(m.c_str(), mode); });
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
    return MakingStandingParent(link, [&] { return ::symlink(t.c_str(), l.c_str()); });
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
    int fd = MakingStandingParent(tmpl, [&] {
        memcpy(mapped + strlen(mapped) - 6, "XXXXXX", 6);  // a failed mkstemp may leave its guess
        return ::mkstemp(mapped);
    });
    if (fd < 0) return -1;
    memcpy(tmpl + len - 6, mapped + strlen(mapped) - 6, 6);  // same suffix, logical prefix
    return fd;
}

int Mkfifo(const char *path, mode_t mode) {
    ORLO_MAP_OR_FAIL(m, path, -1);
    return MakingStandingParent(path, [&] { return ::mkfifo(m.c_str(), mode); });
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
