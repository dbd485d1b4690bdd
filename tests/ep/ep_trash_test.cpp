// The trash of map files: the directory, and copy-on-write switched off on Btrfs.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "ep_internal.h"
#include "orloiscsi_ep.h"
#include "support/loop_volume.h"

namespace {

class EpTrashTest : public orlotest::VolumeTest {};

TEST_F(EpTrashTest, TrashDirectoryIsMadeOnce) {
    EXPECT_EQ(18990028u, ORLOiSCSIEpTrashMkdir("/volume1")) << "no @iSCSI yet";
    EXPECT_TRUE(log_.Contains("mkdir(\"/volume1/@iSCSI/EP_unmap\", S_IRWXU) failed, err=")) << log_.Dump();
    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI").c_str(), 0700));
    ASSERT_EQ(0u, ORLOiSCSIEpTrashMkdir("/volume1"));
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume1/@iSCSI/EP_unmap").c_str(), &st));
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_EQ(0700u, st.st_mode & 07777);
    EXPECT_EQ(0u, ORLOiSCSIEpTrashMkdir("/volume1")) << "there already";
    WriteFile("/volume2/@iSCSI/EP_unmap", "a file in the way");
    EXPECT_EQ(18990028u, ORLOiSCSIEpTrashMkdir("/volume2"));
    EXPECT_EQ(18990003u, ORLOiSCSIEpTrashMkdir(""));
    std::string longVolume = "/volume1/" + std::string(120, 'x');
    EXPECT_EQ(18990050u, ORLOiSCSIEpTrashMkdir(longVolume.c_str()));
    EXPECT_TRUE(log_.Contains("snprintf() failed with buffer size 128")) << log_.Dump();
}

TEST_F(EpTrashTest, OnBtrfsTheTrashHasNoCopyOnWrite) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(orlotest::LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(orlotest::LoopVolume::Fs::kBtrfs, 256ull << 20, 1));
    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI").c_str(), 0700));
    ASSERT_EQ(0u, ORLOiSCSIEpTrashMkdir("/volume1")) << log_.Dump();
    int fd = open(Real("/volume1/@iSCSI/EP_unmap").c_str(), O_RDONLY | O_DIRECTORY);
    ASSERT_GE(fd, 0);
    int flags = 0;
    ASSERT_EQ(0, ioctl(fd, FS_IOC_GETFLAGS, &flags));
    close(fd);
    EXPECT_NE(0, flags & FS_NOCOW_FL);
    // Not so elsewhere: a plain directory beside it keeps copy-on-write.
    ASSERT_EQ(0, mkdir(Real("/volume1/plain").c_str(), 0700));
    fd = open(Real("/volume1/plain").c_str(), O_RDONLY | O_DIRECTORY);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(0, ioctl(fd, FS_IOC_GETFLAGS, &flags));
    close(fd);
    EXPECT_EQ(0, flags & FS_NOCOW_FL);
}

}  // namespace
