#include "support/sandbox.h"

#include <fcntl.h>
#include <ftw.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

#include "base/orlo_log.h"

namespace orlotest {

LogCapture::LogCapture() { OrloLogSetSink(&LogCapture::Sink, this); }

LogCapture::~LogCapture() { OrloLogSetSink(nullptr, nullptr); }

void LogCapture::Sink(int, const char *line, void *ctx) {
    auto *self = static_cast<LogCapture *>(ctx);
    std::lock_guard<std::mutex> lock(self->mu_);
    self->lines_.emplace_back(line);
}

std::vector<std::string> LogCapture::Lines() const {
    std::lock_guard<std::mutex> lock(mu_);
    return lines_;
}

bool LogCapture::Contains(const std::string &text) const {
    std::lock_guard<std::mutex> lock(mu_);
    for (const std::string &l : lines_)
        if (l.find(text) != std::string::npos) return true;
    return false;
}

std::string LogCapture::Dump() const {
    std::lock_guard<std::mutex> lock(mu_);
    std::string s;
    for (const std::string &l : lines_) s += l + "\n";
    return s;
}

void LogCapture::Clear() {
    std::lock_guard<std::mutex> lock(mu_);
    lines_.clear();
}

std::string MakeTempDir(const char *prefix) {
    std::string tmpl = std::string("/tmp/") + prefix + "-XXXXXX";
    std::vector<char> buf(tmpl.begin(), tmpl.end());
    buf.push_back('\0');
    if (mkdtemp(buf.data()) == nullptr) return std::string();
    return std::string(buf.data());
}

namespace {
int RemoveOne(const char *path, const struct stat *, int type, struct FTW *) {
    if (type == FTW_DP)
        rmdir(path);
    else
        unlink(path);
    return 0;
}
}  // namespace

void RemoveTree(const std::string &path) {
    if (path.empty() || path == "/") return;
    nftw(path.c_str(), RemoveOne, 64, FTW_DEPTH | FTW_PHYS | FTW_MOUNT);
}

void SandboxTest::SetUp() {
    root_ = MakeTempDir("orlo-sandbox");
    ASSERT_FALSE(root_.empty());
    for (const char *d : {"/tmp", "/usr/orlo/etc", "/etc", "/etc.defaults", "/config", "/volume1"}) {
        std::string p = root_ + d;
        std::string cmd;
        for (size_t i = 1; i <= p.size(); ++i)
            if (i == p.size() || p[i] == '/') mkdir(p.substr(0, i).c_str(), 0755);
    }
    chmod((root_ + "/tmp").c_str(), 01777);
    setenv("ORLO_SYSROOT", root_.c_str(), 1);
}

void SandboxTest::TearDown() {
    unsetenv("ORLO_SYSROOT");
    RemoveTree(root_);
}

void SandboxTest::WriteFile(const std::string &logical, const std::string &content, int mode) const {
    std::string p = Real(logical);
    for (size_t i = 1; i < p.size(); ++i)
        if (p[i] == '/') mkdir(p.substr(0, i).c_str(), 0755);
    std::ofstream f(p, std::ios::binary | std::ios::trunc);
    f << content;
    f.close();
    chmod(p.c_str(), static_cast<mode_t>(mode));
}

std::string SandboxTest::ReadFile(const std::string &logical) const {
    std::ifstream f(Real(logical), std::ios::binary);
    std::stringstream ss;
    ss << f.rdbuf();
    return ss.str();
}

bool SandboxTest::Exists(const std::string &logical) const {
    struct stat st;
    return lstat(Real(logical).c_str(), &st) == 0;
}

namespace {
std::string Drain(int fd) {
    std::string s;
    char buf[4096];
    ssize_t n;
    while ((n = read(fd, buf, sizeof(buf))) > 0) s.append(buf, static_cast<size_t>(n));
    return s;
}
}  // namespace

int RunProgram(const std::vector<std::string> &argv, std::string *out, std::string *err,
               const std::string &input) {
    int inPipe[2], outPipe[2], errPipe[2];
    if (pipe(inPipe) != 0 || pipe(outPipe) != 0 || pipe(errPipe) != 0) return -1;
    pid_t pid = fork();
    if (pid == 0) {
        dup2(inPipe[0], 0);
        dup2(outPipe[1], 1);
        dup2(errPipe[1], 2);
        for (int fd : {inPipe[0], inPipe[1], outPipe[0], outPipe[1], errPipe[0], errPipe[1]}) close(fd);
        std::vector<char *> args;
        for (const std::string &a : argv) args.push_back(const_cast<char *>(a.c_str()));
        args.push_back(nullptr);
        execv(args[0], args.data());
        _exit(127);
    }
    close(inPipe[0]);
    close(outPipe[1]);
    close(errPipe[1]);
    if (!input.empty()) {
        ssize_t w = write(inPipe[1], input.data(), input.size());
        (void)w;
    }
    close(inPipe[1]);
    // Small outputs only: read stdout fully, then stderr.
    std::string o = Drain(outPipe[0]);
    std::string e = Drain(errPipe[0]);
    close(outPipe[0]);
    close(errPipe[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    if (out != nullptr) *out = o;
    if (err != nullptr) *err = e;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::string BuiltProgram(const std::string &name) { return std::string(ORLO_BINARY_DIR) + "/bin/" + name; }

}  // namespace orlotest
