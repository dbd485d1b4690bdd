// Process execution: programs are mapped into the sandbox and run without a shell,
// exit statuses come back from the right child, and a no-wait child leaves no zombie.
#include <dirent.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "olibc.h"
#include "support/sandbox.h"

namespace {

class ExecTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        // Programs that exist only inside the sandbox, so a run proves the mapping.
        WriteFile("/bin/orlo-args",
                  "#!/bin/sh\nout=\"$1\"; shift\nfor a in \"$@\"; do printf '%s\\n' \"$a\"; done > \"$out\"\n", 0755);
        WriteFile("/bin/orlo-exit", "#!/bin/sh\nexit \"$1\"\n", 0755);
        WriteFile("/bin/orlo-print", "#!/bin/sh\nprintf 'line %s\\n' \"$@\"\nexit \"$1\"\n", 0755);
        WriteFile("/bin/orlo-sink", "#!/bin/sh\ncat > \"$1\"\n", 0755);
        WriteFile("/bin/orlo-killed", "#!/bin/sh\nkill -KILL $$\n", 0755);
        WriteFile("/bin/orlo-noexec", "#!/bin/sh\nexit 0\n", 0644);
    }
};

TEST_F(ExecTest, ArgumentsReachTheProgramIntactWithoutAShell) {
    const std::string out = Real("/tmp/args.out");
    const std::string marker = Real("/tmp/injected");
    const std::string subst = "$(touch " + marker + ")";
    const char *argv[] = {"/bin/orlo-args", out.c_str(), "two words", subst.c_str(), "; exit 3 #",
                          "*", "'\"\\", "", nullptr};
    EXPECT_EQ(0, OLIBCExecv(argv));
    EXPECT_EQ("two words\n" + subst + "\n; exit 3 #\n*\n'\"\\\n\n", ReadFile("/tmp/args.out"));
    EXPECT_FALSE(Exists("/tmp/injected"));

    // OLIBCExec ends the argument list at its first NULL.
    EXPECT_EQ(0, OLIBCExec("/bin/orlo-args", out.c_str(), "a b", nullptr, "never"));
    EXPECT_EQ("a b\n", ReadFile("/tmp/args.out"));
}

