// The mount itself: what the kernel may cache and when it must forget it, inode numbers
// and listings, control writes racing directory requests, files still open when the
// simulator stops, how the fixture judges the way a simulator ended, and the request
// loop's move to its caller's CPU.
#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest-spi.h>
#include <pthread.h>
#include <sched.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <map>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "support/configfs_sim_fixture.h"
#if ORLO_HAVE_SIM_LOOP
#include "configfs_sim_loop.h"
#endif

namespace orlotest {
namespace {

const char kTpg[] = "/target/iscsi/iqn.2000-01.com.orlo:mount/tpgt_1";

class SimMount : public ConfigfsSimTest {
  protected:
    // lstat's errno (0 when it exists), and the inode number when it does.
    int Look(const std::string &p, ino_t *ino = nullptr) {
        struct stat st;
        if (lstat(Cfg(p).c_str(), &st) != 0) return errno;
        if (ino != nullptr) *ino = st.st_ino;
        return 0;
    }
    int Put(const std::string &p, const std::string &value) {
        int fd = open(Cfg(p).c_str(), O_WRONLY | O_TRUNC);
        if (fd < 0) return errno;
        ssize_t n = write(fd, value.data(), value.size());
        int err = n < 0 ? errno : 0;
        close(fd);
        return err;
    }
    // Name -> (d_ino, d_type) of a directory listing, without . and ..
    std::map<std::string, std::pair<ino_t, unsigned char>> List(const std::string &p) {
        std::map<std::string, std::pair<ino_t, unsigned char>> out;
        DIR *d = opendir(Cfg(p).c_str());
        if (d == nullptr) return out;
        while (struct dirent *e = readdir(d))
            if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0)
                out[e->d_name] = std::make_pair(e->d_ino, e->d_type);
        closedir(d);
        return out;
    }
    // Runs StopSim and returns the failures it reported instead of failing this test.
    std::vector<std::string> StopSimFailures() {
        ::testing::TestPartResultArray results;
        {
            ::testing::ScopedFakeTestPartResultReporter reporter(
                ::testing::ScopedFakeTestPartResultReporter::INTERCEPT_ONLY_CURRENT_THREAD, &results);
            StopSim();
        }
        std::vector<std::string> failures;
        for (int i = 0; i < results.size(); ++i) failures.push_back(results.GetTestPartResult(i).message());
        return failures;
    }
};

// With entries cached for an hour, whatever a module removal takes away is gone at
// once, what comes back is found anew, and a failed lookup is never remembered.
TEST_F(SimMount, CachedEntriesFollowTheTreeAsModulesComeAndGo) {
    RestartSim({"--entry-timeout", "3600"});
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    ino_t before = 0, after = 0;
    ASSERT_EQ(0, Look("/target/core/fileio_0", &before));
    EXPECT_EQ(ENOENT, Look("/target/core/fileio_0/LUN_a"));
    ASSERT_EQ(0, mkdir(Cfg("/target/core/fileio_0/LUN_a").c_str(), 0700));
    EXPECT_EQ(0, Look("/target/core/fileio_0/LUN_a/attrib/lun_name"));
    ASSERT_EQ(0, rmdir(Cfg("/target/core/fileio_0/LUN_a").c_str()));
    EXPECT_EQ(ENOENT, Look("/target/core/fileio_0/LUN_a"));
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
    ASSERT_EQ(0, Look("/target/iscsi"));

    ASSERT_EQ(0, SimControl("modules", "remove iscsi_target_mod\n"));
    EXPECT_EQ(ENOENT, Look("/target/iscsi"));
    const std::vector<std::string> core = ModuleSetNames(kTcmModules, 4);
    for (auto it = core.rbegin(); it != core.rend(); ++it) ASSERT_EQ(0, SimControl("modules", "remove " + *it + "\n"));
    EXPECT_EQ(ENOENT, Look("/target/core/fileio_0"));
    EXPECT_EQ(ENOENT, Look("/target"));
    EXPECT_EQ(ENOENT, Look("/pool"));

    // Back again: new directories under the old names, and they take children.
    ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    ASSERT_EQ(0, Look("/target/core/fileio_0", &after));
    EXPECT_NE(before, after) << "the kernel still answers with the removed directory";
    EXPECT_EQ(0, mkdir(Cfg("/target/core/fileio_0/LUN_b").c_str(), 0700)) << strerror(errno);
    EXPECT_EQ(0, Put("/target/core/fileio_0/LUN_b/attrib/lun_name", "again"));
}

TEST_F(SimMount, ListingsCarryTheInodeNumbersAndTypesThatStatShows) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    WriteFile("/volume1/lun.img", "");
    const std::string b = "/target/core/fileio_0/LUN_a";
    ASSERT_EQ(0, mkdir(Cfg(b).c_str(), 0700));
    ASSERT_EQ(0, Put(b + "/control", "fd_dev_name=/volume1/lun.img,fd_dev_size=1048576"));
    ASSERT_EQ(0, Put(b + "/enable", "1"));
    for (const char *d : {"/target/iscsi", "/target/iscsi/iqn.2000-01.com.orlo:mount", kTpg})
        ASSERT_EQ(0, mkdir(Cfg(d).c_str(), 0700)) << d;
    const std::string lun = std::string(kTpg) + "/lun/lun_0";
    ASSERT_EQ(0, mkdir(Cfg(lun).c_str(), 0700));
    ASSERT_EQ(0, symlink(Cfg(b).c_str(), Cfg(lun + "/LUN_a").c_str()));

