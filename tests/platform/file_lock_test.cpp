// Lock files and their scope guard: shared holders coexist, exclusive ones exclude
// every other handle (in this process or another), a timed request really waits (and
// gives up on time), a dead holder frees the lock, and links are never followed.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cerrno>
#include <climits>
#include <fnmatch.h>
#include <string>

#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "support/sandbox.h"

namespace {

using Clock = std::chrono::steady_clock;

double SecondsSince(Clock::time_point t) { return std::chrono::duration<double>(Clock::now() - t).count(); }

class FileLockTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        ASSERT_EQ(0, mkdir(Real("/tmp/iscsi").c_str(), 0700));
    }
    const char *kLock = "/tmp/iscsi/iscsi_lun.conf.lock";

    // Forks a child that takes the lock, reports through a pipe, then sleeps holdMs
    // (or until killed when holdMs < 0) and exits.
    pid_t HoldInChild(int exclusive, int holdMs) {
        int fds[2];
        if (pipe(fds) != 0) return -1;
        pid_t pid = fork();
        if (pid == 0) {
            close(fds[0]);
            int h = -1;
            char ok = OLIBCFileLockTimeByFile(kLock, exclusive, 0, &h) ? '1' : '0';
            if (write(fds[1], &ok, 1) != 1) _exit(2);
            if (holdMs < 0)
                for (;;) pause();
            usleep(static_cast<useconds_t>(holdMs) * 1000);
            _exit(0);
        }
        close(fds[1]);
        char ok = '0';
        EXPECT_EQ(1, read(fds[0], &ok, 1));
        close(fds[0]);
        EXPECT_EQ('1', ok);
        return pid;
    }
    static void Reap(pid_t pid) {
        int status;
        waitpid(pid, &status, 0);
    }
};

TEST_F(FileLockTest, SharedHoldersCoexistAndExclusiveExcludesEveryHandle) {
    int a = -1, b = -1, c = 7;
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kLock, 0, 0, &a));
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kLock, 0, 0, &b));
    EXPECT_NE(a, b);
    struct stat st;
    ASSERT_EQ(0, stat(Real(kLock).c_str(), &st));
    EXPECT_EQ(0600u, st.st_mode & 07777);
    EXPECT_TRUE(fcntl(a, F_GETFD) & FD_CLOEXEC);

    // Shared holders keep an exclusive request of this very process out.
    auto t0 = Clock::now();
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 1, 0, &c));
    EXPECT_EQ(-1, c);
    EXPECT_LT(SecondsSince(t0), 0.1);  // 0 tries once
    EXPECT_EQ(0, OLIBCFileUnlockByFile(a));
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 1, 0, &c));
    EXPECT_EQ(0, OLIBCFileUnlockByFile(b));
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kLock, 1, 0, &c));

    // An exclusive holder keeps out shared requests, here and in another process.
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 0, 0, &a));
    pid_t pid = fork();
    if (pid == 0) {
        int h = -1;
        _exit(OLIBCFileLockTimeByFile(kLock, 0, 0, &h) ? 1 : 0);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    EXPECT_EQ(0, WEXITSTATUS(status));
    EXPECT_EQ(0, OLIBCFileUnlockByFile(c));
    EXPECT_EQ(-1, OLIBCFileUnlockByFile(c));  // already closed
    EXPECT_EQ(-1, OLIBCFileUnlockByFile(-1));
}

TEST_F(FileLockTest, ExclusiveRequestWaitsOutItsTimeout) {
    int holder = -1, waiter = 5;
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kLock, 0, 0, &holder));
    auto t0 = Clock::now();
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 1, 1, &waiter));
    double waited = SecondsSince(t0);
    EXPECT_GE(waited, 1.0);
    EXPECT_LT(waited, 1.5);
    EXPECT_EQ(-1, waiter);
    EXPECT_EQ(OLIBC_ERR_CONF, OLIBCErrGet());
    OLIBCFileUnlockByFile(holder);
}

TEST_F(FileLockTest, WaitersGetTheLockWhenItIsReleased) {
    // A holder that lets go after 300 ms: a timed and an endless request both get it then.
    for (int timeout : {5, -1}) {
        SCOPED_TRACE(timeout);
        pid_t pid = HoldInChild(1, 300);
        int h = -1;
        auto t0 = Clock::now();
        EXPECT_EQ(1, OLIBCFileLockTimeByFile(kLock, 1, timeout, &h));
        double waited = SecondsSince(t0);
        EXPECT_GE(waited, 0.2);
        EXPECT_LT(waited, 2.0);
        EXPECT_EQ(0, OLIBCFileUnlockByFile(h));
        Reap(pid);
    }
}

