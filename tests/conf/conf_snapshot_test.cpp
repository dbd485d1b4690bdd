// The configuration snapshot: what each kind bit loads, how mappings are linked into the
// snapshot's own records, what "mapped only" keeps (in its deliberate order), that every
// failure returns the failed step's code with nothing left allocated, and the two
// readers that go through it.
#include <gtest/gtest.h>

#include <atomic>
#include <regex>
#include <set>
#include <thread>

#include "conf/conf_fixture.h"
#include "olibc.h"

namespace {

using namespace conf_test;
using target_test::kTargetConf;
using target_test::kTargetLock;
using target_test::Section;

using Ints = std::vector<int>;
using Maps = std::vector<MapView>;

class ConfSnapshotTest : public ConfTest {
  protected:
    // Targets 1, 2 and 3 (a backup object); LUNs 1, 2, 3 and 4 (a backup object);
    // mappings: two resolved ones on target 1, one to a missing LUN 9 on target 2, one to a
    // missing target 7 for LUN 3, one of target 3 to backup LUN 4.
    void WriteAll() {
        WriteFile(kTargetConf, Section(1, "one") + Section(2, "two") + Section(3, "three", "\tbkp_obj=1\n"));
        WriteFile(kLunConf, LunSection(1) + LunSection(2) + LunSection(3) + LunSection(4, true));
        WriteFile(kMappingConf, MapSection(1, 1, 0) + MapSection(1, 2, 1) + MapSection(2, 9, 0) +
                                    MapSection(7, 3, 0) + MapSection(3, 4, 0));
    }
    bool Matches(const std::string &pattern) const {
        const std::regex re(pattern);
        for (const std::string &l : log_.Lines())
            if (std::regex_match(l, re)) return true;
        return false;
    }
};

TEST_F(ConfSnapshotTest, KindBitsChooseWhatIsLoadedAndMappingsPointIntoTheSnapshot) {
    // Nothing stored at all: every kind loads as empty.
    ASSERT_EQ(0u, Get(0x7400)) << log_.Dump();
    ExpectEmpty();

    WriteAll();
    ASSERT_EQ(0u, Get(0x2000)) << log_.Dump();
    EXPECT_EQ((Ints{1, 2, 3, 4}), LidsOf(&conf_));  // not exactly 0x7000: backup objects too
    EXPECT_TRUE(TidsOf(&conf_).empty());
    EXPECT_TRUE(MapsOf(&conf_).empty());
    ASSERT_EQ(0u, Get(0x2200));  // mapped only, without mappings: nothing is mapped
    ExpectEmpty();

    ASSERT_EQ(0u, Get(0x1000));
    EXPECT_EQ((Ints{1, 2, 3}), TidsOf(&conf_));
    EXPECT_TRUE(LidsOf(&conf_).empty());

    ASSERT_EQ(0u, Get(0x4000));  // mappings alone resolve to nothing
    EXPECT_EQ((Maps{{1, 1, 0, 0, 0}, {1, 2, 1, 0, 0}, {2, 9, 0, 0, 0}, {7, 3, 0, 0, 0}, {3, 4, 0, 0, 0}}),
              MapsOf(&conf_));

    ASSERT_EQ(0u, Get(0x7000)) << log_.Dump();  // exactly 0x7000: backup objects left out
    EXPECT_EQ((Ints{1, 2}), TidsOf(&conf_));
    EXPECT_EQ((Ints{1, 2, 3}), LidsOf(&conf_));
    EXPECT_EQ((Maps{{1, 1, 0, 1, 1}, {1, 2, 1, 1, 2}, {2, 9, 0, 2, 0}, {7, 3, 0, 0, 3}, {3, 4, 0, 0, 0}}),
              MapsOf(&conf_));
    ExpectCountsMatchChains();

    // The pointers are the snapshot's own records, not copies.
    std::set<const void *> records;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLOiSCSITarget *t;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_LUN_LIST_FOREACH(&conf_.luns, link, lun) records.insert(lun);
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf_.targets, link, t) records.insert(t);
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf_.mappings, link, m) {
        if (m->pLun != nullptr) {
            EXPECT_EQ(1u, records.count(m->pLun));
        }
        if (m->pTrg != nullptr) {
            EXPECT_EQ(1u, records.count(m->pTrg));
        }
    }

    ASSERT_EQ(0u, Get(0x7400));
    EXPECT_EQ((Ints{1, 2, 3}), TidsOf(&conf_));
    EXPECT_EQ((Ints{1, 2, 3, 4}), LidsOf(&conf_));
    EXPECT_EQ((MapView{3, 4, 0, 3, 4}), MapsOf(&conf_).back());

    // Linking on its own: a NULL snapshot is refused with the platform's bad-parameter code.
    OLIBCErrSet(OLIBC_ERR_NONE);
    EXPECT_EQ(-1, ORLOiSCSITargetConfMappingMake(nullptr));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
}

