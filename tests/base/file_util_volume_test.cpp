// Base file utilities on loop-mounted volumes: LUN directories as Btrfs subvolumes,
// full file systems while growing files, and moves between file systems.
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "orlo_storage.h"
#include "orloiscsi_file.h"
#include "support/loop_volume.h"

namespace {

using orlotest::LoopVolume;

int InodeFlags(const std::string &real) {
    int fd = open(real.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) return -1;
    int flags = 0;
    int rc = ioctl(fd, FS_IOC_GETFLAGS, &flags);
    close(fd);
    return rc == 0 ? flags : -1;
}

class FileUtilVolumeTest : public orlotest::VolumeTest {
  protected:
    void SetUp() override {
        VolumeTest::SetUp();
        mkdir(Real("/tmp/iscsi").c_str(), 0700);
    }
    off_t SizeOf(const std::string &logical) const {
        struct stat st;
        return stat(Real(logical).c_str(), &st) == 0 ? st.st_size : -1;
    }
    std::string ProgressFile() const { return "/tmp/iscsi/P" + std::to_string(getpid()) + ".progress"; }
};

TEST_F(FileUtilVolumeTest, LunDirectoriesAsSubvolumes) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20));
    ASSERT_EQ(0u, ORLOiSCSIMkdir("/volume1/lun", 1)) << log_.Dump();
    EXPECT_EQ(1, ORLOBtrfsIsSubVol("/volume1/lun"));
    EXPECT_NE(0, InodeFlags(Real("/volume1/lun")) & FS_NOCOW_FL);
    EXPECT_EQ(0u, ORLOiSCSIMkdir("/volume1/lun", 1));  // an existing subvolume is fine

    // Removal takes what is nested inside along.
    ASSERT_EQ(0u, ORLOiSCSIMkdir("/volume1/lun/snap", 1));
    WriteFile("/volume1/lun/snap/data", "x");
    EXPECT_EQ(0u, ORLOiSCSIRmdir("/volume1/lun"));
    EXPECT_FALSE(Exists("/volume1/lun"));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    log_.Clear();
    EXPECT_EQ(18990317u, ORLOiSCSIMkdir("/volume1/no/parent", 1));
    ASSERT_EQ(1u, log_.Lines().size()) << log_.Dump();
    EXPECT_NE(std::string::npos, log_.Lines()[0].find(
                                     ":ORLOiSCSIMkdir Failed to create Btrfs subvolume. path: /volume1/no/parent"));
}

TEST_F(FileUtilVolumeTest, NoSubvolumesOnExt4) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20));
    EXPECT_EQ(18990317u, ORLOiSCSIMkdir("/volume1/lun", 1));
    EXPECT_FALSE(Exists("/volume1/lun"));
    EXPECT_EQ(0u, ORLOiSCSIMkdir("/volume1/lun", 0));
    EXPECT_EQ(0u, ORLOiSCSIRmdir("/volume1/lun"));
    EXPECT_FALSE(Exists("/volume1/lun"));
}

TEST_F(FileUtilVolumeTest, AFullVolumeFailsTheGrowthAndLeavesTheFileAsItWas) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20));
    WriteFile("/volume1/lun", std::string(4096, 'd'));

    uint64_t progress = 0;
    EXPECT_EQ(18990002u, ORLOiSCSIFileTrunc("/volume1/lun", 64 << 20, &progress, ORLO_ISCSI_TRUNC_MODE_ZERO));
    EXPECT_EQ(4096, SizeOf("/volume1/lun"));
    EXPECT_EQ(std::string(4096, 'd'), ReadFile("/volume1/lun"));
    EXPECT_GT(progress, 0u);
    EXPECT_LT(progress, 64u << 20);
    EXPECT_TRUE(log_.Contains("DDFile Failed to write u64PlanTruncBytes[67104768] with wrong u64RealTruncBytes["))
        << log_.Dump();
    std::string progressText = ReadFile(ProgressFile());
    EXPECT_EQ(0u, progressText.find("total_bytes=67104768\ndone_bytes=")) << progressText;
    EXPECT_NE("total_bytes=67104768\ndone_bytes=67104768\n", progressText);

    log_.Clear();
    progress = 0;
    EXPECT_EQ(18990002u, ORLOiSCSIFileTrunc("/volume1/lun", 64 << 20, &progress, ORLO_ISCSI_TRUNC_MODE_ALLOC));
    EXPECT_EQ(4096, SizeOf("/volume1/lun"));
    EXPECT_EQ(0u, progress);
    EXPECT_TRUE(log_.Contains("failed, err=[0x2900 ")) << log_.Dump();

    // Space that was given back can be used again.
    EXPECT_EQ(0u, ORLOiSCSIFileTrunc("/volume1/lun", 4 << 20, &progress, ORLO_ISCSI_TRUNC_MODE_ALLOC));
    EXPECT_EQ(4 << 20, SizeOf("/volume1/lun"));
}

TEST_F(FileUtilVolumeTest, MovesBetweenFileSystems) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20, 1));
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20, 2));

    WriteFile("/volume1/map", "extent map", 0640);
    EXPECT_EQ(18990042u, ORLOiSCSIFileRename("/volume1/map", "/volume2/map", 0));
    EXPECT_TRUE(log_.Contains("rename(\"/volume1/map\", \"/volume2/map\") failed, err=Invalid cross-device link"))
        << log_.Dump();
    EXPECT_EQ("extent map", ReadFile("/volume1/map"));

    EXPECT_EQ(0u, ORLOiSCSIFileRename("/volume1/map", "/volume2/map", 1));
    EXPECT_FALSE(Exists("/volume1/map"));
    EXPECT_EQ("extent map", ReadFile("/volume2/map"));
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume2/map").c_str(), &st));
    EXPECT_EQ(0640u, st.st_mode & 07777);

    // Off Btrfs it is refused, and the file stays where it is.
    log_.Clear();
    EXPECT_EQ(18990005u, ORLOiSCSIFileRename("/volume2/map", "/volume1/map", 1));
    EXPECT_EQ("extent map", ReadFile("/volume2/map"));
    EXPECT_FALSE(Exists("/volume1/map"));
    EXPECT_EQ(1u, log_.Lines().size()) << log_.Dump();
}

}  // namespace
