// A snapshot of mapped objects only reads just the LUNs that its mappings name.  Whatever
// the filter, the result must be the one of reading everything and then dropping what is
// not mapped: the same records in the same (file) order, the same pointers, the same
// failures, and the same warnings about the LUNs it reads.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "conf/conf_fixture.h"
#include "olibc.h"

namespace {

using namespace conf_test;
using target_test::kTargetConf;
using target_test::Section;

// Everything a snapshot holds, as text: LUNs (name and lid), targets, mappings.
std::string Dump(ORLOiSCSIConf *conf) {
    std::string out = "luns:";
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&conf->luns, link, lun) out += " " + std::string(lun->name) + "#" + std::to_string(lun->lid);
    out += " targets:";
    for (int tid : TidsOf(conf)) out += " " + std::to_string(tid);
    out += " maps:";
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        out += " T" + std::to_string(m->tid) + "L" + std::to_string(m->lid) + "n" + std::to_string(m->lun) + "->" +
               (m->pTrg ? std::to_string(m->pTrg->tid) : "-") + "/" + (m->pLun ? std::string(m->pLun->name) : "-");
    }
    return out;
}

class ConfMappedOnlyTest : public ConfTest {
  protected:
    // The snapshot with the filter, and the one assembled from the exported readers
    // (targets, every accepted LUN, mappings), linked and then filtered.
    void Compare(uint32_t flags, ORLOiSCSILunFilter f = {}) {
        SCOPED_TRACE(testing::Message() << std::hex << "flags 0x" << flags);
        log_.Clear();
        uint32_t got = Get(flags, f);
        std::string narrowed = Dump(&conf_);
        const std::vector<std::string> narrowedLog = log_.Lines();
        log_.Clear();
        f.flags = flags;
        ORLOiSCSIConf full = {};
        ORLOiSCSIListInit(&full.luns);
        ORLOiSCSIListInit(&full.targets);
        ORLOiSCSIListInit(&full.mappings);
        ORLOiSCSITargetFilter tf = {};
        tf.flags = f.flags;
        tf.tid = f.tid;
        tf.name = f.name;
        tf.iqn = f.iqn;
        tf.tids = f.tids;
        tf.tidCount = f.tidCount;
        uint32_t want = 0;
        if ((flags & 0x1000) && ORLOiSCSITargetConfLoad(&tf, &full.targets) != 0) want = 18990724;
        if (want == 0 && (flags & 0x2000) && ORLOiSCSILunConfLoad(&f, &full.luns) != 0) want = 18990550;
        if (want == 0 && (flags & 0x4000) && ORLOiSCSITargetConfMappingLoad(&f, &full) != 0) want = 18990731;
        if (want == 0) {
            EXPECT_EQ(0, ORLOiSCSITargetConfMappingMake(&full));
            want = ORLOiSCSIConfFilter(&f, &full);
        }
        EXPECT_EQ(want, got);
        if (want == 0) {
            EXPECT_EQ(log_.Lines(), narrowedLog);  // the same warnings, as often
        } else {
            ORLOiSCSIConfFree(&full);
        }
        EXPECT_EQ(Dump(&full), narrowed);
        ORLOiSCSIConfFree(&full);
    }
};

