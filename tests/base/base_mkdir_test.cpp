// The runtime directories and a volume's @iSCSI tree: made in order, stopping at the
// first failure; on Btrfs @iSCSI is a subvolume with copy-on-write off.
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "orlo_storage.h"
#include "orloiscsi_base.h"
#include "support/loop_volume.h"

namespace {

using orlotest::LoopVolume;

const std::vector<std::string> kRuntimeDirs = {
    "/tmp/iscsi",
    "/tmp/iscsi/lun_lock",
    "/tmp/iscsi/lun_unsync",
    "/tmp/iscsi/snapshot_conf_lock",
    "/tmp/iscsi/snapshot_cache",
    "/tmp/iscsi/snapshot_lock",
    "/tmp/iscsi/snapshot_cache_lock",
    "/tmp/iscsi/snapshot_app_lock",
    "/tmp/iscsi/snapshot_unsync_lock",
};

int InodeFlags(const std::string &real) {
    int fd = open(real.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) return -1;
    int flags = 0;
    int rc = ioctl(fd, FS_IOC_GETFLAGS, &flags);
    close(fd);
    return rc == 0 ? flags : -1;
}

class BaseMkdirTest : public orlotest::VolumeTest {
  protected:
    bool IsPrivateDir(const std::string &logical) const {
        struct stat st;
        return lstat(Real(logical).c_str(), &st) == 0 && S_ISDIR(st.st_mode) && (st.st_mode & 07777) == 0700;
    }
    // The line with its line number dropped.
    static std::string WithoutNumber(const std::string &l) {
        size_t a = l.find(':', 6), b = a == std::string::npos ? a : l.find(':', a + 1);
        return b == std::string::npos ? l : l.substr(0, a) + l.substr(b);
    }
};

TEST_F(BaseMkdirTest, RuntimeDirectoriesAreMadePrivateAndAgainWithoutComplaint) {
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
    for (const std::string &d : kRuntimeDirs) EXPECT_TRUE(IsPrivateDir(d)) << d;
    WriteFile("/tmp/iscsi/lun_lock/LUN_x.lock", "");
    EXPECT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
    EXPECT_TRUE(Exists("/tmp/iscsi/lun_lock/LUN_x.lock"));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    EXPECT_FALSE(Exists("/volume1/@iSCSI"));
}

TEST_F(BaseMkdirTest, StopsAtTheFirstDirectoryThatCannotBeMade) {
    WriteFile("/tmp/iscsi/snapshot_cache", "in the way");
    EXPECT_EQ(18990028u, ORLOiSCSIBaseMkdir(nullptr));
    ASSERT_EQ(1u, log_.Lines().size()) << log_.Dump();
    EXPECT_EQ("iSCSI:iscsi_base_mkdir.cpp:ORLOiSCSIBaseMkdir mkdir(\"/tmp/iscsi/snapshot_cache\", S_IRWXU) failed, "
              "err=File exists",
              WithoutNumber(log_.Lines()[0]));
    for (size_t i = 0; i < kRuntimeDirs.size(); ++i) {
        if (i < 4) {  // /tmp/iscsi itself was made by WriteFile, with another mode
            EXPECT_TRUE(i == 0 ? Exists(kRuntimeDirs[i]) : IsPrivateDir(kRuntimeDirs[i])) << kRuntimeDirs[i];
        } else if (i > 4) {
            EXPECT_FALSE(Exists(kRuntimeDirs[i])) << kRuntimeDirs[i];
        }
    }

    // A volume whose tree cannot be made stops before the runtime directories.
    unlink(Real("/tmp/iscsi/snapshot_cache").c_str());
    log_.Clear();
    EXPECT_EQ(18990028u, ORLOiSCSIBaseMkdir("/volume9"));
    ASSERT_EQ(1u, log_.Lines().size()) << log_.Dump();
    EXPECT_EQ("iSCSI:iscsi_base_mkdir.cpp:ORLOiSCSIBaseMkdir mkdir(\"/volume9/@iSCSI\", S_IRWXU) failed, "
              "err=No such file or directory",
              WithoutNumber(log_.Lines()[0]));
    EXPECT_FALSE(Exists("/tmp/iscsi/snapshot_cache"));

    // A volume path too long for the buffer is refused whole.
    std::string longVolume = "/volume1/" + std::string(4090, 'v');
    log_.Clear();
    EXPECT_EQ(18990050u, ORLOiSCSIBaseMkdir(longVolume.c_str()));
    EXPECT_EQ(1u, log_.Lines().size()) << log_.Dump();
}

TEST_F(BaseMkdirTest, BtrfsVolumeGetsANoCowSubvolume) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20));
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1")) << log_.Dump();
    EXPECT_EQ(1, ORLOBtrfsIsSubVol("/volume1/@iSCSI"));
    EXPECT_NE(0, InodeFlags(Real("/volume1/@iSCSI")) & FS_NOCOW_FL);
    EXPECT_TRUE(IsPrivateDir("/volume1/@iSCSI"));
    EXPECT_TRUE(IsPrivateDir("/volume1/@iSCSI/tmp"));
    EXPECT_EQ(0, ORLOBtrfsIsSubVol("/volume1/@iSCSI/tmp"));
    EXPECT_NE(0, InodeFlags(Real("/volume1/@iSCSI/tmp")) & FS_NOCOW_FL);  // inherited
    for (const std::string &d : kRuntimeDirs) EXPECT_TRUE(IsPrivateDir(d)) << d;

    // Idempotent: the subvolume and what is in it stay.
    WriteFile("/volume1/@iSCSI/LUN/iscsi_lun.conf", "[LUN_x]\n");
    EXPECT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1"));
    EXPECT_EQ("[LUN_x]\n", ReadFile("/volume1/@iSCSI/LUN/iscsi_lun.conf"));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(BaseMkdirTest, BtrfsVolumeWithAPlainDirectoryInTheWay) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20));
    mkdir(Real("/volume1/@iSCSI").c_str(), 0700);
    EXPECT_EQ(18990317u, ORLOiSCSIBaseMkdir("/volume1"));
    ASSERT_EQ(1u, log_.Lines().size()) << log_.Dump();
    EXPECT_EQ("iSCSI:iscsi_base_mkdir.cpp:ORLOiSCSIBaseMkdir Failed to create Btrfs subvolume. path: /volume1/@iSCSI",
              WithoutNumber(log_.Lines()[0]));
    EXPECT_FALSE(Exists("/volume1/@iSCSI/tmp"));
    EXPECT_FALSE(Exists("/tmp/iscsi"));
}

TEST_F(BaseMkdirTest, Ext4VolumeGetsAPlainDirectory) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20));
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1")) << log_.Dump();
    EXPECT_TRUE(IsPrivateDir("/volume1/@iSCSI"));
    EXPECT_TRUE(IsPrivateDir("/volume1/@iSCSI/tmp"));
    EXPECT_EQ(0, ORLOBtrfsIsSubVol("/volume1/@iSCSI"));
    EXPECT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1"));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

}  // namespace
