// Process execution of the core platform library: programs are started through the OS
// seam (mapped under ORLO_SYSROOT, no shell, so arguments reach the program exactly as
// given), waited for by pid so that other children of the caller are never reaped, and
// streams of OLIBCPopen remember the pid they belong to.
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include "olibc.h"
#include "platform/os_seam.h"

namespace {

// Stream -> pid of every open OLIBCPopen stream.  Streams may be opened and closed by
// different threads, so the table has a lock of its own.
class PopenTable {
  public:
    void Add(FILE *f, pid_t pid) {
        std::lock_guard<std::mutex> lock(mu_);
        pids_[f] = pid;
    }
    // The pid of f, removed from the table; -1 when f is not an open stream of ours.
    pid_t Take(FILE *f) {
        std::lock_guard<std::mutex> lock(mu_);
        auto it = pids_.find(f);
        if (it == pids_.end()) return -1;
        pid_t pid = it->second;
        pids_.erase(it);
        return pid;
    }

  private:
    std::mutex mu_;
    std::unordered_map<FILE *, pid_t> pids_;
};

PopenTable &Table() {
    static PopenTable *table = new PopenTable();  // never destroyed: streams may outlive exit handlers
    return *table;
}

// Waits for exactly this child.  The exit status (0..255); -1 when it was killed or
// cannot be waited for (a caller that ignores SIGCHLD has it reaped by the kernel).
// A status other than 0 is also recorded as OLIBC_ERR_EXEC.
int WaitChild(pid_t pid) {
    int status = 0;
    while (waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR) {
            OLIBCErrSet(OLIBC_ERR_EXEC);
            return -1;
        }
    }
    if (WIFEXITED(status)) {
        int code = WEXITSTATUS(status);
        if (code != 0) OLIBCErrSet(OLIBC_ERR_EXEC);
        return code;
    }
    OLIBCErrSet(OLIBC_ERR_EXEC);
    errno = EINTR;
    return -1;
}

bool ToVector(const char *const argv[], std::vector<std::string> *out) {
    if (argv == nullptr || argv[0] == nullptr || argv[0][0] == '\0') return false;
    for (size_t i = 0; argv[i] != nullptr; ++i) out->emplace_back(argv[i]);
    return true;
}

int ExecVector(const std::vector<std::string> &args) {
    pid_t pid = orlo::os::Spawn(args);
    if (pid < 0) {
        OLIBCErrSet(OLIBC_ERR_EXEC);
        return -1;
    }
    return WaitChild(pid);
}

FILE *PopenVector(const std::vector<std::string> &args, const char *mode) {
    bool reading;
    if (mode != nullptr && (strcmp(mode, "r") == 0 || strcmp(mode, "re") == 0)) {
        reading = true;
    } else if (mode != nullptr && (strcmp(mode, "w") == 0 || strcmp(mode, "we") == 0)) {
        reading = false;
    } else {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = EINVAL;
        return nullptr;
    }
    // Close-on-exec in the parent, so that no later child inherits the pipe and keeps
    // it open; the child's own end is put on its stdin or stdout by the spawn.
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        OLIBCErrSet(OLIBC_ERR_EXEC);
        return nullptr;
    }
    int mine = reading ? fds[0] : fds[1];
    int theirs = reading ? fds[1] : fds[0];
    pid_t pid = reading ? orlo::os::Spawn(args, -1, theirs) : orlo::os::Spawn(args, theirs, -1);
    int saved = errno;
    ::close(theirs);
    if (pid < 0) {
        ::close(mine);
        OLIBCErrSet(OLIBC_ERR_EXEC);
        errno = saved;
        return nullptr;
    }
    FILE *f = fdopen(mine, reading ? "r" : "w");
    if (f == nullptr) {
        ::close(mine);  // the child sees end of file or a broken pipe and ends
        WaitChild(pid);
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return nullptr;
    }
    Table().Add(f, pid);
    return f;
}

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBCExec(const char *path, const char *arg1, const char *arg2, const char *arg3,
                          const char *arg4) {
    const char *argv[] = {path, arg1, arg2, arg3, arg4, nullptr};
    return OLIBCExecv(argv);
}

ORLO_EXPORT int OLIBCExecv(const char *const argv[]) {
    std::vector<std::string> args;
    if (!ToVector(argv, &args)) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = EINVAL;
        return -1;
    }
    return ExecVector(args);
}

ORLO_EXPORT FILE *OLIBCPopen(const char *path, const char *mode, ...) {
    if (path == nullptr || path[0] == '\0') {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = EINVAL;
        return nullptr;
    }
    std::vector<std::string> args{path};
    va_list ap;
    va_start(ap, mode);
    for (const char *a = va_arg(ap, const char *); a != nullptr; a = va_arg(ap, const char *)) args.emplace_back(a);
    va_end(ap);
    return PopenVector(args, mode);
}

ORLO_EXPORT FILE *OLIBCPopenv(const char *const argv[], const char *mode) {
    std::vector<std::string> args;
    if (!ToVector(argv, &args)) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = EINVAL;
        return nullptr;
    }
    return PopenVector(args, mode);
}

ORLO_EXPORT int OLIBCPclose(FILE *stream) {
    if (stream == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = EINVAL;
        return -1;
    }
    pid_t pid = Table().Take(stream);
    if (pid < 0) {  // not a stream of OLIBCPopen: left alone
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        errno = ECHILD;
        return -1;
    }
    fclose(stream);
    return WaitChild(pid);
}

ORLO_EXPORT pid_t OLIBCProcForkChildNoWait(void) {
    // A double fork: the intermediate child forks the real one, reports its pid and
    // exits at once; the parent reaps the intermediate by its pid, and the real child,
    // now an orphan, is reaped by init.  SIGCHLD dispositions are not touched.
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        OLIBCErrSet(OLIBC_ERR_EXEC);
        return -1;
    }
    pid_t mid = fork();
    if (mid < 0) {
        int saved = errno;
        ::close(fds[0]);
        ::close(fds[1]);
        OLIBCErrSet(OLIBC_ERR_EXEC);
        errno = saved;
        return -1;
    }
    if (mid == 0) {
        ::close(fds[0]);
        pid_t child = fork();
        if (child == 0) {
            ::close(fds[1]);
            return 0;
        }
        ssize_t w;
        do {
            w = ::write(fds[1], &child, sizeof(child));
        } while (w < 0 && errno == EINTR);
        _exit(child < 0 || w != static_cast<ssize_t>(sizeof(child)) ? 1 : 0);
    }
    ::close(fds[1]);
    pid_t child = -1;
    size_t got = 0;
    while (got < sizeof(child)) {
        ssize_t r = ::read(fds[0], reinterpret_cast<char *>(&child) + got, sizeof(child) - got);
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) break;
        got += static_cast<size_t>(r);
    }
    ::close(fds[0]);
    int status = 0;
    while (waitpid(mid, &status, 0) < 0 && errno == EINTR) {
    }
    if (got != sizeof(child) || child <= 0) {
        OLIBCErrSet(OLIBC_ERR_EXEC);
        errno = EAGAIN;
        return -1;
    }
    return child;
}

}  // extern "C"