TEST_F(ConfMappedOnlyTest, TheResultIsThatOfFilteringEverything) {
    WriteFile(kTargetConf, Section(1, "one") + Section(2, "two") + Section(3, "three", "\tbkp_obj=1\n"));
    // LUN 2 twice (two sections of one lid), LUN 5 written "05", LUN 6 a backup object.
    std::string twin = LunSection(2);
    twin.replace(twin.find("name=lun2"), 9, "name=twin");
    twin.replace(1, 8, "twin0000");
    std::string five = LunSection(5);
    five.replace(five.find("lid=5"), 5, "lid=05");
    WriteFile(kLunConf, LunSection(1) + LunSection(2) + LunSection(3) + twin + LunSection(4) + five +
                            LunSection(6, true) + LunSection(7));
    WriteFile(kMappingConf, MapSection(1, 2, 0) + MapSection(1, 1, 1) + MapSection(2, 5, 0) + MapSection(1, 9, 2) +
                                MapSection(8, 3, 0) + MapSection(3, 6, 0) + MapSection(2, 2, 1) +
                                "[iSCSI_MAP_T1_L1]\n\ttid=2\n\tlid=7\n\tlun=3\n");  // shadowed by the first
    ORLOiSCSILunFilter f = {};
    for (uint32_t flags : {0x7200u, 0x7600u, 0x3200u, 0x6200u, 0x407200u, 0x200u}) Compare(flags);
    for (int tid : {1, 2, 3, 4, 8}) {
        f = {};
        f.tid = tid;
        Compare(0x7201, f);
        Compare(0x7601, f);
        Compare(0x407201, f);  // the first accepted LUN only, mapped or not
    }
    f = {};
    f.tid = 1;
    f.lid = 2;
    Compare(0x7221, f);
    f.lun = 1;
    Compare(0x7241, f);
    f = {};
    f.name = "lun1";
    Compare(0x7210, f);
    f.name = nullptr;  // reported for every LUN section either way
    Compare(0x7211, f);
    f = {};
    int32_t lids[] = {1, 2, 7};
    f.lids = lids;
    f.lidCount = 3;
    Compare(0x7280, f);

    // The LUNs mapped to target 1 are LUNs 1 and 2, in file order (a mapping points at the
    // first LUN of its lid, so the second section of lid 2 is not kept); LUN 9 does not
    // exist, so its mapping goes.
    f = {};
    f.tid = 1;
    ASSERT_EQ(0u, Get(0x7201, f)) << log_.Dump();
    EXPECT_EQ("luns: lun1#1 lun2#2 targets: 1 maps: T1L2n0->1/lun2 T1L1n1->1/lun1", Dump(&conf_));
    ExpectCountsMatchChains();
    f.tid = 2;  // LUN 5 stored as "05"; the shadowed duplicate section does not count
    ASSERT_EQ(0u, Get(0x7201, f)) << log_.Dump();
    EXPECT_EQ("luns: lun2#2 lun5#5 targets: 2 maps: T2L5n0->2/lun5 T2L2n1->2/lun2", Dump(&conf_));
}

TEST_F(ConfMappedOnlyTest, AnUnmappedLunStillFailsOrWarnsAsWhenEverythingIsRead) {
    WriteFile(kTargetConf, Section(1, "one"));
    WriteFile(kMappingConf, MapSection(1, 1, 0));
    ORLOiSCSILunFilter f = {};
    f.tid = 1;

    // A LUN section that cannot become a record fails the snapshot, mapped or not.
    WriteFile(kLunConf, LunSection(1) + "[LUN_broken]\n\tlid=3\n\tname=broken\n");
    log_.Clear();
    EXPECT_EQ(18990550u, Get(0x7201, f));
    ExpectEmpty();
    Compare(0x7201, f);

    // An unmapped LUN without a serial is read, and warned about, as before.
    std::string noSerial = LunSection(3);
    noSerial.erase(noSerial.find("\tvpd_unit_serial"), std::string("\tvpd_unit_serial=serial3\n").size());
    WriteFile(kLunConf, LunSection(1) + noSerial);
    log_.Clear();
    ASSERT_EQ(0u, Get(0x7201, f)) << log_.Dump();
    EXPECT_EQ(1, LinesWith("warning: vpd_unit_serial not found in config of 'lun3'")) << log_.Dump();
    EXPECT_EQ("luns: lun1#1 targets: 1 maps: T1L1n0->1/lun1", Dump(&conf_));

    // A mapping added later names a LUN the previous snapshot left unread: the next
    // snapshot reads it.
    WriteFile(kLunConf, LunSection(1) + LunSection(3));
    ASSERT_EQ(0u, Get(0x7201, f));
    EXPECT_EQ("luns: lun1#1 targets: 1 maps: T1L1n0->1/lun1", Dump(&conf_));
    WriteFile(kMappingConf, MapSection(1, 1, 0) + MapSection(1, 3, 1));
    ASSERT_EQ(0u, Get(0x7201, f));
    EXPECT_EQ("luns: lun1#1 lun3#3 targets: 1 maps: T1L1n0->1/lun1 T1L3n1->1/lun3", Dump(&conf_));
}

}  // namespace