TEST_F(ConfSnapshotTest, MappedOnlyJudgesObjectsBeforeDroppingHalfResolvedMappings) {
    WriteAll();
    ASSERT_EQ(0u, Get(0x7200)) << log_.Dump();
    // Not exactly 0x7000, so backup objects are loaded.  Target 2 stays although its only
    // mapping (to missing LUN 9) goes; LUN 3 likewise (its only mapping names missing
    // target 7).
    EXPECT_EQ((Ints{1, 2, 3}), TidsOf(&conf_));
    EXPECT_EQ((Ints{1, 2, 3, 4}), LidsOf(&conf_));
    EXPECT_EQ((Maps{{1, 1, 0, 1, 1}, {1, 2, 1, 1, 2}, {3, 4, 0, 3, 4}}), MapsOf(&conf_));
    ExpectCountsMatchChains();

    // Without target 3 and LUN 4 in the files their mapping lacks both ends and goes; an
    // unmapped LUN goes too.
    WriteFile(kTargetConf, Section(1, "one") + Section(2, "two"));
    WriteFile(kLunConf, LunSection(1) + LunSection(2) + LunSection(3) + LunSection(5));
    ASSERT_EQ(0u, Get(0x7200)) << log_.Dump();
    EXPECT_EQ((Ints{1, 2}), TidsOf(&conf_));
    EXPECT_EQ((Ints{1, 2, 3}), LidsOf(&conf_));  // LUN 5 is not mapped at all
    EXPECT_EQ((Maps{{1, 1, 0, 1, 1}, {1, 2, 1, 1, 2}}), MapsOf(&conf_));
    ExpectCountsMatchChains();
    WriteAll();

    ORLOiSCSILunFilter f = {};
    f.tid = 1;  // the target's mappings (0x7201)
    ASSERT_EQ(0u, Get(0x7201, f));
    EXPECT_EQ((Ints{1}), TidsOf(&conf_));
    EXPECT_EQ((Ints{1, 2}), LidsOf(&conf_));
    EXPECT_EQ(2, conf_.mappings.count);

    f = {};
    f.tid = 1;
    f.lid = 2;  // one mapping by tid and lid, backup objects included (0x7621)
    ASSERT_EQ(0u, Get(0x7621, f));
    EXPECT_EQ((Ints{1}), TidsOf(&conf_));
    EXPECT_EQ((Ints{2}), LidsOf(&conf_));
    EXPECT_EQ((Maps{{1, 2, 1, 1, 2}}), MapsOf(&conf_));

    f = {};
    f.lid = 1;  // the targets a LUN is mapped to (0x7220)
    ASSERT_EQ(0u, Get(0x7220, f));
    EXPECT_EQ((Ints{1}), TidsOf(&conf_));
    EXPECT_EQ((Maps{{1, 1, 0, 1, 1}}), MapsOf(&conf_));

    f = {};
    f.tid = 1;
    f.lun = 1;  // who uses LUN number 1 of target 1
    ASSERT_EQ(0u, Get(0x7241, f));
    EXPECT_EQ((Maps{{1, 2, 1, 1, 2}}), MapsOf(&conf_));
    EXPECT_EQ((Ints{2}), LidsOf(&conf_));

    f = {};
    f.tid = 3;  // with backup objects: target 3 and its backup LUN are kept
    ASSERT_EQ(0u, Get(0x7601, f));
    EXPECT_EQ((Maps{{3, 4, 0, 3, 4}}), MapsOf(&conf_));

    // The filter on its own: without 0x200 it changes nothing; NULL is refused.
    ASSERT_EQ(0u, Get(0x7400));
    ORLOiSCSILunFilter keep = {};
    keep.flags = 0x7400;
    EXPECT_EQ(0u, ORLOiSCSIConfFilter(&keep, &conf_));
    EXPECT_EQ(4, conf_.luns.count);
    EXPECT_EQ(5, conf_.mappings.count);
    EXPECT_EQ(18990004u, ORLOiSCSIConfFilter(nullptr, &conf_));
    EXPECT_EQ(18990004u, ORLOiSCSIConfFilter(&keep, nullptr));
}

