#include "support/configfs_sim_fixture.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <thread>

namespace orlotest {

namespace {

// Waits up to timeoutMs for pid to end.  False when it still runs; true otherwise,
// with its wait status in *status, or *known false when it was not this process's to
// wait for.
bool WaitExited(pid_t pid, int timeoutMs, int *status, bool *known) {
    for (int waited = 0; waited <= timeoutMs; waited += 5) {
        pid_t r = waitpid(pid, status, WNOHANG);
        if (r == pid) return true;
        if (r < 0 && errno == ECHILD) {
            *known = false;
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return false;
}

// A file for a simulator's standard error, beside the sandbox rather than in it.
std::string NewStderrFile() {
    const char *tmp = getenv("TMPDIR");
    std::string path = std::string(tmp != nullptr && tmp[0] != '\0' ? tmp : "/tmp") + "/orlo-sim-stderr-XXXXXX";
    int fd = mkstemp(&path[0]);
    if (fd < 0) return std::string();
    close(fd);
    return path;
}

std::string Slurp(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

std::string Unescape(const std::string &s) {
    std::string o;
    for (size_t i = 0; i < s.size(); ++i) {
        if (s[i] != '\\' || i + 1 == s.size()) {
            o += s[i];
            continue;
        }
        char c = s[++i];
        if (c == 'n') o += '\n';
        else if (c == 't') o += '\t';
        else if (c == 'x' && i + 2 < s.size()) {
            o += static_cast<char>(std::stoi(s.substr(i + 1, 2), nullptr, 16));
            i += 2;
        } else o += c;
    }
    return o;
}

}  // namespace

std::vector<std::string> ConfigfsSimTest::ModuleSetNames(int set, int version, bool rdma) {
    bool v4 = version == 4;
    switch (set) {
        case kTcmModules:
            if (v4)
                return {"rodsp_ep", "orlo_extent_pool", "target_core_mod", "target_core_iblock", "target_core_file",
                        "target_core_ep"};
            return {"rodsp_ep_4_0", "target_core_mod_4_0", "iscsi_extent_pool"};
        case kIscsiModules:
            if (v4 && rdma) return {"iscsi_target_mod", "ib_isert"};
            if (v4) return {"iscsi_target_mod"};
            return {"iscsi_target_mod_4_0"};
        case kVhostModules:
            return {"vhost_scsi"};
        case kLoopbackModules:
            return {"tcm_loop"};
        default:
            return {};
    }
}

std::vector<std::string> ConfigfsSimTest::AllModuleNames() {
    std::vector<std::string> all;
    for (int version : {4, 2})
        for (int set : {kTcmModules, kIscsiModules, kVhostModules, kLoopbackModules})
            for (const std::string &m : ModuleSetNames(set, version, true)) {
                bool seen = false;
                for (const std::string &a : all) seen = seen || a == m;
                if (!seen) all.push_back(m);
            }
    return all;
}

bool ConfigfsSimTest::MountedAt(const std::string &path) {
    std::ifstream in("/proc/mounts");
    std::string line;
    while (std::getline(in, line)) {
        std::istringstream ls(line);
        std::string dev, mnt;
        ls >> dev >> mnt;
        if (mnt == path) return true;
    }
    return false;
}

void ConfigfsSimTest::SetUp() {
    SandboxTest::SetUp();
    if (HasFatalFailure()) return;
    if (geteuid() != 0) GTEST_SKIP() << "the simulated kernel target needs root to mount FUSE";
    if (access("/dev/fuse", R_OK | W_OK) != 0) GTEST_SKIP() << "/dev/fuse is missing: cannot mount the simulator";
    // The insmod stand-in and a module file for every module the service may load.
    std::string insmod = BuiltProgram("orlo-sim-insmod");
    std::ifstream src(insmod, std::ios::binary);
    ASSERT_TRUE(src.good()) << "not built: " << insmod;
    std::stringstream bytes;
    bytes << src.rdbuf();
    WriteFile("/sbin/insmod", bytes.str(), 0755);
    for (const std::string &m : AllModuleNames()) WriteFile("/lib/modules/" + m + ".ko", "");
    stderrPath_ = NewStderrFile();
    ASSERT_FALSE(stderrPath_.empty()) << "cannot make a file for the simulator's standard error";
    pid_ = LaunchSim(root_, Mount(), stderrPath_);
    ASSERT_GT(pid_, 0) << "orlo-configfs-sim did not come up at " << Mount() << "\n" << Slurp(stderrPath_);
}

pid_t ConfigfsSimTest::LaunchSim(const std::string &root, const std::string &mount, const std::string &stderrPath,
                                 const std::vector<std::string> &extraArgs) {
    std::string prog = BuiltProgram("orlo-configfs-sim");
    // Everything the child needs is made before fork: it only redirects and execs.
    std::vector<std::string> args = {prog, "--root", root};
    args.insert(args.end(), extraArgs.begin(), extraArgs.end());
    args.push_back(mount);
    std::vector<char *> argv;
    for (std::string &a : args) argv.push_back(&a[0]);
    argv.push_back(nullptr);
    pid_t parent = getpid();
    pid_t pid = fork();
    if (pid < 0) return -1;
    if (pid == 0) {
        // Ends with the test process, however it ends: SIGTERM makes the simulator leave
        // its loop and unmount.
        prctl(PR_SET_PDEATHSIG, SIGTERM);
        if (getppid() != parent) _exit(1);
        if (!stderrPath.empty()) {
            int fd = open(stderrPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
            if (fd < 0 || dup2(fd, STDERR_FILENO) < 0) _exit(126);
            close(fd);
        }
        execv(prog.c_str(), argv.data());
        _exit(127);
    }
    struct stat st;
    for (int waited = 0; waited < 10000; waited += 5) {
        if (stat((mount + "/.sim/modules").c_str(), &st) == 0) return pid;
        int status = 0;
        if (waitpid(pid, &status, WNOHANG) == pid) return -1;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    kill(pid, SIGKILL);
    waitpid(pid, nullptr, 0);
    if (MountedAt(mount)) umount2(mount.c_str(), MNT_DETACH);
    return -1;
}

std::string ConfigfsSimTest::EndProblem(int status, bool stopped, const std::string &errText) {
    std::string why;
    if (WIFEXITED(status) && WEXITSTATUS(status) != 0) {
        why = "exited with status " + std::to_string(WEXITSTATUS(status));
    } else if (WIFSIGNALED(status) && (stopped || WTERMSIG(status) != SIGKILL)) {
        why = "was ended by signal " + std::to_string(WTERMSIG(status)) + " (" + strsignal(WTERMSIG(status)) + ")";
    }
    // What the sanitizers print: LeakSanitizer and AddressSanitizer reports, UBSan's.
    for (const char *report : {"ERROR: LeakSanitizer", "ERROR: AddressSanitizer", ": runtime error: "}) {
        if (errText.find(report) == std::string::npos) continue;
        why += std::string(why.empty() ? "" : ", and ") + "reported \"" + report + "\"";
        break;
    }
    if (why.empty()) return why;
    return "orlo-configfs-sim " + why + "; its standard error:\n" + errText;
}

bool ConfigfsSimTest::AbortConnection(const std::string &mount) {
    // mountinfo: ID PARENT MAJOR:MINOR ROOT MOUNTPOINT ...; a FUSE connection is named by
    // the minor number of its device.
    std::ifstream in("/proc/self/mountinfo");
    std::string line, minor;
    while (std::getline(in, line) && minor.empty()) {
        std::istringstream ls(line);
        std::string id, parent, dev, root, point;
        ls >> id >> parent >> dev >> root >> point;
        if (point == mount && dev.find(':') != std::string::npos) minor = dev.substr(dev.find(':') + 1);
    }
    if (minor.empty()) return false;
    const std::string dir = "/sys/fs/fuse/connections";
    std::string abortFile = dir + "/" + minor + "/abort";
    if (access(abortFile.c_str(), W_OK) != 0) ::mount("fusectl", dir.c_str(), "fusectl", 0, nullptr);
    int fd = open(abortFile.c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) return false;
    bool ok = write(fd, "1", 1) == 1;
    close(fd);
    return ok;
}

void ConfigfsSimTest::StopSim() {
    if (pid_ > 0) {
        int status = 0;
        pid_t r = waitpid(pid_, &status, WNOHANG);
        bool stopped = r == 0;
        bool known = r == pid_ || stopped;
        std::string late;
        if (stopped) {
            kill(pid_, SIGTERM);
            // A sanitizer's leak check at exit takes its time.
            if (!WaitExited(pid_, 10000, &status, &known)) {
                kill(pid_, SIGKILL);
                late = "did not stop within 10 s of SIGTERM; ";
                // A thread waiting on a request to its own mount outlives SIGKILL.
                if (!WaitExited(pid_, 2000, &status, &known)) {
                    if (AbortConnection(Mount())) late += "it was wedged, and its connection was aborted; ";
                    if (!WaitExited(pid_, 5000, &status, &known)) late += "it could not be ended; ";
                }
            }
        }
        pid_ = -1;
        std::string problem = EndProblem(known ? status : 0, stopped, Slurp(stderrPath_));
        if (!late.empty() || !problem.empty()) ADD_FAILURE() << late << problem;
    }
    if (!stderrPath_.empty()) {
        unlink(stderrPath_.c_str());
        stderrPath_.clear();
    }
    // A simulator that was killed leaves a dead mount behind: detach it.
    if (!root_.empty() && MountedAt(Mount())) umount2(Mount().c_str(), MNT_DETACH);
}

void ConfigfsSimTest::RestartSim(const std::vector<std::string> &extraArgs) {
    StopSim();
    stderrPath_ = NewStderrFile();
    ASSERT_FALSE(stderrPath_.empty());
    pid_ = LaunchSim(root_, Mount(), stderrPath_, extraArgs);
    ASSERT_GT(pid_, 0) << "orlo-configfs-sim did not come up at " << Mount() << "\n" << Slurp(stderrPath_);
}

void ConfigfsSimTest::TearDown() {
    StopSim();
    SandboxTest::TearDown();
}

int ConfigfsSimTest::SimControl(const std::string &file, const std::string &text) {
    int fd = open(Cfg("/.sim/" + file).c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) return errno;
    ssize_t n = write(fd, text.data(), text.size());
    int err = n < 0 ? errno : (static_cast<size_t>(n) == text.size() ? 0 : EIO);
    close(fd);
    return err;
}

std::string ConfigfsSimTest::SimRead(const std::string &file) {
    std::ifstream in(Cfg("/.sim/" + file), std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

std::vector<std::string> ConfigfsSimTest::Modules() {
    std::vector<std::string> v;
    std::istringstream in(SimRead("modules"));
    std::string line;
    while (std::getline(in, line))
        if (!line.empty()) v.push_back(line);
    return v;
}

int ConfigfsSimTest::InsertModuleSet(int set, int version, bool rdma) {
    std::vector<std::string> names = ModuleSetNames(kTcmModules, version);
    if (set != kTcmModules)
        for (const std::string &m : ModuleSetNames(set, version, rdma)) names.push_back(m);
    std::vector<std::string> in = Modules();
    for (const std::string &m : names) {
        bool already = false;
        for (const std::string &i : in) already = already || i == m;
        if (already) continue;
        int err = SimControl("modules", "insert " + m + "\n");
        if (err != 0) return err;
    }
    return 0;
}

std::vector<SimOp> ConfigfsSimTest::Trace() {
    std::vector<SimOp> ops;
    std::istringstream in(SimRead("trace"));
    std::string line;
    while (std::getline(in, line)) {
        std::vector<std::string> f;
        size_t start = 0;
        while (true) {
            size_t tab = line.find('\t', start);
            f.push_back(line.substr(start, tab == std::string::npos ? std::string::npos : tab - start));
            if (tab == std::string::npos) break;
            start = tab + 1;
        }
        if (f.size() != 4) continue;
        ops.push_back(SimOp{f[0], f[1], Unescape(f[2]), f[3]});
    }
    return ops;
}

std::string ConfigfsSimTest::TraceDump() {
    std::string s;
    for (const SimOp &o : Trace()) s += o.op + " " + o.path + " [" + o.value + "] " + o.result + "\n";
    return s;
}

void ConfigfsSimTest::ClearTrace() { EXPECT_EQ(0, SimControl("trace", "clear\n")); }

int ConfigfsSimTest::SetFault(const std::string &op, const std::string &pattern, const std::string &err, bool once) {
    return SimControl("faults", op + " " + pattern + " " + err + (once ? " once\n" : " always\n"));
}

int ConfigfsSimTest::AddSession(const std::string &targetIqn, int tpgt, const std::string &initiator,
                                const std::string &ip, int cid) {
    return SimControl("sessions", "add " + targetIqn + " " + std::to_string(tpgt) + " " + initiator + " " + ip + " " +
                                      std::to_string(cid) + "\n");
}

int ConfigfsSimTest::DropSession(const std::string &targetIqn, int tpgt, const std::string &initiator) {
    return SimControl("sessions", "drop " + targetIqn + " " + std::to_string(tpgt) + " " + initiator + "\n");
}

int ConfigfsSimTest::SetCloneProgress(const std::string &backstore, int percent) {
    return SimControl("clone", "set " + backstore + " " + std::to_string(percent) + "\n");
}

}  // namespace orlotest
