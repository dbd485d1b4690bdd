// Choosing a new snapshot's sid, default name and UUID, and counting against the limit.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <set>
#include <string>

#include "snapshot_fixture.h"

namespace {

using snap_test::LunFile;
using snap_test::MakeLun;
using snap_test::MakeSnap;
using snap_test::SectionText;
using snap_test::SnapshotTest;

class SnapshotIdentityTest : public SnapshotTest {
  protected:
    // LUN 3's file with one snapshot per sid given, named by nameOf.
    template <typename NameOf>
    void WriteSnapshots(const std::set<int> &sids, NameOf nameOf) {
        std::string text;
        for (int sid : sids) {
            ORLOiSCSISnapshot s = MakeSnap(3, sid);
            snprintf(s.name, sizeof(s.name), "%s", nameOf(sid).c_str());
            text += SectionText(s);
        }
        WriteFile(LunFile(3), text);
    }
};

TEST_F(SnapshotIdentityTest, UnusedSidIsTheSmallestFreeOneOrNone) {
    AddLuns({3});
    ORLOiSCSILun lun = MakeLun(3);
    EXPECT_EQ(1, ORLOiSCSISnapshotUnusedSidFind(&lun, nullptr)) << log_.Dump();
    WriteSnapshots({1, 2, 4}, [](int sid) { return "s" + std::to_string(sid); });
    EXPECT_EQ(3, ORLOiSCSISnapshotUnusedSidFind(&lun, nullptr));

    std::set<int> all;
    for (int sid = 1; sid <= 256; ++sid) all.insert(sid);
    WriteSnapshots(all, [](int sid) { return "s" + std::to_string(sid); });
    EXPECT_EQ(-1, ORLOiSCSISnapshotUnusedSidFind(&lun, nullptr));
    // A list given is used instead of the file; sids out of range mark nothing.
    ORLOiSCSISnapshotFilter f = {};
    f.flags = ORLO_ISCSI_SNAPSHOT_FILTER_BEFORE;
    f.time = 1700000100 + 3;  // sids 1 and 2
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &f, &list_));
    ORLOiSCSISnapshot *odd = static_cast<ORLOiSCSISnapshot *>(calloc(1, sizeof(ORLOiSCSISnapshot)));
    odd->sid = 0;
    ORLOiSCSIListAppend(&list_, &odd->link);
    EXPECT_EQ(3, ORLOiSCSISnapshotUnusedSidFind(&lun, &list_));

    // A LUN whose snapshots cannot be read has no free sid.
    ORLOiSCSILun gone = MakeLun(8);
    EXPECT_EQ(-1, ORLOiSCSISnapshotUnusedSidFind(&gone, nullptr));
    EXPECT_TRUE(log_.Contains("Failed to get snapshots' conf for lid: 8")) << log_.Dump();
    EXPECT_EQ(-1, ORLOiSCSISnapshotUnusedSidFind(nullptr, nullptr));
}

TEST_F(SnapshotIdentityTest, UnusedNameFollowsTheDefaultNamesAndWrapsToZero) {
    AddLuns({3});
    char name[32];
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnusedNameFind(3, name, sizeof(name))) << log_.Dump();
    EXPECT_STREQ("SnapShot-1", name);
    // Names that merely begin like a default name count by their number; others not at all.
    WriteSnapshots({1, 2, 3, 4}, [](int sid) {
        const char *names[] = {"", "SnapShot-1", "SnapShot-2x", "snapshot-3", "SnapShot-300"};
        return std::string(names[sid]);
    });
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnusedNameFind(3, name, sizeof(name)));
    EXPECT_STREQ("SnapShot-3", name);

    std::set<int> all;
    for (int sid = 1; sid <= 256; ++sid) all.insert(sid);
    WriteSnapshots(all, [](int sid) { return "SnapShot-" + std::to_string(257 - sid); });
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnusedNameFind(3, name, sizeof(name)));
    EXPECT_STREQ("SnapShot-0", name);

    char tiny[10];  // "SnapShot-0" needs 11
    EXPECT_EQ(18990050u, ORLOiSCSISnapshotUnusedNameFind(3, tiny, sizeof(tiny)));
    EXPECT_STREQ("", tiny);
    EXPECT_EQ(18990201u, ORLOiSCSISnapshotUnusedNameFind(3, nullptr, 16));
    EXPECT_EQ(18990201u, ORLOiSCSISnapshotUnusedNameFind(3, name, 0));
    EXPECT_EQ(18990531u, ORLOiSCSISnapshotUnusedNameFind(8, name, sizeof(name)));
    EXPECT_TRUE(log_.Contains("Failed to get snapshots' info for lid: 8")) << log_.Dump();
}

