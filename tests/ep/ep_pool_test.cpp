// The pool's files: the extent-size rule read from a hand-made table, making a pool and
// keeping an existing one, used space, and a write to a full volume.
#include <gtest/gtest.h>
#include <sys/mount.h>

#include <cerrno>
#include <functional>
#include <string>

#include "ep/ep_test_util.h"
#include "ep_internal.h"
#include "olibc.h"
#include "orloiscsi_ep.h"
#include "support/sandbox.h"

namespace {

using eptest::BlockCrc;
using eptest::Le32;
using eptest::Le64;
using eptest::ReadAt;

class EpPoolTest : public orlotest::SandboxTest {
  protected:
    // A table file whose type header says extent size.
    void HandTable(uint32_t extent) {
        WriteFile("/volume1/@iSCSI/EP/EP_TBL", "");
        unsigned char blocks[128];
        eptest::CommonHeader(blocks, 1, nullptr, 1);
        memset(blocks + 64, 0, 64);
        eptest::Put32(blocks + 68, extent);
        eptest::Seal(blocks + 64);
        ASSERT_TRUE(eptest::WriteAt(Real("/volume1/@iSCSI/EP/EP_TBL"), 0, blocks, sizeof(blocks)));
    }
    void FreeIndex(uint64_t total, uint64_t free) {
        unsigned char b[64] = {};
        eptest::Put64(b + 4, total);
        eptest::Put64(b + 12, free);
        eptest::Seal(b);
        ASSERT_TRUE(eptest::WriteAt(Real("/volume1/@iSCSI/EP/EP_FRI"), 64, b, 64));
    }
};

TEST_F(EpPoolTest, ExtentSizeMustBeAPowerOfTwoFrom4KiBTo16MiB) {
    uint32_t size = 7, shift = 7;
    ASSERT_EQ(0u, ORLOiSCSIEpExtentSizeAndShiftGet("/volume1", &size, &shift));
    EXPECT_EQ(0u, size) << "no pool yet";
    EXPECT_EQ(0u, shift);

    struct Case {
        uint32_t extent;
        uint32_t code, size, shift;
    };
    for (const Case &c : {Case{4096, 0, 4096, 12}, Case{16u << 20, 0, 16u << 20, 24}, Case{1u << 20, 0, 1u << 20, 20},
                          Case{3000, 18990507, 0xFFFFFFFFu, 0xFFFFFFFFu},
                          Case{32u << 20, 18990507, 0xFFFFFFFFu, 0xFFFFFFFFu},
                          Case{2048, 18990507, 0xFFFFFFFFu, 0xFFFFFFFFu},
                          Case{12288, 18990507, 0xFFFFFFFFu, 0xFFFFFFFFu}}) {
        HandTable(c.extent);
        log_.Clear();
        EXPECT_EQ(c.code, ORLOiSCSIEpExtentSizeAndShiftGet("/volume1", &size, &shift)) << c.extent;
        EXPECT_EQ(c.size, size) << c.extent;
        EXPECT_EQ(c.shift, shift) << c.extent;
        if (c.code != 0) {
            EXPECT_TRUE(log_.Contains("iscsi_ep_extent_size_and_shift_get.cpp:") &&
                        log_.Contains("Bad extent size: " + std::to_string(c.extent)))
                << log_.Dump();
        }
    }
    // A table too short to hold its type header.
    WriteFile("/volume1/@iSCSI/EP/EP_TBL", std::string(64, '\0'));
    EXPECT_EQ(18990039u, ORLOiSCSIEpExtentSizeAndShiftGet("/volume1", &size, &shift));
    EXPECT_EQ(18990003u, ORLOiSCSIEpExtentSizeAndShiftGet(nullptr, &size, &shift));
    EXPECT_TRUE(log_.Contains("Invalid input.")) << log_.Dump();
}

TEST_F(EpPoolTest, MetaFilesCreateMakesThreeStampedFilesOnce) {
    // The volume's @iSCSI directory is made by the LUN code, not here.
    EXPECT_EQ(18990427u, ORLOiSCSIEpMetaFilesCreate("/volume1", 0));
    EXPECT_FALSE(Exists("/volume1/@iSCSI"));
    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI").c_str(), 0700));

    EXPECT_EQ(18990004u, ORLOiSCSIEpMetaFilesCreate("/volume1", 3000));
    EXPECT_TRUE(log_.Contains("Bad parameters, extent size: 3000")) << log_.Dump();
    EXPECT_FALSE(Exists("/volume1/@iSCSI/EP"));

    ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 0)) << log_.Dump();
    const char *names[] = {"EP_TBL", "EP_FRI", "EP_DAT"};
    std::vector<unsigned char> uuid;
    for (uint32_t i = 0; i < 3; ++i) {
        std::string real = Real(std::string("/volume1/@iSCSI/EP/") + names[i]);
        EXPECT_EQ(1 << 20, eptest::SizeOf(real)) << names[i];
        auto h = ReadAt(real, 0, 128);
        ASSERT_EQ(128u, h.size());
        EXPECT_EQ(i + 1, Le32(&h[16])) << names[i];
        EXPECT_EQ(BlockCrc(&h[0]), Le32(&h[0]));
        EXPECT_EQ(BlockCrc(&h[64]), Le32(&h[64])) << "type header sealed too";
        std::vector<unsigned char> u(h.begin() + 20, h.begin() + 36);
        EXPECT_NE(std::vector<unsigned char>(16, 0), u);
        if (i == 0) uuid = u;
        EXPECT_EQ(uuid, u) << "one UUID for the pool's meta files";
        EXPECT_FALSE(Exists(std::string("/volume1/@iSCSI/EP/") + names[i] + ".new"));
    }
    EXPECT_EQ(1u << 20, Le32(ReadAt(Real("/volume1/@iSCSI/EP/EP_TBL"), 68, 4).data())) << "default extent 1 MiB";
    auto fri0 = ReadAt(Real("/volume1/@iSCSI/EP/EP_FRI"), 4096, 64);
    EXPECT_EQ(BlockCrc(fri0.data()), Le32(fri0.data()));

    // An existing pool is kept as it is; a different extent size is refused.
    auto before = ReadAt(Real("/volume1/@iSCSI/EP/EP_TBL"), 0, 4096);
    EXPECT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 0));
    EXPECT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 1u << 20));
    log_.Clear();
    EXPECT_EQ(18990507u, ORLOiSCSIEpMetaFilesCreate("/volume1", 4096));
    EXPECT_TRUE(log_.Contains("Extent pool on /volume1 has extent size 1048576, not 4096")) << log_.Dump();
    EXPECT_EQ(before, ReadAt(Real("/volume1/@iSCSI/EP/EP_TBL"), 0, 4096));

    // A pool whose making stopped after its table is completed with the table's UUID.
    ASSERT_EQ(0, unlink(Real("/volume1/@iSCSI/EP/EP_DAT").c_str()));
    ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 0));
    auto dat = ReadAt(Real("/volume1/@iSCSI/EP/EP_DAT"), 0, 64);
    EXPECT_EQ(3u, Le32(&dat[16]));
    EXPECT_EQ(uuid, std::vector<unsigned char>(dat.begin() + 20, dat.begin() + 36));
    EXPECT_EQ(before, ReadAt(Real("/volume1/@iSCSI/EP/EP_TBL"), 0, 4096));

    // The pool lock of the volume was taken and given back.
    EXPECT_TRUE(Exists("/tmp/ep_pool_1_access.lock"));
    int fd = -1;
    EXPECT_EQ(1, OLIBCFileLockTimeByFile("/tmp/ep_pool_1_access.lock", 1, 0, &fd));
    OLIBCFileUnlockByFile(fd);

    // Not on a volume: no pool lock to take.
    WriteFile("/srv/@iSCSI/x", "");
    EXPECT_EQ(18990311u, ORLOiSCSIEpMetaFilesCreate("/srv", 0));
    EXPECT_TRUE(log_.Contains("ORLOVolIDParse(\"/srv\") failed")) << log_.Dump();
}

