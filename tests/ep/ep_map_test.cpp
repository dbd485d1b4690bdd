// Map files: the fields the library reads from a head built here byte by byte, the
// attribute update, and the life of a map file from its making to a clone's fill-up.
#include <gtest/gtest.h>

#include <string>

#include "ep/ep_test_util.h"
#include "ep_internal.h"
#include "orloiscsi_ep.h"
#include "support/sandbox.h"

namespace {

using eptest::BlockCrc;
using eptest::Le32;
using eptest::Le64;
using eptest::ReadAt;

const unsigned char kSelf[16] = {0x10, 0x11, 0x12, 0x13, 0x14, 0x15, 0x16, 0x17,
                                 0x18, 0x19, 0x1a, 0x1b, 0x1c, 0x1d, 0x1e, 0x1f};
const unsigned char kParent[16] = {0xde, 0xad, 0xbe, 0xef, 0x00, 0x01, 0x02, 0x03,
                                   0x04, 0x05, 0x06, 0x07, 0x08, 0x09, 0x0a, 0x0b};
const unsigned char kBase[16] = {0xa0, 0xa1, 0xa2, 0xa3, 0xb0, 0xb1, 0xc0, 0xc1,
                                 0xd0, 0xd1, 0xe0, 0xe1, 0xe2, 0xe3, 0xe4, 0xe5};

class EpMapTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI").c_str(), 0700));
    }
    // A map file as the kernel leaves it.
    void HandMap(const std::string &logical, uint32_t attr, uint64_t total, uint64_t parentTotal, uint64_t mapped,
                 uint64_t synced, uint32_t childAttr) {
        WriteFile(logical, "");
        std::vector<unsigned char> head(4288, 0);
        eptest::CommonHeader(head.data(), 4, kSelf, 1600000000u);
        unsigned char *map = &head[64];
        eptest::Put32(map + 4, attr);
        eptest::Put64(map + 12, total);
        memcpy(map + 20, kParent, 16);
        eptest::Put64(map + 36, parentTotal);
        eptest::Seal(map);
        eptest::Put64(&head[4096 + 4], mapped);
        eptest::Seal(&head[4096]);
        eptest::Seal(&head[4160]);
        unsigned char *var2 = &head[4224];
        eptest::Put64(var2 + 4, synced);
        eptest::Put32(var2 + 12, childAttr);
        memcpy(var2 + 16, kBase, 16);
        eptest::Seal(var2);
        ASSERT_TRUE(eptest::WriteAt(Real(logical), 0, head.data(), head.size()));
    }
    const char *kMap = "/volume1/@iSCSI/LUN/ADV/u/u_00000";
};

TEST_F(EpMapTest, FieldsAreReadFromTheirOffsets) {
    HandMap(kMap, 0x1A, 12, 34, 5, 10, 0x2);
    uint32_t attr = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileAttributeGet(kMap, &attr));
    EXPECT_EQ(0x1Au, attr);
    bool b = false;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileIsVirtual(kMap, &b));
    EXPECT_TRUE(b);
    uint64_t n = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileTotalCountGet(kMap, &n));
    EXPECT_EQ(12u, n);
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileParentTotalCountGet(kMap, &n));
    EXPECT_EQ(34u, n);
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileSyncedCountGet(kMap, &n));
    EXPECT_EQ(10u, n);
    char uuid[37];
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileParentUuidGet(kMap, uuid));
    EXPECT_STREQ("deadbeef-0001-0203-0405-060708090a0b", uuid);
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileBaseVersionGet(kMap, uuid));
    EXPECT_STREQ("a0a1a2a3-b0b1-c0c1-d0d1-e0e1e2e3e4e5", uuid);
    uint64_t synced = 0, total = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpChildLunSyncProgressGet(kMap, &synced, &total));
    EXPECT_EQ(10u, synced);
    EXPECT_EQ(12u, total);

    // Child attribute: 0x2 mirror, 0x4 promoted ("stable").
    uint32_t child = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileChildAttributeGet(kMap, &child));
    EXPECT_EQ(0x2u, child);
    EXPECT_TRUE(ORLOiSCSIEpChildLunIsMirror(kMap));
    EXPECT_FALSE(ORLOiSCSIEpChildLunIsPromoted(kMap));
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileIsStable(kMap, &b));
    EXPECT_FALSE(b);
    HandMap(kMap, 0x0, 12, 34, 5, 10, 0x4);
    EXPECT_FALSE(ORLOiSCSIEpChildLunIsMirror(kMap));
    EXPECT_TRUE(ORLOiSCSIEpChildLunIsPromoted(kMap));
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileIsStable(kMap, &b));
    EXPECT_TRUE(b);
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileIsVirtual(kMap, &b));
    EXPECT_FALSE(b);

    // A map file whose child attribute cannot be read is neither.
    WriteFile("/volume1/short", std::string(4200, '\xff'));
    EXPECT_FALSE(ORLOiSCSIEpChildLunIsMirror("/volume1/short"));
    EXPECT_FALSE(ORLOiSCSIEpChildLunIsPromoted("/volume1/missing"));
    EXPECT_TRUE(log_.Contains("ORLOiSCSIEpFileMapGetVar2(\"/volume1/short\", ")) << log_.Dump();
    EXPECT_EQ(18990039u, ORLOiSCSIEpMapFileSyncedCountGet("/volume1/short", &n));
    EXPECT_EQ(18990003u, ORLOiSCSIEpMapFileTotalCountGet(kMap, nullptr));
}

