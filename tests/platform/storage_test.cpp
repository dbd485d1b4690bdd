// The storage platform library on real file systems: loop-mounted Btrfs and ext4
// volumes for subvolumes, snapshots, copy-on-write and space, the sandbox for copies
// and volume numbers.
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "olibc.h"
#include "orlo_storage.h"
#include "support/loop_volume.h"
#include "support/sandbox.h"

namespace {

using orlotest::LoopVolume;

// The inode flags of a real path, or -1.
int InodeFlags(const std::string &real) {
    int fd = open(real.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) return -1;
    int flags = 0;
    int rc = ioctl(fd, FS_IOC_GETFLAGS, &flags);
    close(fd);
    return rc == 0 ? flags : -1;
}

ino_t InodeOf(const std::string &real) {
    struct stat st;
    return lstat(real.c_str(), &st) == 0 ? st.st_ino : 0;
}

class StorageTest : public orlotest::VolumeTest {};

TEST_F(StorageTest, VolumeNumbersComeFromTheVolumeMountPoint) {
    EXPECT_EQ(1, ORLOVolumeNumGet("/volume1"));
    EXPECT_EQ(1, ORLOVolumeNumGet("/volume1/"));
    EXPECT_EQ(12, ORLOVolumeNumGet("/volume12/@iSCSI/LUN/x"));
    for (const char *bad : {"/volume", "/volume0", "/volume01", "/volume1x", "/volumeUSB1/share", "/tmp/volume1",
                            "volume1", "/"})
        EXPECT_EQ(-1, ORLOVolumeNumGet(bad)) << bad;
    EXPECT_EQ(-1, ORLOVolumeNumGet(nullptr));

    // An existing path is followed to where it really lies.
    mkdir(Real("/volume2").c_str(), 0755);
    mkdir(Real("/volume2/dir").c_str(), 0755);
    ASSERT_EQ(0, symlink(Real("/volume2/dir").c_str(), Real("/tmp/link").c_str()));
    EXPECT_EQ(2, ORLOVolumeNumGet("/tmp/link"));
    EXPECT_EQ(2, ORLOVolumeNumGet("/volume1/../volume2/dir"));

    // The volumes at the root, ascending by number (not by name), only well-formed names;
    // a short array still learns how many there are.
    for (const char *d : {"/volume10", "/volume3", "/volume01", "/volumeUSB1", "/volume0"})
        mkdir(Real(d).c_str(), 0755);
    std::vector<int> want;
    for (int n : {1, 2, 3, 10})
        if (access(Real("/volume" + std::to_string(n)).c_str(), F_OK) == 0) want.push_back(n);
    int nums[16] = {0};
    ASSERT_EQ(static_cast<int>(want.size()), ORLOVolumeNumsList(nums, 16));
    EXPECT_EQ(want, std::vector<int>(nums, nums + want.size()));
    int first = 0;
    EXPECT_EQ(static_cast<int>(want.size()), ORLOVolumeNumsList(&first, 1));
    EXPECT_EQ(want[0], first);
    EXPECT_EQ(-1, ORLOVolumeNumsList(nullptr, 2));
}

TEST_F(StorageTest, FileSystemTypesOfMountedVolumes) {
    EXPECT_EQ(-1, ORLOGetFSType("/volume1/missing"));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
    EXPECT_EQ(-1, ORLOGetFSType(nullptr));

    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20, 1));
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20, 2));
    EXPECT_EQ(ORLO_FSTYPE_BTRFS, ORLOGetFSType("/volume1"));
    EXPECT_EQ(ORLO_FSTYPE_EXT4, ORLOGetFSType("/volume2"));
    WriteFile("/volume2/f", "x");
    EXPECT_EQ(ORLO_FSTYPE_EXT4, ORLOGetFSType("/volume2/f"));

    mkdir(Real("/volume3").c_str(), 0755);
    ASSERT_EQ(0, mount("tmpfs", Real("/volume3").c_str(), "tmpfs", 0, "size=1m"));
    int tmpfs = ORLOGetFSType("/volume3");
    umount2(Real("/volume3").c_str(), MNT_DETACH);
    EXPECT_EQ(ORLO_FSTYPE_TMPFS, tmpfs);
}