    std::set<ino_t> seen;
    for (const std::string &dir : {std::string(kTpg), lun, b, std::string("/.sim")}) {
        auto listing = List(dir);
        ASSERT_FALSE(listing.empty()) << dir;
        for (auto &e : listing) {
            SCOPED_TRACE(dir + "/" + e.first);
            struct stat st;
            ASSERT_EQ(0, lstat(Cfg(dir + "/" + e.first).c_str(), &st));
            EXPECT_EQ(st.st_ino, e.second.first);
            unsigned char type = S_ISDIR(st.st_mode) ? DT_DIR : S_ISLNK(st.st_mode) ? DT_LNK : DT_REG;
            EXPECT_EQ(type, e.second.second);
            EXPECT_TRUE(seen.insert(st.st_ino).second) << "inode number used twice";
        }
    }
    EXPECT_EQ(DT_LNK, List(lun)["LUN_a"].second);
    EXPECT_EQ(DT_DIR, List(kTpg)["attrib"].second);
    EXPECT_EQ(DT_REG, List(kTpg)["enable"].second);
    EXPECT_EQ(5u, List("/.sim").size());
    EXPECT_EQ(0u, List("/").count(".sim")) << "the control directory stays out of the listing";
}

// A module removal invalidates the kernel's entries, which waits for the directory
// locks that callers hold while they wait for the mount to answer them.
TEST_F(SimMount, ModuleRemovalsRacingDirectoryRequestsDoNotStallTheMount) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    // Should the mount stall, the watchdog fails the test and aborts the connection,
    // which lets every waiting request go.
    std::atomic<bool> stop(false), finished(false);
    const std::string mount = Mount();
    std::thread watchdog([&] {
        for (int waited = 0; waited < 30000; waited += 10) {
            if (finished) return;
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        ADD_FAILURE() << "module removals and directory requests stalled the mount";
        AbortConnection(mount);
    });
    std::thread prober([&] {
        while (!stop) {
            struct stat st;
            lstat(Cfg("/target/iscsi/x").c_str(), &st);
            mkdir(Cfg("/target/iscsi").c_str(), 0700);
            rmdir(Cfg("/target/iscsi/y").c_str());
        }
    });
    int failures = 0;
    for (int i = 0; i < 100; ++i) {
        failures += SimControl("modules", "remove iscsi_target_mod\n") != 0;
        failures += SimControl("modules", "insert iscsi_target_mod\n") != 0;
    }
    stop = true;
    prober.join();
    finished = true;
    watchdog.join();
    EXPECT_EQ(0, failures);
    std::vector<std::string> modules = Modules();
    EXPECT_TRUE(!modules.empty() && modules.back() == "iscsi_target_mod");
}

