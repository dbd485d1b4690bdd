// Engines for tests: orlocommd started in a sandbox root, in a private network namespace of
// the test process (so that every test has port 3262 to itself), its log lines (it runs with
// --foreground --verbose) kept in <root>/engine.log.  Needs root; skips otherwise.
#ifndef ORLO_TESTS_COMM_ENGINE_FIXTURE_H
#define ORLO_TESTS_COMM_ENGINE_FIXTURE_H

#include <arpa/inet.h>
#include <fcntl.h>
#include <net/if.h>
#include <netinet/in.h>
#include <sched.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>

#include "comm/orlocomm_internal.h"
#include "orlocomm.h"
#include "support/sandbox.h"

namespace commtest {

inline bool LoopbackUp() {
    int s = socket(AF_INET, SOCK_DGRAM, 0);
    if (s < 0) return false;
    struct ifreq ifr;
    memset(&ifr, 0, sizeof(ifr));
    strcpy(ifr.ifr_name, "lo");
    bool ok = ioctl(s, SIOCGIFFLAGS, &ifr) == 0;
    ifr.ifr_flags |= IFF_UP | IFF_RUNNING;
    ok = ok && ioctl(s, SIOCSIFFLAGS, &ifr) == 0;
    close(s);
    return ok;
}

// Starts argv with stdout and stderr going to logPath (appended).  The pid, or -1.
inline pid_t SpawnLogged(const std::vector<std::string> &argv, const std::string &logPath) {
    pid_t pid = fork();
    if (pid == 0) {
        int fd = open(logPath.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        if (fd >= 0) {
            dup2(fd, 1);
            dup2(fd, 2);
            close(fd);
        }
        std::vector<char *> args;
        for (const std::string &a : argv) args.push_back(const_cast<char *>(a.c_str()));
        args.push_back(nullptr);
        execv(args[0], args.data());
        _exit(127);
    }
    return pid;
}

// Waits up to ms for pid to end: its exit status (0..255), 128+signal, or -1 if it runs on.
inline int WaitExit(pid_t pid, int ms) {
    for (int waited = 0;; waited += 20) {
        int status = 0;
        pid_t r = waitpid(pid, &status, WNOHANG);
        if (r == pid) return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        if (r < 0 || waited >= ms) return -1;
        usleep(20000);
    }
}

inline long RssKb(pid_t pid) {
    std::ifstream f("/proc/" + std::to_string(pid) + "/status");
    std::string line;
    while (std::getline(f, line))
        if (line.rfind("VmRSS:", 0) == 0) return std::stol(line.substr(6));
    return -1;
}

inline std::string Slurp(const std::string &path) {
    std::ifstream f(path);
    std::stringstream ss;
    ss << f.rdbuf();
    return ss.str();
}

class CommEngineTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        if (geteuid() != 0) GTEST_SKIP() << "needs root: every engine gets a network namespace of its own";
        ASSERT_EQ(unshare(CLONE_NEWNET), 0) << strerror(errno);
        ASSERT_TRUE(LoopbackUp());
        orlotest::SandboxTest::SetUp();
        orlocomm::gControlWaitMs.store(orlocomm::kControlWaitMs);
        StartEngine();
    }

    void TearDown() override {
        if (engine_ > 0) {
            int status = StopEngine();
            EXPECT_EQ(status, 0) << "the engine did not stop cleanly\n" << EngineLog();
        }
        if (!root_.empty()) orlotest::SandboxTest::TearDown();
    }

    void StartEngine() {
        std::string log = root_ + "/engine.log";
        engine_ = SpawnLogged({orlotest::BuiltProgram("orlocommd"), "--root", root_, "--foreground", "--verbose"}, log);
        ASSERT_GT(engine_, 0);
        for (int i = 0; i < 500; ++i) {
            if (Slurp(log).find("orlocommd: serving") != std::string::npos) return;
            ASSERT_EQ(waitpid(engine_, nullptr, WNOHANG), 0) << "the engine ended early\n" << Slurp(log);
            usleep(20000);
        }
        FAIL() << "the engine did not start\n" << Slurp(log);
    }

    // SIGTERM, then its exit status (or 137 after a SIGKILL when it would not stop).
    int StopEngine() {
        if (engine_ <= 0) return -1;
        kill(engine_, SIGTERM);
        int status = WaitExit(engine_, 20000);
        if (status < 0) {
            kill(engine_, SIGKILL);
            status = WaitExit(engine_, 5000);
            ADD_FAILURE() << "the engine ignored SIGTERM";
        }
        engine_ = -1;
        return status;
    }

    std::string EngineLog() const { return Slurp(root_ + "/engine.log"); }
    bool EngineLogged(const std::string &text) const { return EngineLog().find(text) != std::string::npos; }
    // Waits up to ms for the engine to log text.
    bool AwaitEngineLog(const std::string &text, int ms) const {
        for (int waited = 0; waited <= ms; waited += 20) {
            if (EngineLogged(text)) return true;
            usleep(20000);
        }
        return false;
    }
    int CountValue() const {
        std::string s = ReadFile(ORLOCOMM_COUNT_FILE);
        size_t eq = s.find('=');
        return eq == std::string::npos ? -100 : std::stoi(s.substr(eq + 1));
    }

    pid_t engine_ = -1;
};

}  // namespace commtest

#endif