TEST_F(EpPoolTest, UsedSpaceIsTotalLessFreeInBytes) {
    uint64_t used = 99;
    ASSERT_EQ(0u, ORLOiSCSIEpUsedSpaceGet("/volume1", &used));
    EXPECT_EQ(0u, used) << "no pool, nothing used";

    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI").c_str(), 0700));
    ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 4u << 20));
    ASSERT_EQ(0u, ORLOiSCSIEpUsedSpaceGet("/volume1", &used));
    EXPECT_EQ(0u, used) << "a new pool";

    FreeIndex(100, 40);
    ASSERT_EQ(0u, ORLOiSCSIEpUsedSpaceGet("/volume1", &used));
    EXPECT_EQ(60ull * (4u << 20), used);

    ORLOiSCSIEpInfo info;
    ASSERT_EQ(0u, ORLOiSCSIEpInfoGet("/volume1", &info));
    EXPECT_TRUE(info.exists);
    EXPECT_EQ(4u << 20, info.extentSize);
    EXPECT_EQ(22u, info.extentShift);
    EXPECT_EQ(100u, info.totalExtents);
    EXPECT_EQ(40u, info.freeExtents);
    EXPECT_EQ(used, info.usedBytes);
    EXPECT_EQ(36u, strlen(info.uuid));
    EXPECT_FALSE(info.enabled);

    FreeIndex(10, 11);
    log_.Clear();
    EXPECT_EQ(18990310u, ORLOiSCSIEpUsedSpaceGet("/volume1", &used));
    EXPECT_TRUE(log_.Contains("Bad free-index header in /volume1/@iSCSI/EP/EP_FRI: total 10, free 11")) << log_.Dump();

    ASSERT_EQ(0u, ORLOiSCSIEpInfoGet("/volume2", &info));
    EXPECT_FALSE(info.exists);
    EXPECT_EQ(0u, info.usedBytes);
}

// Needs root for a size-limited tmpfs mounted as the volume.
TEST_F(EpPoolTest, WriteToAFullVolumeIsOutOfSpace) {
    if (geteuid() != 0) GTEST_SKIP() << "needs root to mount a small tmpfs";
    std::string vol = Real("/volume2");
    ASSERT_EQ(0, mkdir(vol.c_str(), 0755));
    if (mount("tmpfs", vol.c_str(), "tmpfs", 0, "size=64k") != 0) GTEST_SKIP() << "tmpfs mount: " << strerror(errno);
    auto unmount = [&] { umount2(vol.c_str(), MNT_DETACH); };
    struct Unmount {
        std::function<void()> f;
        ~Unmount() { f(); }
    } guard{unmount};

    WriteFile("/volume2/map", "");  // empty: the block lands in a hole
    // Fill the rest of the volume.
    int fd = ::open((vol + "/filler").c_str(), O_WRONLY | O_CREAT, 0600);
    ASSERT_GE(fd, 0);
    char page[4096];
    memset(page, 'z', sizeof(page));
    while (write(fd, page, sizeof(page)) == static_cast<ssize_t>(sizeof(page))) {
    }
    ::close(fd);

    unsigned char block[64] = {1, 2, 3};
    EXPECT_EQ(18990002u, ORLOiSCSIEpFileMapSetVar0("/volume2/map", block));
    EXPECT_TRUE(log_.Contains("pwrite(")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("FilePwrite(\"/volume2/map\", ")) << log_.Dump();
}

}  // namespace