// The kernel never releases what is open when the mount goes away; the simulator frees
// it on its way out.  Built with the sanitizers, a leak would fail this test.
TEST_F(SimMount, FilesOpenWhenTheSimulatorStopsAreFreed) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    for (const char *d : {"/target/iscsi", "/target/iscsi/iqn.2000-01.com.orlo:mount", kTpg})
        ASSERT_EQ(0, mkdir(Cfg(d).c_str(), 0700)) << d;
    std::vector<int> fds;
    fds.push_back(open(Cfg(std::string(kTpg) + "/param/TargetAlias").c_str(), O_RDONLY));
    fds.push_back(open(Cfg(std::string(kTpg) + "/enable").c_str(), O_WRONLY));
    fds.push_back(open(Cfg("/.sim/trace").c_str(), O_RDWR));
    fds.push_back(open(Cfg(kTpg).c_str(), O_RDONLY | O_DIRECTORY));
    for (int fd : fds) ASSERT_GE(fd, 0);
    char buf[64];
    EXPECT_GT(read(fds[0], buf, sizeof(buf)), 0);
    EXPECT_GT(read(fds[2], buf, sizeof(buf)), 0);
    // And files closed just before the end, whose releases are still on their way.
    for (int i = 0; i < 20; ++i) close(open(Cfg(std::string(kTpg) + "/max_session").c_str(), O_RDONLY));
    std::vector<std::string> failures = StopSimFailures();
    EXPECT_TRUE(failures.empty()) << failures.front();
    for (int fd : fds) close(fd);
}

TEST_F(SimMount, TheFixtureFailsATestWhoseSimulatorEndsBadly) {
    // Ended by a signal other than the test's own SIGKILL.
    ASSERT_EQ(0, kill(sim_pid(), SIGUSR1));
    std::vector<std::string> failures = StopSimFailures();
    ASSERT_EQ(1u, failures.size());
    EXPECT_NE(std::string::npos, failures[0].find("was ended by signal " + std::to_string(SIGUSR1))) << failures[0];

    const std::string leak =
        "=================================================================\n"
        "==4242==ERROR: LeakSanitizer: detected memory leaks\n\n"
        "Direct leak of 303 byte(s) in 1 object(s) allocated from:\n";
    const std::string ubsan = "sim/configfs_tree.cpp:10:5: runtime error: signed integer overflow\n";
    EXPECT_EQ("", EndProblem(W_EXITCODE(0, 0), true, ""));
    EXPECT_EQ("", EndProblem(W_EXITCODE(0, 0), true, "fuse: some harmless notice\n"));
    EXPECT_EQ("", EndProblem(W_EXITCODE(0, SIGKILL), false, "")) << "killed by the test before it was stopped";
    std::string p = EndProblem(W_EXITCODE(23, 0), true, leak);
    EXPECT_NE(std::string::npos, p.find("exited with status 23")) << p;
    EXPECT_NE(std::string::npos, p.find("LeakSanitizer")) << p;
    EXPECT_NE(std::string::npos, p.find("Direct leak of 303 byte(s)")) << "the report itself is shown";
    EXPECT_NE("", EndProblem(W_EXITCODE(0, 0), true, leak)) << "a leak report fails even with status 0";
    EXPECT_NE("", EndProblem(W_EXITCODE(0, 0), false, ubsan));
    EXPECT_NE("", EndProblem(W_EXITCODE(0, SIGKILL), true, "")) << "it did not stop when told to";
    EXPECT_NE("", EndProblem(W_EXITCODE(0, SIGSEGV), false, ""));
    EXPECT_NE("", EndProblem(W_EXITCODE(1, 0), false, ""));
}