TEST_F(ExecTest, ExitStatusesAndProgramsThatCannotRun) {
    EXPECT_EQ(0, OLIBCExec("/bin/orlo-exit", "0", nullptr, nullptr, nullptr));
    EXPECT_EQ(7, OLIBCExec("/bin/orlo-exit", "7", nullptr, nullptr, nullptr));
    EXPECT_EQ(OLIBC_ERR_EXEC, OLIBCErrGet());
    EXPECT_EQ(255, OLIBCExec("/bin/orlo-exit", "255", nullptr, nullptr, nullptr));

    OLIBCErrSetEx(0, "", 0);
    EXPECT_LT(OLIBCExec("/bin/orlo-killed", nullptr, nullptr, nullptr, nullptr), 0);
    EXPECT_EQ(OLIBC_ERR_EXEC, OLIBCErrGet());

    // The real /bin/true exists, but the sandbox has none: mapping holds for programs.
    OLIBCErrSetEx(0, "", 0);
    EXPECT_EQ(-1, OLIBCExec("/bin/true", nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(OLIBC_ERR_EXEC, OLIBCErrGet());

    OLIBCErrSetEx(0, "", 0);
    EXPECT_EQ(-1, OLIBCExec("/bin/orlo-noexec", nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(OLIBC_ERR_EXEC, OLIBCErrGet());

    EXPECT_EQ(-1, OLIBCExecv(nullptr));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    const char *empty[] = {nullptr};
    EXPECT_EQ(-1, OLIBCExecv(empty));
}

std::string ReadAll(FILE *f) {
    std::string s;
    char buf[256];
    size_t n;
    while ((n = fread(buf, 1, sizeof(buf), f)) > 0) s.append(buf, n);
    return s;
}

TEST_F(ExecTest, PopenReadsOutputAndPcloseWaitsForItsOwnChild) {
    FILE *a = OLIBCPopen("/bin/orlo-print", "r", "3", "x y", nullptr);
    ASSERT_NE(nullptr, a);
    const char *argv[] = {"/bin/orlo-print", "5", nullptr};
    FILE *b = OLIBCPopenv(argv, "r");
    ASSERT_NE(nullptr, b);
    EXPECT_EQ("line 5\n", ReadAll(b));
    EXPECT_EQ("line 3\nline x y\n", ReadAll(a));
    // Closed in the other order: each close reports its own child's status.
    EXPECT_EQ(5, OLIBCPclose(b));
    EXPECT_EQ(3, OLIBCPclose(a));

    FILE *c = OLIBCPopen("/bin/orlo-exit", "r", "4", nullptr);
    ASSERT_NE(nullptr, c);
    EXPECT_EQ(4, OLIBCPclose(c));  // closed unread: still waited for

    EXPECT_EQ(nullptr, OLIBCPopen("/bin/orlo-missing", "r", nullptr));
    EXPECT_EQ(OLIBC_ERR_EXEC, OLIBCErrGet());
    EXPECT_EQ(nullptr, OLIBCPopen("/bin/orlo-print", "rw", "0", nullptr));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
}

TEST_F(ExecTest, PopenWriteFeedsStdinAndPipesDoNotLeakIntoOtherChildren) {
    const std::string one = Real("/tmp/one"), two = Real("/tmp/two");
    FILE *w1 = OLIBCPopen("/bin/orlo-sink", "w", one.c_str(), nullptr);
    ASSERT_NE(nullptr, w1);
    FILE *w2 = OLIBCPopen("/bin/orlo-sink", "w", two.c_str(), nullptr);
    ASSERT_NE(nullptr, w2);
    fputs("first stream\n", w1);
    fputs("second stream\n", w2);
    // Had the second child inherited the first pipe's write end, the first child would
    // never see end of file and this close would hang.
    EXPECT_EQ(0, OLIBCPclose(w1));
    EXPECT_EQ(0, OLIBCPclose(w2));
    EXPECT_EQ("first stream\n", ReadFile("/tmp/one"));
    EXPECT_EQ("second stream\n", ReadFile("/tmp/two"));
}

TEST_F(ExecTest, PcloseLeavesForeignStreamsAlone) {
    EXPECT_EQ(-1, OLIBCPclose(nullptr));
    WriteFile("/tmp/plain", "data");
    FILE *f = fopen(Real("/tmp/plain").c_str(), "r");
    ASSERT_NE(nullptr, f);
    EXPECT_EQ(-1, OLIBCPclose(f));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    EXPECT_EQ("data", ReadAll(f));  // still open and usable
    fclose(f);
}

TEST_F(ExecTest, ConcurrentStreamsGetTheirOwnStatus) {
    std::atomic<int> wrong{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < 6; ++t) {
        threads.emplace_back([t, &wrong] {
            for (int i = 0; i < 8; ++i) {
                std::string code = std::to_string(10 + t * 8 + i);
                FILE *f = OLIBCPopen("/bin/orlo-print", "r", code.c_str(), nullptr);
                if (f == nullptr) {
                    ++wrong;
                    continue;
                }
                std::string text = ReadAll(f);
                if (OLIBCPclose(f) != std::stoi(code) || text != "line " + code + "\n") ++wrong;
            }
        });
    }
    for (std::thread &th : threads) th.join();
    EXPECT_EQ(0, wrong.load());
}

std::atomic<int> gSigchld{0};
void CountSigchld(int) { ++gSigchld; }

// Children of this process that are zombies.
std::vector<pid_t> OurZombies() {
    std::vector<pid_t> z;
    DIR *d = opendir("/proc");
    if (d == nullptr) return z;
    while (struct dirent *e = readdir(d)) {
        if (e->d_name[0] < '0' || e->d_name[0] > '9') continue;
        std::ifstream in(std::string("/proc/") + e->d_name + "/stat");
        std::string line;
        if (!std::getline(in, line)) continue;
        size_t rp = line.rfind(')');
        if (rp == std::string::npos || rp + 4 >= line.size()) continue;
        char state = line[rp + 2];
        int ppid = std::atoi(line.c_str() + rp + 4);
        if (state == 'Z' && ppid == getpid()) z.push_back(std::atoi(e->d_name));
    }
    closedir(d);
    return z;
}

TEST_F(ExecTest, ForkChildNoWaitLeavesNoZombieAndKeepsSigchldHandling) {
    struct sigaction sa, old;
    memset(&sa, 0, sizeof(sa));
    sa.sa_handler = CountSigchld;
    sigemptyset(&sa.sa_mask);
    ASSERT_EQ(0, sigaction(SIGCHLD, &sa, &old));

    int fds[2];
    ASSERT_EQ(0, pipe(fds));
    pid_t pid = OLIBCProcForkChildNoWait();
    if (pid == 0) {
        pid_t self = getpid();
        ssize_t w = write(fds[1], &self, sizeof(self));
        _exit(w == sizeof(self) ? 0 : 1);
    }
    close(fds[1]);
    ASSERT_GT(pid, 0);
    pid_t reported = 0;
    ssize_t got;
    do {
        got = read(fds[0], &reported, sizeof(reported));
    } while (got < 0 && errno == EINTR);
    ASSERT_EQ(static_cast<ssize_t>(sizeof(reported)), got);
    close(fds[0]);
    EXPECT_EQ(pid, reported);  // the pid returned is the child that runs

    // Not ours to wait for, and nothing of ours is left a zombie.
    errno = 0;
    EXPECT_EQ(-1, waitpid(pid, nullptr, WNOHANG));
    EXPECT_EQ(ECHILD, errno);
    EXPECT_TRUE(OurZombies().empty());

    struct sigaction now;
    ASSERT_EQ(0, sigaction(SIGCHLD, nullptr, &now));
    EXPECT_EQ(reinterpret_cast<void *>(CountSigchld), reinterpret_cast<void *>(now.sa_handler));

    // A caller that ignores SIGCHLD gets a child all the same.
    signal(SIGCHLD, SIG_IGN);
    pid_t pid2 = OLIBCProcForkChildNoWait();
    if (pid2 == 0) _exit(0);
    EXPECT_GT(pid2, 0);
    ASSERT_EQ(0, sigaction(SIGCHLD, &old, nullptr));
    EXPECT_TRUE(OurZombies().empty());
}

}  // namespace