TEST_F(ConfSnapshotTest, FailuresReturnTheFailedStepsCodeAndLeaveNothing) {
    ORLOiSCSILunFilter f = {};
    EXPECT_EQ(18990003u, ORLOiSCSIConfGet(nullptr, &conf_));
    EXPECT_EQ(18990003u, ORLOiSCSIConfGet(&f, nullptr));

    // Every file broken: the targets are read first.
    const std::string goodTargets = Section(1, "one") + Section(2, "two");
    const std::string goodLuns = LunSection(1) + LunSection(2);
    WriteFile(kTargetConf, goodTargets + Section(5, "broken", "", "iqn"));
    WriteFile(kLunConf, goodLuns + "[LUN_broken]\n\tlid=3\n");
    WriteFile(kMappingConf, MapSection(1, 1, 0) + "[iSCSI_MAP_T1_L2]\n\ttid=1\n\tlid=2\n");
    log_.Clear();
    EXPECT_EQ(18990724u, Get(0x7000));
    ExpectEmpty();
    EXPECT_TRUE(Matches("iSCSI:iscsi_conf_get\\.cpp:\\d+:Load ORLOiSCSITargetConfLoad\\(0x[0-9a-f]+, 0x[0-9a-f]+\\) "
                        "failed, err=Failed to get hash value"))
        << log_.Dump();
    EXPECT_FALSE(log_.Contains("ORLOiSCSILunConfLoad(")) << log_.Dump();

    // Targets good: the LUNs fail, and the targets already loaded are released (the
    // sanitizer build reports them otherwise).
    WriteFile(kTargetConf, goodTargets);
    log_.Clear();
    EXPECT_EQ(18990550u, Get(0x7000));
    ExpectEmpty();
    EXPECT_TRUE(Matches("iSCSI:iscsi_conf_get\\.cpp:\\d+:Load ORLOiSCSILunConfLoad\\(0x[0-9a-f]+, 0x[0-9a-f]+\\) "
                        "failed, err=Failed to get hash value"))
        << log_.Dump();
    EXPECT_FALSE(log_.Contains("ORLOiSCSITargetConfMappingLoad(")) << log_.Dump();

    // LUNs good: the mappings fail after one record was built; all three lists are freed.
    WriteFile(kLunConf, goodLuns);
    log_.Clear();
    EXPECT_EQ(18990731u, Get(0x7000));
    ExpectEmpty();
    EXPECT_TRUE(log_.Contains("OLIBCSzHashGetValue(")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("\"lun\") failed")) << log_.Dump();
    EXPECT_TRUE(Matches("iSCSI:iscsi_conf_get\\.cpp:\\d+:Load ORLOiSCSITargetConfMappingLoad\\(0x[0-9a-f]+, "
                        "0x[0-9a-f]+\\) failed, err=Failed to get hash value"))
        << log_.Dump();

    // A kind that is not asked for is not read, broken or not.
    EXPECT_EQ(0u, Get(0x3000)) << log_.Dump();
    EXPECT_EQ((Ints{1, 2}), TidsOf(&conf_));
    EXPECT_EQ((Ints{1, 2}), LidsOf(&conf_));

    // Freeing twice, or NULL, is harmless.
    ORLOiSCSIConfFree(&conf_);
    ExpectEmpty();
    ORLOiSCSIConfFree(&conf_);
    ORLOiSCSIConfFree(nullptr);
    ORLOiSCSIConf zeroed = {};
    ORLOiSCSIConfFree(&zeroed);
    ExpectEmpty();
}