TEST_F(EpMapTest, AttributeSetReplacesTheLowThreeBitsOnly) {
    HandMap(kMap, 0x1A, 12, 34, 5, 10, 0x2);
    auto before = ReadAt(Real(kMap), 0, 4288);
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileAttributeSet(kMap, 5));
    auto after = ReadAt(Real(kMap), 0, 4288);
    EXPECT_EQ(0x1Du, Le32(&after[68]));
    EXPECT_EQ(BlockCrc(&after[64]), Le32(&after[64])) << "the header carries a new checksum";
    EXPECT_NE(Le32(&before[64]), Le32(&after[64]));
    for (size_t i = 0; i < after.size(); ++i) {
        if (i >= 64 && i < 72) continue;  // checksum and attribute word
        ASSERT_EQ(before[i], after[i]) << "byte " << i << " changed";
    }
    // Bits above the low three of the value are not taken.
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileAttributeSet(kMap, 0xF8));
    uint32_t attr = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileAttributeGet(kMap, &attr));
    EXPECT_EQ(0x18u, attr);
    EXPECT_EQ(18990039u, ORLOiSCSIEpMapFileAttributeSet("/volume1/missing", 1));
    EXPECT_FALSE(Exists("/volume1/missing"));
}

TEST_F(EpMapTest, MappedSizeIsTheCountShiftedByThePoolsExtent) {
    HandMap(kMap, 0, 12, 0, 5, 0, 0);
    uint64_t bytes = 1;
    EXPECT_EQ(18990566u, ORLOiSCSIEpMapFileMappedSizeGet(kMap, "/volume1", &bytes)) << "no pool";
    EXPECT_TRUE(log_.Contains("No extent pool on /volume1")) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 4096));
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileMappedSizeGet(kMap, "/volume1", &bytes));
    EXPECT_EQ(5u * 4096, bytes);
    HandMap(kMap, 0, 1, 0, 0x100000000ull, 0, 0);  // counts are 64-bit
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileMappedSizeGet(kMap, "/volume1", &bytes));
    EXPECT_EQ(0x100000000ull << 12, bytes);
}

