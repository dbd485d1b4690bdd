// The seam on a sandbox root that is still empty: what the appliance always has is made
// beneath the root when something is created in it, and nothing else is ever made.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>

#include "platform/os_seam.h"
#include "support/sandbox.h"

namespace {

namespace os = orlo::os;

class StandingDirs : public ::testing::Test {
  protected:
    void SetUp() override {
        root_ = orlotest::MakeTempDir("orlo-standing");
        ASSERT_FALSE(root_.empty());
        setenv("ORLO_SYSROOT", root_.c_str(), 1);
    }
    void TearDown() override {
        unsetenv("ORLO_SYSROOT");
        orlotest::RemoveTree(root_);
    }
    bool Exists(const std::string &logical) const {
        struct stat st;
        return lstat((root_ + logical).c_str(), &st) == 0;
    }
    mode_t Mode(const std::string &logical) const {
        struct stat st;
        return lstat((root_ + logical).c_str(), &st) == 0 ? (st.st_mode & 07777) : 0;
    }
    std::string root_;
};

TEST_F(StandingDirs, CreatingCallsMakeTheStandingDirectoryAndNothingMore) {
    // Reading never makes anything.
    EXPECT_EQ(-1, os::Open("/usr/orlo/etc/iscsi_lun.conf", O_RDONLY));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_EQ(nullptr, os::Fopen("/etc.defaults/orloinfo.conf", "r"));
    EXPECT_FALSE(Exists("/usr"));
    EXPECT_FALSE(Exists("/etc.defaults"));

    int fd = os::Open("/usr/orlo/etc/iscsi_lun.conf", O_WRONLY | O_CREAT, 0644);
    ASSERT_GE(fd, 0) << strerror(errno);
    close(fd);
    EXPECT_EQ(0755u, Mode("/usr"));
    EXPECT_EQ(0755u, Mode("/usr/orlo/etc"));

    // /tmp keeps its sticky bit whatever the umask; the runtime tree is private.
    mode_t old = umask(077);
    EXPECT_EQ(0, os::Mkdir("/tmp/iscsi/lun_lock", 0700)) << strerror(errno);
    umask(old);
    EXPECT_EQ(01777u, Mode("/tmp"));
    EXPECT_EQ(0700u, Mode("/tmp/iscsi"));
    EXPECT_EQ(0700u, Mode("/tmp/iscsi/lun_lock"));

    char tmpl[] = "/var/run/orlo.XXXXXX";
    fd = os::Mkstemp(tmpl);
    ASSERT_GE(fd, 0) << strerror(errno);
    close(fd);
    EXPECT_TRUE(Exists(tmpl));
    EXPECT_EQ(0, os::Mkfifo("/root/fifo", 0600));
    EXPECT_EQ(0700u, Mode("/root"));
    FILE *f = os::Fopen("/var/log/orlo.log", "a");
    ASSERT_NE(nullptr, f);
    fclose(f);

    // Only the standing directory itself: deeper parents stay the caller's business.
    EXPECT_EQ(-1, os::Open("/usr/orlo/etc/sub/file", O_WRONLY | O_CREAT, 0644));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_FALSE(Exists("/usr/orlo/etc/sub"));

    // Mount points are never made: a missing kernel tree or volume must stay missing.
    EXPECT_EQ(-1, os::Mkdir("/config/target/iscsi", 0700));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_EQ(-1, os::Open("/volume1/@iSCSI/x", O_WRONLY | O_CREAT, 0644));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_EQ(-1, os::Symlink("/tmp", "/config/link"));
    EXPECT_FALSE(Exists("/config"));
    EXPECT_FALSE(Exists("/volume1"));
}

TEST_F(StandingDirs, AStandingPathThatIsAFileOrARootThatIsMissingIsLeftAlone) {
    std::ofstream(root_ + "/tmp") << "not a directory";
    EXPECT_EQ(-1, os::Mkdir("/tmp/iscsi", 0700));
    EXPECT_EQ(ENOTDIR, errno);

    // A root that does not exist is never made.
    std::string gone = root_ + "/gone";
    setenv("ORLO_SYSROOT", gone.c_str(), 1);
    EXPECT_EQ(-1, os::Mkdir("/tmp/iscsi", 0700));
    EXPECT_EQ(ENOENT, errno);
    struct stat st;
    EXPECT_NE(0, lstat(gone.c_str(), &st));
}

}  // namespace
