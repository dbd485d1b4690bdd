// The mapping file: exact sections written, replaced in place and removed, the refusal
// of out-of-range identifiers before anything changes, the failures of each file step
// with their log lines, and the load's filter and required keys.
#include <gtest/gtest.h>

#include <sys/stat.h>

#include "conf/conf_fixture.h"
#include "olibc.h"

namespace {

using namespace conf_test;

class MappingConfTest : public ConfTest {};

TEST_F(MappingConfTest, SectionsAreWrittenReplacedAndRemovedExactly) {
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingRemove(1, 5)) << log_.Dump();  // no file: nothing to do
    EXPECT_FALSE(Exists(kMappingConf));

    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(1, 5, 0)) << log_.Dump();
    EXPECT_EQ("[iSCSI_MAP_T1_L5]\n\ttid=1\n\tlid=5\n\tlun=0\n", ReadFile(kMappingConf));
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(256, 1024, 255));
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(2, 5, 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(1, 5, 7));  // same tid and lid: replaced in place
    EXPECT_EQ(MapSection(1, 5, 7) + MapSection(256, 1024, 255) + MapSection(2, 5, 3), ReadFile(kMappingConf));

    // Out of range: refused, the file untouched.
    const std::string before = ReadFile(kMappingConf);
    const int bad[][3] = {{0, 5, 0}, {257, 5, 0}, {1, 0, 0}, {1, 1025, 0}, {1, 5, -1}, {1, 5, 256}};
    for (const auto &b : bad) EXPECT_EQ(18990004u, ORLOiSCSITargetConfMappingAdd(b[0], b[1], b[2])) << b[0];
    EXPECT_EQ(18990004u, ORLOiSCSITargetConfMappingRemove(0, 5));
    EXPECT_EQ(18990004u, ORLOiSCSITargetConfMappingRemove(1, 1025));
    EXPECT_EQ(before, ReadFile(kMappingConf));

    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingRemove(256, 1024));
    EXPECT_EQ(MapSection(1, 5, 7) + MapSection(2, 5, 3), ReadFile(kMappingConf));
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingRemove(256, 1024));  // already gone: success
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingRemove(5, 1));       // never there (tid and lid swapped)
    EXPECT_EQ(MapSection(1, 5, 7) + MapSection(2, 5, 3), ReadFile(kMappingConf));

    // What is written is what a snapshot reads back.
    ASSERT_EQ(0u, Get(0x4000));
    EXPECT_EQ((std::vector<MapView>{{1, 5, 7, 0, 0}, {2, 5, 3, 0, 0}}), MapsOf(&conf_));
}

TEST_F(MappingConfTest, FileStepFailuresReturnTheirCodesWithTheirLogLines) {
    // The file is a directory: it cannot be read, and a section cannot be removed from it.
    ASSERT_EQ(0, mkdir(Real(kMappingConf).c_str(), 0755));
    EXPECT_EQ(18990303u, ORLOiSCSITargetConfMappingAdd(1, 5, 0));
    EXPECT_TRUE(log_.Contains("Failed to get section: iSCSI_MAP_T1_L5 from /usr/orlo/etc/iscsi_mapping.conf, "
                              "errno=0x"))
        << log_.Dump();
    log_.Clear();
    EXPECT_EQ(18990306u, ORLOiSCSITargetConfMappingRemove(1, 5));
    EXPECT_TRUE(log_.Contains("OLIBCFileRemoveSection(\"/usr/orlo/etc/iscsi_mapping.conf\", \"iSCSI_MAP_T1_L5\") "
                              "failed, err=[0x"))
        << log_.Dump();
    log_.Clear();
    EXPECT_EQ(18990731u, Get(0x4000));
    EXPECT_TRUE(log_.Contains("Failed to enum targets' sections, errno=0X")) << log_.Dump();
    ASSERT_EQ(0, rmdir(Real(kMappingConf).c_str()));

    // The configuration directory is not a directory: the file cannot be made.
    orlotest::RemoveTree(Real("/usr/orlo/etc"));
    WriteFile("/usr/orlo/etc", "");
    log_.Clear();
    EXPECT_EQ(18990023u, ORLOiSCSITargetConfMappingAdd(1, 5, 0));
    EXPECT_TRUE(log_.Contains("Failed to touch /usr/orlo/etc/iscsi_mapping.conf")) << log_.Dump();
}

