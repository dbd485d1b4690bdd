// Crash and misuse: a killed simulator, a dying test process, concurrent writers.
#include <fcntl.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <string>
#include <thread>

#include "support/configfs_sim_fixture.h"

namespace orlotest {
namespace {

using SimCrash = ConfigfsSimTest;

bool WaitUnmounted(const std::string &path, int timeoutMs) {
    for (int waited = 0; waited < timeoutMs; waited += 10) {
        if (!ConfigfsSimTest::MountedAt(path)) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return false;
}

TEST_F(SimCrash, KilledSimulatorLeavesADeadMountThatTheFixtureDetaches) {
    ASSERT_TRUE(MountedAt(Mount()));
    ASSERT_EQ(0, kill(sim_pid(), SIGKILL));
    // Requests to a mount whose server died fail with ENOTCONN.
    int err = 0;
    for (int i = 0; i < 500 && err != ENOTCONN; ++i) {
        int fd = open(Cfg("/.sim/modules").c_str(), O_RDONLY);
        err = fd < 0 ? errno : 0;
        if (fd >= 0) close(fd);
        if (err != ENOTCONN) std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    EXPECT_EQ(ENOTCONN, err);
    EXPECT_TRUE(MountedAt(Mount())) << "the dead mount stays until someone detaches it";
    struct stat st;
    StopSim();
    EXPECT_FALSE(MountedAt(Mount()));
    EXPECT_EQ(0, stat(Mount().c_str(), &st)) << "the mount point is an empty directory again";
}

TEST_F(SimCrash, SimulatorUnmountsItselfWhenItsTestProcessDies) {
    StopSim();  // this test starts its own, from a process that then crashes
    std::string mount = Real("/config2");
    ASSERT_EQ(0, mkdir(mount.c_str(), 0755));
    int ready[2];
    ASSERT_EQ(0, pipe(ready));
    pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        close(ready[0]);
        pid_t sim = LaunchSim(root(), mount);
        char ok = sim > 0 ? 1 : 0;
        if (write(ready[1], &ok, 1) != 1) _exit(2);
        abort();  // dies without any clean-up of its own
    }
    close(ready[1]);
    char ok = 0;
    ASSERT_EQ(1, read(ready[0], &ok, 1));
    close(ready[0]);
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_TRUE(WIFSIGNALED(status));
    ASSERT_EQ(1, ok) << "the simulator did not come up";
    EXPECT_TRUE(WaitUnmounted(mount, 5000)) << "stale mount at " << mount;
    if (MountedAt(mount)) umount2(mount.c_str(), MNT_DETACH);
}

TEST_F(SimCrash, ConcurrentWritersNeverCorruptAnAttribute) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    std::string tpg = Cfg("/target/iscsi/iqn.2000-01.com.orlo:race");
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
    ASSERT_EQ(0, mkdir(tpg.c_str(), 0700));
    tpg += "/tpgt_1";
    ASSERT_EQ(0, mkdir(tpg.c_str(), 0700));
    const std::string alias = tpg + "/param/TargetAlias";
    const std::string a(200, 'a'), b(250, 'b');
    const int kWrites = 1500;
    pid_t writers[2];
    for (int w = 0; w < 2; ++w) {
        writers[w] = fork();
        ASSERT_GE(writers[w], 0);
        if (writers[w] == 0) {
            const std::string &v = w == 0 ? a : b;
            for (int i = 0; i < kWrites; ++i) {
                int fd = open(alias.c_str(), O_WRONLY | O_TRUNC);
                if (fd < 0 || write(fd, v.data(), v.size()) != static_cast<ssize_t>(v.size())) _exit(1);
                close(fd);
            }
            _exit(0);
        }
    }
    int bad = 0, reads = 0;
    for (bool running = true; running;) {
        int fd = open(alias.c_str(), O_RDONLY);
        ASSERT_GE(fd, 0);
        char buf[1024];
        ssize_t n = read(fd, buf, sizeof(buf));
        close(fd);
        std::string got(buf, n > 0 ? static_cast<size_t>(n) : 0);
        ++reads;
        if (got != "LIO Target\n" && got != a + "\n" && got != b + "\n") ++bad;
        running = false;
        for (pid_t p : writers) running = running || waitpid(p, nullptr, WNOHANG) == 0;
    }
    for (pid_t p : writers) waitpid(p, nullptr, 0);
    EXPECT_EQ(0, bad) << "of " << reads << " reads";
    std::string last;
    int fd = open(alias.c_str(), O_RDONLY);
    char buf[1024];
    ssize_t n = read(fd, buf, sizeof(buf));
    close(fd);
    last.assign(buf, n > 0 ? static_cast<size_t>(n) : 0);
    EXPECT_TRUE(last == a + "\n" || last == b + "\n") << last;
    size_t writes = 0;
    for (const SimOp &op : Trace())
        if (op.op == "write" && op.path.find("TargetAlias") != std::string::npos && op.result == "0") ++writes;
    EXPECT_EQ(2u * kWrites, writes) << "every write reached the model once";
}

}  // namespace
}  // namespace orlotest