TEST_F(EpMapTest, MetaInitSizeSetAndVersionInfo) {
    // A map file needs its volume's pool.
    EXPECT_EQ(18990566u, ORLOiSCSIEpMapFileMetaInit(kMap, "/volume1", 10 << 20));
    EXPECT_FALSE(Exists(kMap));
    ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 1u << 20));
    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI/LUN").c_str(), 0700));
    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI/LUN/ADV").c_str(), 0700));
    ASSERT_EQ(0, mkdir(Real("/volume1/@iSCSI/LUN/ADV/u").c_str(), 0700));
    EXPECT_EQ(18990502u, ORLOiSCSIEpMapFileMetaInit(kMap, "/volume1", 0));
    EXPECT_FALSE(Exists(kMap));

    // 10 MiB and one byte take 11 extents of 1 MiB.
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileMetaInit(kMap, "/volume1", (10 << 20) + 1)) << log_.Dump();
    EXPECT_EQ((1 << 20) + 4096, eptest::SizeOf(Real(kMap))) << "head plus 11 entries, rounded to 4096";
    auto head = ReadAt(Real(kMap), 0, 4288);
    EXPECT_EQ(4u, Le32(&head[16]));
    for (size_t off : {0, 64, 4096, 4160, 4224}) EXPECT_EQ(BlockCrc(&head[off]), Le32(&head[off])) << off;
    EXPECT_EQ(11u, Le64(&head[64 + 12]));
    bool isMap = false;
    ASSERT_EQ(0u, ORLOiSCSIEpIsMapFile(kMap, &isMap));
    EXPECT_TRUE(isMap);

    // A map file is never initialised twice.
    log_.Clear();
    EXPECT_EQ(18990012u, ORLOiSCSIEpMapFileMetaInit(kMap, "/volume1", 20 << 20));
    EXPECT_EQ(head, ReadAt(Real(kMap), 0, 4288));

    ASSERT_EQ(0u, ORLOiSCSIEpMapFileMetaSizeSet(kMap, "/volume1", 3ull << 30));
    uint64_t total = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileTotalCountGet(kMap, &total));
    EXPECT_EQ(3072u, total);
    EXPECT_EQ((1 << 20) + 3072 * 8, eptest::SizeOf(Real(kMap)));
    EXPECT_EQ(18990523u, ORLOiSCSIEpMapFileMetaSizeSet(kMap, "/volume1", 1ull << 30));
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileTotalCountGet(kMap, &total));
    EXPECT_EQ(3072u, total) << "a refused shrink changes nothing";

    ORLOiSCSIEpMapVersionInfo info;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileVersionInfoGet(kMap, &info));
    char uuid[37];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(kMap, uuid));
    EXPECT_STREQ(uuid, info.uuid);
    EXPECT_EQ(3072u, info.totalCount);
    EXPECT_EQ(0u, info.mappedCount);
    EXPECT_STREQ("00000000-0000-0000-0000-000000000000", info.parentUuid);
    EXPECT_EQ(18990400u, ORLOiSCSIEpMapFileVersionInfoGet("/volume1/@iSCSI/EP/EP_TBL", &info));

    // Not map files: another pool file, a damaged header, a text file.
    ASSERT_EQ(0u, ORLOiSCSIEpIsMapFile("/volume1/@iSCSI/EP/EP_TBL", &isMap));
    EXPECT_FALSE(isMap);
    unsigned char x = 0x77;
    ASSERT_TRUE(eptest::WriteAt(Real(kMap), 60, &x, 1));
    ASSERT_EQ(0u, ORLOiSCSIEpIsMapFile(kMap, &isMap));
    EXPECT_FALSE(isMap);
    WriteFile("/volume1/text", std::string(100, 'a'));
    ASSERT_EQ(0u, ORLOiSCSIEpIsMapFile("/volume1/text", &isMap));
    EXPECT_FALSE(isMap);
    // A damaged map file may be made anew.
    EXPECT_EQ(0u, ORLOiSCSIEpMapFileMetaInit(kMap, "/volume1", 10 << 20));
}

TEST_F(EpMapTest, CloneFileTruncAndFillUpTakeThePartsOfTheSource) {
    ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate("/volume1", 1u << 20));
    HandMap("/volume1/parent", 0x2, 40, 0, 7, 0, 0);
    ASSERT_EQ(0, truncate(Real("/volume1/parent").c_str(), (1 << 20) + 8192));
    const char *child = "/volume1/child";
    ASSERT_EQ(0u, ORLOiSCSIEpCloneFileTrunc(child, "/volume1/parent"));
    EXPECT_EQ((1 << 20) + 8192, eptest::SizeOf(Real(child)));
    ASSERT_EQ(0u, ORLOiSCSIEpCloneMapMetaDataFillUp(child, "/volume1/parent"));

    ORLOiSCSIEpMapVersionInfo info;
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileVersionInfoGet(child, &info));
    EXPECT_EQ(1600000000u, info.createTime) << "the source's creation time";
    EXPECT_STREQ("10111213-1415-1617-1819-1a1b1c1d1e1f", info.parentUuid) << "the source's own UUID";
    EXPECT_STRNE("10111213-1415-1617-1819-1a1b1c1d1e1f", info.uuid);
    EXPECT_EQ(40u, info.totalCount);
    EXPECT_EQ(40u, info.parentTotalCount);
    EXPECT_EQ(0u, info.mappedCount);
    EXPECT_EQ(0u, info.syncedCount);
    EXPECT_EQ(0u, info.attribute);
    EXPECT_STREQ("a0a1a2a3-b0b1-c0c1-d0d1-e0e1e2e3e4e5", info.baseVersion);
    bool isMap = false;
    ASSERT_EQ(0u, ORLOiSCSIEpIsMapFile(child, &isMap));
    EXPECT_TRUE(isMap);
    auto head = ReadAt(Real(child), 0, 4288);
    for (size_t off : {0, 64, 4096, 4160, 4224}) EXPECT_EQ(BlockCrc(&head[off]), Le32(&head[off])) << off;

    // A source that is no map file is refused before the child is touched.
    WriteFile("/volume1/child2", "");
    EXPECT_EQ(18990400u, ORLOiSCSIEpCloneMapMetaDataFillUp("/volume1/child2", "/volume1/@iSCSI/EP/EP_DAT"));
    EXPECT_EQ(0, eptest::SizeOf(Real("/volume1/child2")));
    EXPECT_EQ(18990021u, ORLOiSCSIEpCloneFileTrunc("/volume1/child3", "/volume1/none"));
    EXPECT_FALSE(Exists("/volume1/child3"));
}

}  // namespace