// Each file is read under its own lock, released before the next file's lock is taken:
// while the loader waits for the mapping file, the target and LUN files are free.
TEST_F(ConfSnapshotTest, FilesAreLockedOneAfterTheOther) {
    WriteAll();
    int mapHandle = -1;
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kMappingLock, 1, 0, &mapHandle));
    std::atomic<uint32_t> result{99};
    ORLOiSCSIConf conf = {};
    std::thread loader([&] {
        ORLOiSCSILunFilter f = {};
        f.flags = 0x7000;
        result = ORLOiSCSIConfGet(&f, &conf);
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_EQ(99u, result.load());  // still waiting for the mapping file
    for (const char *lock : {kTargetLock, kLunLock}) {
        int h = -1;
        EXPECT_EQ(1, OLIBCFileLockTimeByFile(lock, 1, 0, &h)) << lock;
        if (h >= 0) OLIBCFileUnlockByFile(h);
    }
    OLIBCFileUnlockByFile(mapHandle);
    loader.join();
    EXPECT_EQ(0u, result.load()) << log_.Dump();
    EXPECT_EQ(5, conf.mappings.count);
    ORLOiSCSIConfFree(&conf);
}

TEST_F(ConfSnapshotTest, LunReaderByFilterGoesThroughTheSnapshot) {
    WriteAll();
    ORLOiSCSILunList list = {};
    ORLOiSCSILunFilter f = {};
    f.flags = 0x7201;  // the LUNs mapped to target 1
    f.tid = 1;
    ASSERT_EQ(0u, ORLOiSCSILunConfLoadByFilter(&f, &list)) << log_.Dump();
    EXPECT_EQ(2, list.count);
    EXPECT_EQ(2, ChainLength(&list));
    f.flags = 0x2020;
    f.lid = 4;  // appended after what the list held
    ASSERT_EQ(0u, ORLOiSCSILunConfLoadByFilter(&f, &list));
    std::vector<int> lids;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, lun) lids.push_back(lun->lid);
    EXPECT_EQ((Ints{1, 2, 4}), lids);
    EXPECT_EQ(3, list.count);
    EXPECT_STREQ("lun4", ORLO_ISCSI_LUN_OF(list.head.prev)->name);

    // A failure empties the list and is logged with the snapshot call.
    WriteFile(kLunConf, "[LUN_broken]\n\tlid=3\n");
    log_.Clear();
    f.flags = 0x7000;
    EXPECT_EQ(18990550u, ORLOiSCSILunConfLoadByFilter(&f, &list));
    EXPECT_EQ(0, list.count);
    EXPECT_EQ(nullptr, ORLOiSCSIListFirst(&list));
    EXPECT_TRUE(Matches("iSCSI:iscsi_lun_conf_load_by_filter\\.cpp:\\d+:ORLOiSCSILunConfLoadByFilter "
                        "ORLOiSCSIConfGet\\(0x[0-9a-f]+, 0x[0-9a-f]+\\) failed, err=Failed to load LUN config"))
        << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSILunConfLoadByFilter(nullptr, &list));
    EXPECT_EQ(18990003u, ORLOiSCSILunConfLoadByFilter(&f, nullptr));
    ORLOiSCSILunListFree(&list);
}

TEST_F(ConfSnapshotTest, TargetQueryGoesThroughTheSnapshot) {
    WriteAll();
    ORLOiSCSITargetList list = {};
    ORLOiSCSITargetFilter f = {};
    ASSERT_EQ(0u, ORLOiSCSITargetGetByFilter(&f, &list)) << log_.Dump();  // flags 0: every target
    EXPECT_EQ((Ints{1, 2, 3}), target_test::Tids(&list));
    ORLOiSCSITargetListFree(&list);

    // Targets and mappings without LUNs, mapped only: the targets some mapping points to.
    f.flags = 0x5200;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByFilter(&f, &list)) << log_.Dump();
    EXPECT_EQ((Ints{1, 2, 3}), target_test::Tids(&list));
    ORLOiSCSITargetListFree(&list);
    f.flags = 0x7201;  // one target's mappings: target 2 stays though its LUN is missing
    f.tid = 2;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByFilter(&f, &list));
    EXPECT_EQ((Ints{2}), target_test::Tids(&list));
    EXPECT_EQ(1, ChainLength(&list));
    ORLOiSCSITargetListFree(&list);
    f.tid = 4;  // no such target
    ASSERT_EQ(0u, ORLOiSCSITargetGetByFilter(&f, &list));
    EXPECT_EQ(0, list.count);

    // A broken mapping file fails a query that loads mappings, not one that does not.
    WriteFile(kMappingConf, "[iSCSI_MAP_T1_L2]\n\ttid=1\n");
    log_.Clear();
    f.flags = 0x5000;
    EXPECT_EQ(18990425u, ORLOiSCSITargetGetByFilter(&f, &list));
    EXPECT_EQ(0, list.count);
    EXPECT_TRUE(Matches("iSCSI:iscsi_target_get_by_filter\\.cpp:\\d+:ORLOiSCSITargetGetByFilter "
                        "ORLOiSCSIConfGet\\(0x[0-9a-f]+, 0x[0-9a-f]+\\) failed, err=Failed to load mapping config"))
        << log_.Dump();
    f.flags = 0x1001;
    f.tid = 2;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByFilter(&f, &list));
    EXPECT_EQ((Ints{2}), target_test::Tids(&list));
    ORLOiSCSITargetListFree(&list);
    EXPECT_EQ(18990003u, ORLOiSCSITargetGetByFilter(&f, nullptr));
}

}  // namespace