TEST_F(FileLockTest, LockOfAKilledHolderIsFreeAgain) {
    pid_t pid = HoldInChild(1, -1);
    int h = -1;
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 0, 0, &h));
    kill(pid, SIGKILL);
    Reap(pid);
    EXPECT_EQ(1, OLIBCFileLockTimeByFile(kLock, 1, 0, &h));
    OLIBCFileUnlockByFile(h);
}

TEST_F(FileLockTest, RefusesLinksOtherFilesAndBadArguments) {
    WriteFile("/tmp/victim", "data", 0644);
    ASSERT_EQ(0, symlink(Real("/tmp/victim").c_str(), Real(kLock).c_str()));
    int h = 3;
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 1, 0, &h));
    EXPECT_EQ(-1, h);
    EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    // A dangling link must not make the lock file appear at its target either.
    ASSERT_EQ(0, symlink(Real("/tmp/absent").c_str(), Real("/tmp/iscsi/dangling.lock").c_str()));
    EXPECT_EQ(0, OLIBCFileLockTimeByFile("/tmp/iscsi/dangling.lock", 1, 0, &h));
    EXPECT_FALSE(Exists("/tmp/absent"));
    struct stat st;
    ASSERT_EQ(0, stat(Real("/tmp/victim").c_str(), &st));
    EXPECT_EQ(0644u, st.st_mode & 07777);
    EXPECT_EQ("data", ReadFile("/tmp/victim"));

    EXPECT_EQ(0, OLIBCFileLockTimeByFile("/tmp/iscsi", 1, 0, &h));
    EXPECT_EQ(OLIBC_ERR_FOPEN, OLIBCErrGet());
    EXPECT_EQ(0, OLIBCFileLockTimeByFile("/tmp/nodir/x.lock", 1, 0, &h));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
    EXPECT_EQ(0, OLIBCFileLockTimeByFile("/tmp/iscsi/x.lock", 1, -2, &h));
    EXPECT_EQ(0, OLIBCFileLockTimeByFile(nullptr, 1, 0, &h));
    EXPECT_EQ(0, OLIBCFileLockTimeByFile("/tmp/iscsi/x.lock", 1, 0, nullptr));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
}

// The descriptor that holds path open in this process, or -1.
int FindFdOf(const std::string &real) {
    for (int fd = 3; fd < 1024; ++fd) {
        char link[PATH_MAX];
        std::string proc = "/proc/self/fd/" + std::to_string(fd);
        ssize_t n = readlink(proc.c_str(), link, sizeof(link) - 1);
        if (n > 0 && std::string(link, static_cast<size_t>(n)) == real) return fd;
    }
    return -1;
}

TEST_F(FileLockTest, GuardHoldsForItsScopeAndLogsAFailedRelease) {
    int h = -1;
    {
        orlo::FileLockGuard guard(kLock, true, 0);
        ASSERT_TRUE(guard.held());
        EXPECT_EQ(0, OLIBCFileLockTimeByFile(kLock, 0, 0, &h));
        orlo::FileLockGuard second(kLock, false, 0);
        EXPECT_FALSE(second.held());
        orlo::FileLockGuard none(nullptr, false, 0);
        EXPECT_FALSE(none.held());
    }
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();  // taking failures are the caller's to log
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kLock, 1, 0, &h));
    OLIBCFileUnlockByFile(h);

    {
        orlo::FileLockGuard guard(kLock, true, 0);
        ASSERT_TRUE(guard.held());
        int fd = FindFdOf(Real(kLock));
        ASSERT_GE(fd, 0);
        close(fd);  // someone closed the handle behind the guard's back
        errno = EPERM;
    }
    EXPECT_EQ(EPERM, errno);  // releasing does not disturb what the caller reports
    auto lines = log_.Lines();
    ASSERT_EQ(1u, lines.size()) << log_.Dump();
    EXPECT_EQ(0, fnmatch("iSCSI:file_lock_guard.cpp:*:~FileLockGuard "
                         "Failed to unlock file: '/tmp/iscsi/iscsi_lun.conf.lock'",
                         lines[0].c_str(), 0))
        << lines[0];
}

}  // namespace