TEST_F(SnapshotIdentityTest, QuantityAndItsLimit) {
    const std::string info = "/etc.defaults/orloinfo.conf";
    EXPECT_EQ(256, ORLOiSCSISnapshotQuantityLimitGet()) << "no file";
    const struct {
        const char *content;
        int limit;
    } cases[] = {
        {"other=1\n", 256},          {"max_snapshot_per_lun=1000\n", 256}, {"max_snapshot_per_lun=\"64\"\n", 64},
        {"max_snapshot_per_lun=0\n", 0}, {"max_snapshot_per_lun=-5\n", -5},   {"max_snapshot_per_lun=256\n", 256},
    };
    for (const auto &c : cases) {
        WriteFile(info, c.content);
        EXPECT_EQ(c.limit, ORLOiSCSISnapshotQuantityLimitGet()) << c.content;
    }

    AddLuns({3});
    ORLOiSCSILun lun = MakeLun(3);
    WriteFile(info, "max_snapshot_per_lun=2\n");
    EXPECT_EQ(0, ORLOiSCSISnapshotQuantityGet(&lun));
    EXPECT_FALSE(ORLOiSCSISnapshotIsQuantityLimitReached(&lun));
    WriteSnapshots({1, 5}, [](int sid) { return "s" + std::to_string(sid); });
    EXPECT_EQ(2, ORLOiSCSISnapshotQuantityGet(&lun));
    EXPECT_TRUE(ORLOiSCSISnapshotIsQuantityLimitReached(&lun));

    // Snapshots that cannot be counted count as the limit reached.
    WriteFile(info, "max_snapshot_per_lun=256\n");
    WriteFile(LunFile(3), "[SNAPSHOT_x]\n\tlid=3\n");
    EXPECT_EQ(18990033, ORLOiSCSISnapshotQuantityGet(&lun));
    EXPECT_TRUE(ORLOiSCSISnapshotIsQuantityLimitReached(&lun));

    EXPECT_EQ(-1, ORLOiSCSISnapshotQuantityGet(nullptr));
    log_.Clear();
    EXPECT_FALSE(ORLOiSCSISnapshotIsQuantityLimitReached(nullptr));
    EXPECT_TRUE(log_.Contains("Bad parameters")) << log_.Dump();
    EXPECT_EQ(3328, OLIBCErrGet());
}

TEST_F(SnapshotIdentityTest, UuidGenerateGivesFreshUuidsAndSearchesTheCacheNamedByTheBuffer) {
    std::set<std::string> seen;
    for (int i = 0; i < 20; ++i) {
        char uuid[37] = {};
        ASSERT_EQ(0u, ORLOiSCSISnapshotUuidGenerate(uuid)) << log_.Dump();
        ASSERT_EQ(36u, strlen(uuid));
        EXPECT_EQ('-', uuid[8]);
        seen.insert(uuid);
    }
    EXPECT_EQ(20u, seen.size());
    // The conflict search looks in the cache named by what the buffer held on entry: with
    // "q7z" there, its lock is the one taken, and a lock that cannot be taken fails.
    ASSERT_EQ(0, mkdir(Real("/tmp/iscsi/snapshot_cache_lock/iscsi_snapshot_q7z.conf.cache.lock").c_str(), 0700));
    char uuid[37] = "q7z";
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotUuidGenerate(uuid));
    EXPECT_TRUE(log_.Contains("iscsi_snapshot_q7z.conf.cache.lock")) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSISnapshotUuidGenerate(nullptr));
}

}  // namespace