TEST_F(MappingConfTest, LoadSelectsByTidLidAndNumberAndNeedsEveryKey) {
    WriteFile(kMappingConf, MapSection(1, 1, 0) + MapSection(1, 2, 1) + MapSection(2, 1, 1) +
                                "[iSCSI_MAP_T3_L3]\n\ttid=3\n\tlid=3\n");
    ORLOiSCSILunFilter f = {};
    auto load = [&](uint32_t flags) {
        f.flags = flags;
        ORLOiSCSIConfFree(&conf_);
        EXPECT_EQ(0u, ORLOiSCSITargetConfMappingLoad(&f, &conf_)) << log_.Dump();
        std::vector<std::pair<int, int>> out;
        for (const MapView &m : MapsOf(&conf_)) out.emplace_back(m.tid, m.lid);
        return out;
    };
    using Pairs = std::vector<std::pair<int, int>>;
    f.tid = 1;
    EXPECT_EQ((Pairs{{1, 1}, {1, 2}}), load(0x4001));
    f.lid = 1;
    EXPECT_EQ((Pairs{{1, 1}, {2, 1}}), load(0x4020));
    EXPECT_EQ((Pairs{{1, 1}}), load(0x4021));  // every criterion set must hold
    f.lun = 1;
    EXPECT_EQ((Pairs{{1, 2}, {2, 1}}), load(0x4040));  // the section without "lun" is refused
    f.tid = 3;
    EXPECT_TRUE(load(0x4041).empty());  // tid 3 matches, but the missing "lun" refuses it
    f.lid = 3;
    f.tid = 9;
    EXPECT_TRUE(load(0x4001).empty());

    // Accepted without a "lun" key: the load fails and keeps nothing it had built.
    f = {};
    f.flags = 0x4000;
    log_.Clear();
    EXPECT_EQ(18990033u, ORLOiSCSITargetConfMappingLoad(&f, &conf_));
    EXPECT_EQ(0, conf_.mappings.count);
    EXPECT_EQ(0, ChainLength(&conf_.mappings));
    EXPECT_TRUE(log_.Contains("\"lun\") failed")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("ORLOiSCSITargetMappingObjectCreate(")) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetConfMappingLoad(nullptr, &conf_));

    // The record builder on its own: every key required, numbers in decimal.
    POLIBC_SZHASH hash = OLIBCSzHashAlloc(8);
    ASSERT_NE(nullptr, hash);
    ASSERT_EQ(0, OLIBCSzHashSetValue(&hash, "tid", "256"));
    ASSERT_EQ(0, OLIBCSzHashSetValue(&hash, "lid", "1024"));
    ASSERT_EQ(0, OLIBCSzHashSetValue(&hash, "lun", "255"));
    ORLOiSCSIMapping *m = nullptr;
    ASSERT_EQ(0u, ORLOiSCSITargetMappingObjectCreate(hash, &m));
    ASSERT_NE(nullptr, m);
    EXPECT_EQ(256, m->tid);
    EXPECT_EQ(1024, m->lid);
    EXPECT_EQ(255, m->lun);
    EXPECT_EQ(nullptr, m->pLun);
    EXPECT_EQ(nullptr, m->pTrg);
    free(m);
    OLIBCSzHashRemove(hash, "lid");
    m = nullptr;
    log_.Clear();
    EXPECT_EQ(18990033u, ORLOiSCSITargetMappingObjectCreate(hash, &m));
    EXPECT_EQ(nullptr, m);
    char line[128];
    snprintf(line, sizeof(line), "OLIBCSzHashGetValue(%p, \"lid\") failed", static_cast<void *>(hash));
    EXPECT_TRUE(log_.Contains(line)) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetMappingObjectCreate(nullptr, &m));
    OLIBCSzHashFree(hash);
}

}  // namespace
