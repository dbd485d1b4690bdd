// Plug-ins: executables run around the library's operations, in name order, with a
// JSON description of the object on their standard input.
#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <string>
#include <vector>

#include "olibc.h"
#include "platform/os_seam.h"

struct _tag_OLIB_PLUGIN {
    unsigned int magic;
    std::string action;
    std::vector<std::string> programs;  // logical paths, in name order
};

namespace {

const unsigned int kPluginMagic = 0x504c5547;  // "PLUG"
const char kPluginRoot[] = "/usr/orlo/plugins";

bool IsExecutableFile(const std::string &path) {
    struct stat st;
    return orlo::os::Stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode) && (st.st_mode & 0111) != 0;
}

// A name usable as one path component.
bool IsPlainName(const char *s) {
    return s != nullptr && s[0] != '\0' && strchr(s, '/') == nullptr && strcmp(s, ".") != 0 && strcmp(s, "..") != 0;
}

// Writes all of data to fd without letting a reader that went away raise SIGPIPE in
// the calling program: SIGPIPE is blocked in this thread for the write and a pending
// one is consumed.  A reader that closed early is not an error of ours.
void WriteAllQuietly(int fd, const char *data, size_t len) {
    sigset_t pipeSet, oldSet;
    sigemptyset(&pipeSet);
    sigaddset(&pipeSet, SIGPIPE);
    pthread_sigmask(SIG_BLOCK, &pipeSet, &oldSet);
    bool brokenPipe = false;
    while (len > 0) {
        ssize_t n = write(fd, data, len);
        if (n < 0) {
            if (errno == EINTR) continue;
            brokenPipe = errno == EPIPE;
            break;
        }
        data += n;
        len -= static_cast<size_t>(n);
    }
    if (brokenPipe && !sigismember(&oldSet, SIGPIPE)) {
        struct timespec zero = {0, 0};
        sigtimedwait(&pipeSet, nullptr, &zero);
    }
    pthread_sigmask(SIG_SETMASK, &oldSet, nullptr);
}

// Runs one plug-in to its end, or kills it after the time-out.  True when it exited 0.
bool RunOne(const std::string &program, int event, const std::string &action, const char *json) {
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) return false;
    std::vector<std::string> argv = {program, std::to_string(event), action};
    pid_t pid = orlo::os::Spawn(argv, fds[0], -1);
    close(fds[0]);
    if (pid < 0) {
        close(fds[1]);
        return false;
    }
    if (json != nullptr) WriteAllQuietly(fds[1], json, strlen(json));
    close(fds[1]);
    int status = 0;
    for (int waitedMs = 0;; waitedMs += 10) {
        pid_t r = waitpid(pid, &status, WNOHANG);
        if (r == pid) break;
        if (r < 0 && errno != EINTR) return false;
        if (waitedMs >= OLIB_PLUGIN_TIMEOUT * 1000) {
            kill(pid, SIGKILL);
            waitpid(pid, &status, 0);
            return false;
        }
        poll(nullptr, 0, 10);
    }
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBPluginSDKInit(const char *category, const char *action, POLIB_PLUGIN *pHandle) {
    if (!IsPlainName(category) || !IsPlainName(action) || pHandle == nullptr) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    *pHandle = nullptr;
    auto *h = new (std::nothrow) OLIB_PLUGIN();
    if (h == nullptr) {
        OLIBCErrSet(OLIBC_ERR_OUT_OF_MEM);
        return -1;
    }
    h->magic = kPluginMagic;
    h->action = action;
    std::string dir = std::string(kPluginRoot) + "/" + category + "/" + action;
    // No directory means no plug-ins: the operation goes on alone.
    if (DIR *d = orlo::os::Opendir(dir.c_str())) {
        while (struct dirent *e = readdir(d)) {
            if (e->d_name[0] == '.') continue;
            std::string path = dir + "/" + e->d_name;
            if (IsExecutableFile(path)) h->programs.push_back(path);
        }
        closedir(d);
    }
    std::sort(h->programs.begin(), h->programs.end());
    *pHandle = h;
    return 0;
}

ORLO_EXPORT int OLIBPluginHasInit(const OLIB_PLUGIN *handle) {
    return handle != nullptr && handle->magic == kPluginMagic ? 1 : 0;
}

ORLO_EXPORT int OLIBPluginCount(const OLIB_PLUGIN *handle) {
    return OLIBPluginHasInit(handle) ? static_cast<int>(handle->programs.size()) : 0;
}

ORLO_EXPORT int OLIBPluginRun(POLIB_PLUGIN handle, int event, const char *json) {
    if (!OLIBPluginHasInit(handle)) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    int ret = 0;
    for (const std::string &program : handle->programs) {
        if (RunOne(program, event, handle->action, json)) continue;
        OLIBCErrSet(OLIBC_ERR_EXEC);
        ret = -1;
        // Any plug-in may veto an operation before it starts: the first "no" is final.
        if (event == OLIB_PLUGIN_EVENT_PRE) break;
    }
    return ret;
}

ORLO_EXPORT void OLIBPluginExit(POLIB_PLUGIN handle) {
    if (!OLIBPluginHasInit(handle)) return;
    handle->magic = 0;
    delete handle;
}

}  // extern "C"