TEST_F(StorageTest, SubvolumesAreCreatedRecognisedAndOnlyOnBtrfs) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20, 1));
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20, 2));

    EXPECT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/sub"));
    EXPECT_EQ(256u, InodeOf(Real("/volume1/sub")));
    EXPECT_EQ(1, ORLOBtrfsIsSubVol("/volume1/sub"));
    EXPECT_EQ(1, ORLOBtrfsIsSubVol("/volume1/sub/"));
    EXPECT_EQ(-1, ORLOBtrfsCreateSubVol("/volume1/sub"));  // exists
    EXPECT_EQ(EEXIST, errno);
    EXPECT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/sub/inner"));  // nested
    EXPECT_EQ(-1, ORLOBtrfsCreateSubVol("/volume1/nodir/sub"));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());

    mkdir(Real("/volume1/plain").c_str(), 0755);
    WriteFile("/volume1/file", "x");
    EXPECT_EQ(0, ORLOBtrfsIsSubVol("/volume1/plain"));
    EXPECT_EQ(0, ORLOBtrfsIsSubVol("/volume1/file"));
    EXPECT_EQ(-1, ORLOBtrfsIsSubVol("/volume1/missing"));

    // ext4: its root directory is no subvolume, and none can be made.
    EXPECT_EQ(0, ORLOBtrfsIsSubVol("/volume2"));
    EXPECT_EQ(-1, ORLOBtrfsCreateSubVol("/volume2/sub"));
    EXPECT_EQ(OLIBC_ERR_BTRFS, OLIBCErrGet());
    EXPECT_FALSE(Exists("/volume2/sub"));
}

TEST_F(StorageTest, ReadOnlySnapshotRefusesWritesAndCanBeRemoved) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20));
    ASSERT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/lun"));
    WriteFile("/volume1/lun/data", "before");

    ASSERT_EQ(0, ORLOBtrfsSnapshotCreate("/volume1/lun", "/volume1/snap-ro", 1));
    ASSERT_EQ(0, ORLOBtrfsSnapshotCreate("/volume1/lun", "/volume1/snap-rw", 0));
    WriteFile("/volume1/lun/data", "after");
    EXPECT_EQ("before", ReadFile("/volume1/snap-ro/data"));
    EXPECT_EQ(1, ORLOBtrfsIsSubVol("/volume1/snap-ro"));

    errno = 0;
    EXPECT_LT(open(Real("/volume1/snap-ro/data").c_str(), O_WRONLY | O_CLOEXEC), 0);
    EXPECT_EQ(EROFS, errno);
    errno = 0;
    EXPECT_LT(open(Real("/volume1/snap-ro/new").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600), 0);
    EXPECT_EQ(EROFS, errno);
    int fd = open(Real("/volume1/snap-rw/new").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    EXPECT_GE(fd, 0);
    if (fd >= 0) close(fd);

    // The source must be a subvolume; the name must be free.
    mkdir(Real("/volume1/plain").c_str(), 0755);
    EXPECT_EQ(-1, ORLOBtrfsSnapshotCreate("/volume1/plain", "/volume1/snap-plain", 1));
    EXPECT_EQ(-1, ORLOBtrfsSnapshotCreate("/volume1/lun", "/volume1/snap-ro", 1));
    EXPECT_EQ(-1, ORLOBtrfsSnapshotCreate("/volume1/missing", "/volume1/snap-x", 1));

    EXPECT_EQ(0, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/snap-ro"));
    EXPECT_FALSE(Exists("/volume1/snap-ro"));
    EXPECT_EQ(0, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/snap-ro"));  // already gone
    EXPECT_EQ(0, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/nodir/snap"));
    EXPECT_EQ("after", ReadFile("/volume1/lun/data"));
}

TEST_F(StorageTest, DeletionTakesNestedSubvolumesFirstAndSparesPlainData) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20));
    ASSERT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/top"));
    mkdir(Real("/volume1/top/dir").c_str(), 0755);
    ASSERT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/top/dir/mid"));
    ASSERT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/top/dir/mid/deep"));
    ASSERT_EQ(0, ORLOBtrfsSnapshotCreate("/volume1/top/dir/mid", "/volume1/top/ro", 1));
    WriteFile("/volume1/top/dir/mid/deep/f", "x");
    WriteFile("/volume1/top/dir/g", "y");

    EXPECT_EQ(0, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/top"));
    EXPECT_FALSE(Exists("/volume1/top"));

    // A plain directory is removed only when empty; otherwise nothing is touched.
    mkdir(Real("/volume1/empty").c_str(), 0755);
    EXPECT_EQ(0, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/empty"));
    EXPECT_FALSE(Exists("/volume1/empty"));
    WriteFile("/volume1/full/keep", "z");
    EXPECT_EQ(-1, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/full"));
    EXPECT_EQ("z", ReadFile("/volume1/full/keep"));
    EXPECT_EQ(-1, ORLOBtrfsDeleteSubvolFaultTolerant("/volume1/full/keep"));  // not a directory
    EXPECT_EQ("z", ReadFile("/volume1/full/keep"));
}

TEST_F(StorageTest, NodatacowMarksDirectoriesAndWhatIsMadeInThem) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 128 << 20));
    ASSERT_EQ(0, ORLOBtrfsCreateSubVol("/volume1/lun"));
    EXPECT_EQ(0, InodeFlags(Real("/volume1/lun")) & FS_NOCOW_FL);
    EXPECT_EQ(0, ORLOFSSetNodatacow("/volume1/lun"));
    EXPECT_NE(0, InodeFlags(Real("/volume1/lun")) & FS_NOCOW_FL);
    EXPECT_EQ(0, ORLOFSSetNodatacow("/volume1/lun"));  // already set
    WriteFile("/volume1/lun/file", "");
    EXPECT_NE(0, InodeFlags(Real("/volume1/lun/file")) & FS_NOCOW_FL);
    EXPECT_EQ(-1, ORLOFSSetNodatacow("/volume1/missing"));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
}