#if ORLO_HAVE_SIM_LOOP

pid_t Tid() { return static_cast<pid_t>(syscall(SYS_gettid)); }

bool PinTo(int cpu) {
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(cpu, &one);
    return sched_setaffinity(0, sizeof(one), &one) == 0;
}

// Fields are counted past the command name, which may hold spaces and parentheses.
TEST(SimRequestLoop, FindsTheCpuOfAThreadWhateverItsName) {
    cpu_set_t all;
    ASSERT_EQ(0, sched_getaffinity(0, sizeof(all), &all));
    std::thread t([&all] {
        prctl(PR_SET_NAME, "a) b ( c) d");
        for (int cpu = 0; cpu < CPU_SETSIZE; ++cpu) {
            if (!CPU_ISSET(cpu, &all) || !PinTo(cpu)) continue;
            EXPECT_EQ(cpu, orlosim::RequestLoop::CpuOf(Tid())) << "pinned to " << cpu;
        }
    });
    t.join();
    EXPECT_EQ(-1, orlosim::RequestLoop::CpuOf(0));
    EXPECT_EQ(-1, orlosim::RequestLoop::CpuOf(-5));
}

// A caller that is the only one for a while draws the reading thread to its CPU; the
// thread keeps the process's CPU set, so the scheduler may move it again.
TEST(SimRequestLoop, TheReadingThreadMovesToItsOnlyCallersCpu) {
    cpu_set_t all;
    ASSERT_EQ(0, sched_getaffinity(0, sizeof(all), &all));
    std::vector<int> cpus;
    for (int cpu = 0; cpu < CPU_SETSIZE; ++cpu)
        if (CPU_ISSET(cpu, &all)) cpus.push_back(cpu);
    if (cpus.size() < 2) GTEST_SKIP() << "needs two CPUs";

    for (int target : {cpus[0], cpus[1], cpus[0]}) {
        SCOPED_TRACE("caller on CPU " + std::to_string(target));
        std::atomic<pid_t> callerTid(0);
        std::atomic<bool> stop(false);
        std::thread caller([&] {
            PinTo(target);
            callerTid = Tid();
            while (!stop) std::this_thread::sleep_for(std::chrono::milliseconds(1));
        });
        while (callerTid == 0) std::this_thread::yield();
        bool moved = false;
        std::thread reader([&] {
            orlosim::RequestLoop loop(nullptr, 1, true);
            auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(200);
            while (!moved && std::chrono::steady_clock::now() < end) {
                loop.Served(callerTid);
                moved = sched_getcpu() == target;
            }
            cpu_set_t now;
            ASSERT_EQ(0, sched_getaffinity(0, sizeof(now), &now));
            EXPECT_TRUE(CPU_EQUAL(&now, &all)) << "the thread was left pinned";
        });
        reader.join();
        stop = true;
        caller.join();
        EXPECT_TRUE(moved);
    }
}

TEST(SimRequestLoop, DeferredWorkRunsOnHelpersAndFinishesBeforeTheLoopEnds) {
    std::atomic<int> ran(0);
    std::atomic<bool> elsewhere(true);
    const std::thread::id self = std::this_thread::get_id();
    {
        orlosim::RequestLoop loop(nullptr, 2, false);
        for (int i = 0; i < 100; ++i)
            loop.Defer([&] {
                std::this_thread::sleep_for(std::chrono::microseconds(100));
                if (std::this_thread::get_id() == self) elsewhere = false;
                ++ran;
            });
    }
    EXPECT_EQ(100, ran.load());
    EXPECT_TRUE(elsewhere.load());
}

#endif

}  // namespace
}  // namespace orlotest
