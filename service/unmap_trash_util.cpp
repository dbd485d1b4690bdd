// The record of the process groups that release deleted LUNs' space in the background.
#include "service/unmap_trash_util.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "platform/os_seam.h"

namespace orlo {
namespace service {
namespace unmap {

namespace {

// Reads the process group and state of /proc/<pid>/stat: "pid (comm) state ppid pgrp ...".
// The command name may hold spaces and parentheses, so the fields are taken after the
// last ')'.
bool ProcStat(const char *pid, char *state, pid_t *pgrp) {
    std::string path = std::string("/proc/") + pid + "/stat";
    FileGuard f(orlo::os::Fopen(path.c_str(), "re"));
    if (f.get() == nullptr) return false;  // gone meanwhile
    char buf[1024];
    size_t n = fread(buf, 1, sizeof(buf) - 1, f.get());
    buf[n] = '\0';
    const char *close = strrchr(buf, ')');
    if (close == nullptr) return false;
    int ppid = 0, group = 0;
    if (sscanf(close + 1, " %c %d %d", state, &ppid, &group) != 3) return false;
    *pgrp = group;
    return true;
}

}  // namespace

uint32_t ReadGroups(std::vector<pid_t> *groups) {
    groups->clear();
    FileGuard f(orlo::os::Fopen(kPidFile, "re"));
    if (f.get() == nullptr) {
        if (errno == ENOENT) return ORLO_OK;
        ORLO_LOG_ERR("fopen(\"%s\", \"r\") failed, err=%m", kPidFile);
        return ORLO_ERR_READ_FILE;
    }
    char line[64];
    while (fgets(line, sizeof(line), f.get()) != nullptr) {
        char *end = nullptr;
        errno = 0;
        long v = strtol(line, &end, 10);
        if (errno != 0 || end == line || v <= 1 || v > 0x3fffffff || (*end != '\n' && *end != '\0')) continue;
        groups->push_back(static_cast<pid_t>(v));
    }
    return ORLO_OK;
}

uint32_t WriteGroups(const std::vector<pid_t> &groups) {
    if (groups.empty()) {
        if (orlo::os::Unlink(kPidFile) != 0 && errno != ENOENT) {
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", kPidFile);
            return ORLO_ERR_UNLINK_FILE;
        }
        return ORLO_OK;
    }
    std::string text;
    for (pid_t g : groups) text += std::to_string(g) + "\n";
    FdGuard fd(orlo::os::Open(kPidFile, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
    if (fd.get() < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_WRONLY | O_CREAT | O_TRUNC) failed, err=%m", kPidFile);
        return ORLO_ERR_WRITE_FILE;
    }
    ssize_t w = ::write(fd.get(), text.data(), text.size());
    if (w != static_cast<ssize_t>(text.size())) {
        ORLO_LOG_ERR("write(%d, %p, %zu) failed, err=%m", fd.get(), static_cast<const void *>(text.data()),
                     text.size());
        return ORLO_ERR_WRITE_FILE;
    }
    if (::close(fd.release()) != 0) {
        ORLO_LOG_ERR("close() of %s failed, err=%m", kPidFile);
        return ORLO_ERR_CLOSE_FILE;
    }
    return ORLO_OK;
}

int LiveMembers(pid_t pgid) {
    DirGuard d(orlo::os::Opendir("/proc"));
    if (d.get() == nullptr) {
        ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", "/proc");
        return -1;
    }
    int live = 0;
    while (struct dirent *e = readdir(d.get())) {
        if (e->d_name[0] < '1' || e->d_name[0] > '9') continue;
        char state = 0;
        pid_t group = 0;
        if (ProcStat(e->d_name, &state, &group) && group == pgid && state != 'Z' && state != 'X') ++live;
    }
    return live;
}

}  // namespace unmap
}  // namespace service
}  // namespace orlo