TEST_F(StorageTest, FallocateReportsAFullFileSystem) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 16 << 20));
    int fd = open(Real("/volume1/f").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    ASSERT_GE(fd, 0);
    EXPECT_EQ(0, ORLOFSFallocate(fd, 0, 0, 1 << 20));
    struct stat st;
    ASSERT_EQ(0, fstat(fd, &st));
    EXPECT_EQ(1 << 20, st.st_size);
    EXPECT_GE(st.st_blocks * 512, 1 << 20);

    OLIBCErrSetEx(0, "", 0);
    EXPECT_EQ(-1, ORLOFSFallocate(fd, 0, 1 << 20, 64 << 20));
    EXPECT_EQ(OLIBC_ERR_NO_SPACE, OLIBCErrGet());
    EXPECT_EQ(-1, ORLOFSFallocate(fd, 0, 0, 0));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    EXPECT_EQ(-1, ORLOFSFallocate(-1, 0, 0, 4096));
    close(fd);
}

TEST_F(StorageTest, FileCopyKeepsModeAndHolesAndReplacesAtomically) {
    // 32 MiB with two 4 KiB islands of data: the copy must not fill the hole.
    const std::string src = Real("/volume1/src");
    int fd = open(src.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0640);
    ASSERT_GE(fd, 0);
    std::string a(4096, 'a'), b(4096, 'b');
    ASSERT_EQ(4096, pwrite(fd, a.data(), a.size(), 0));
    ASSERT_EQ(4096, pwrite(fd, b.data(), b.size(), 16 << 20));
    ASSERT_EQ(0, ftruncate(fd, 32 << 20));
    close(fd);
    chmod(src.c_str(), 0640);

    // The old destination has a second name: replacing by rename leaves that one alone.
    WriteFile("/volume1/dst", "old content", 0600);
    ASSERT_EQ(0, link(Real("/volume1/dst").c_str(), Real("/volume1/dst.keep").c_str()));

    ASSERT_EQ(0, ORLOFileCopy("/volume1/src", "/volume1/dst"));
    struct stat st;
    ASSERT_EQ(0, stat(Real("/volume1/dst").c_str(), &st));
    EXPECT_EQ(32 << 20, st.st_size);
    EXPECT_EQ(0640u, st.st_mode & 07777);
    EXPECT_LT(st.st_blocks * 512, 4 << 20) << "the hole was filled";
    std::string copy = ReadFile("/volume1/dst");
    EXPECT_EQ(a, copy.substr(0, 4096));
    EXPECT_EQ(b, copy.substr(16 << 20, 4096));
    EXPECT_EQ(std::string(4096, '\0'), copy.substr(8 << 20, 4096));
    EXPECT_EQ("old content", ReadFile("/volume1/dst.keep"));

    // Failures leave the destination and no temporary file behind.
    mkdir(Real("/volume1/adir").c_str(), 0755);
    EXPECT_EQ(-1, ORLOFileCopy("/volume1/adir", "/volume1/dst.keep"));
    EXPECT_EQ(-1, ORLOFileCopy("/volume1/missing", "/volume1/dst.keep"));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
    EXPECT_EQ(-1, ORLOFileCopy("/volume1/src", "/volume1/nodir/dst"));
    EXPECT_EQ("old content", ReadFile("/volume1/dst.keep"));
    std::string listing;
    orlotest::RunProgram({"/bin/ls", "-A", Real("/volume1")}, &listing);
    EXPECT_EQ("adir\ndst\ndst.keep\nsrc\n", listing);
}

}  // namespace
