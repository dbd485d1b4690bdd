// orloiscsi on a root that holds nothing an appliance would have: no /tmp, no
// /usr/orlo/etc, no /etc.defaults.  Only the kernel's side is laid out by the test (the
// simulated target at /config, its module files and insmod stand-in) and a data volume
// is mounted at /volume1.  Every command must work, the directories the library needs
// must appear under the root with their usual modes, and nothing may appear outside it.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "support/configfs_sim_fixture.h"
#include "support/sandbox.h"

namespace {

using orlotest::BuiltProgram;
using orlotest::RunProgram;

bool PathExists(const std::string &p) {
    struct stat st;
    return lstat(p.c_str(), &st) == 0;
}

mode_t ModeOf(const std::string &p) {
    struct stat st;
    return lstat(p.c_str(), &st) == 0 ? (st.st_mode & 07777) : 0;
}

void Write(const std::string &path, const std::string &text, mode_t mode = 0644) {
    std::ofstream(path) << text;
    chmod(path.c_str(), mode);
}

// The appliance paths these commands touch.  Whichever of them the machine running the
// test does not have must still be missing afterwards.
const char *const kHostPaths[] = {"/usr/orlo",       "/tmp/iscsi",          "/tmp/tcm_service_state.lock",
                                  "/etc.defaults",   "/var/target",         "/var/crash",
                                  "/config/target",  "/volume1",            "/lib/modules/target_core_mod.ko",
                                  "/root/.orlo",     "/var/lock/subsys",    "/etc/orloinfo.conf"};

class EmptyRoot : public ::testing::Test {
  protected:
    void SetUp() override {
        if (geteuid() != 0) GTEST_SKIP() << "needs root (FUSE and a tmpfs mount)";
        if (!PathExists("/dev/fuse")) GTEST_SKIP() << "needs /dev/fuse";
        for (const char *p : kHostPaths) hostHad_[p] = PathExists(p);
        root_ = orlotest::MakeTempDir("orlo-empty-root");
        ASSERT_FALSE(root_.empty());
    }

    void TearDown() override {
        if (simPid_ > 0) {
            kill(simPid_, SIGTERM);
            for (int i = 0; i < 100 && waitpid(simPid_, nullptr, WNOHANG) == 0; ++i) usleep(20000);
            if (waitpid(simPid_, nullptr, WNOHANG) == 0) {
                kill(simPid_, SIGKILL);
                waitpid(simPid_, nullptr, 0);
            }
        }
        if (orlotest::ConfigfsSimTest::MountedAt(root_ + "/config")) umount2((root_ + "/config").c_str(), MNT_DETACH);
        if (orlotest::ConfigfsSimTest::MountedAt(root_ + "/volume1")) umount2((root_ + "/volume1").c_str(), MNT_DETACH);
        if (!root_.empty()) orlotest::RemoveTree(root_);
    }

    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = {BuiltProgram("orloiscsi"), "--root", root_};
        argv.insert(argv.end(), args.begin(), args.end());
        return RunProgram(argv, out, err);
    }

    // The kernel's side of an appliance: the simulated target at /config with the module
    // files it is given and an insmod that hands them to it.  Nothing else is made.
    void LayOutKernel() {
        ASSERT_EQ(0, mkdir((root_ + "/config").c_str(), 0755));
        simPid_ = orlotest::ConfigfsSimTest::LaunchSim(root_, root_ + "/config");
        ASSERT_GT(simPid_, 0);
        ASSERT_EQ(0, mkdir((root_ + "/sbin").c_str(), 0755));
        ASSERT_EQ(0, RunProgram({"/bin/cp", BuiltProgram("orlo-sim-insmod"), root_ + "/sbin/insmod"}));
        ASSERT_EQ(0, mkdir((root_ + "/lib").c_str(), 0755));
        ASSERT_EQ(0, mkdir((root_ + "/lib/modules").c_str(), 0755));
        for (const char *m : {"rodsp_ep", "orlo_extent_pool", "target_core_mod", "target_core_iblock", "target_core_file",
                              "target_core_ep", "iscsi_target_mod"})
            Write(root_ + "/lib/modules/" + m + ".ko", "");
    }

    std::string root_;
    pid_t simPid_ = -1;
    std::map<std::string, bool> hostHad_;
};

TEST_F(EmptyRoot, EveryCommandWorksAndMakesNothingOutsideTheRoot) {
    std::string out, err;
    // Section files first, with nothing at all under the root.
    EXPECT_EQ(0, Cli({"conf", "put", "/usr/orlo/etc/iscsi_target.conf", "iSCSI_T9", "name=alpha"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"conf", "get", "/usr/orlo/etc/iscsi_target.conf", "iSCSI_T9"}, &out, &err)) << err;
    EXPECT_EQ("name=alpha\n", out);
    EXPECT_EQ(0, Cli({"conf", "remove", "/usr/orlo/etc/iscsi_target.conf", "iSCSI_T9"}, &out, &err)) << err;
    EXPECT_EQ(01777, ModeOf(root_ + "/tmp")) << "the sandbox's /tmp is a /tmp";
    EXPECT_EQ(0700, ModeOf(root_ + "/tmp/iscsi"));
    EXPECT_EQ(0700, ModeOf(root_ + "/tmp/iscsi/lun_lock"));
    EXPECT_EQ(0755, ModeOf(root_ + "/usr/orlo/etc"));

    // A volume that is not there is not made: a data volume is a mount, never a plain
    // directory the library invents.
    EXPECT_EQ(1, Cli({"lun", "create", "--name", "nope", "--type", "FILE", "--size", "16M", "--volume", "/volume1"},
                     &out, &err));
    EXPECT_FALSE(PathExists(root_ + "/volume1"));

    // The kernel and a volume, and then the whole path of a LUN into a running service.
    LayOutKernel();
    ASSERT_EQ(0, mkdir((root_ + "/volume1").c_str(), 0755));
    ASSERT_EQ(0, mount("tmpfs", (root_ + "/volume1").c_str(), "tmpfs", 0, "size=256m"));
    ASSERT_EQ(0, mkdir((root_ + "/etc.defaults").c_str(), 0755));
    Write(root_ + "/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");

    EXPECT_EQ(0, Cli({"service", "start"}, &out, &err)) << err;
    EXPECT_TRUE(PathExists(root_ + "/config/target/iscsi"));
    EXPECT_EQ(0, Cli({"lun", "create", "--name", "demo", "--type", "FILE", "--size", "16M", "--volume", "/volume1"},
                     &out, &err))
        << err;
    EXPECT_EQ(0, Cli({"lun", "load", "demo"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"service", "stop"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"service", "start"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"lun", "list"}, &out, &err)) << err;
    EXPECT_NE(std::string::npos, out.find("demo")) << out;
    EXPECT_EQ(0, Cli({"service", "total-stop"}, &out, &err)) << err;

    for (const auto &h : hostHad_) {
        if (!h.second) {
            EXPECT_FALSE(PathExists(h.first)) << h.first << " was made outside the root";
        }
    }
}

}  // namespace
