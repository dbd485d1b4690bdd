// Reading LUN sections: the one-pass reader, the type rules, the defaults of missing keys
// and the filter, on hand-written files.
#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "lun_fixture.h"

namespace {

using lun_test::kGlobalConf;
using lun_test::LunTest;
using lun_test::Records;
using lun_test::UuidOf;

using Keys = std::vector<std::pair<std::string, std::string>>;

std::string Section(const std::string &name, const Keys &keys) {
    std::string s = "[" + name + "]\n";
    for (const auto &kv : keys) s += "\t" + kv.first + "=" + kv.second + "\n";
    return s;
}

// The keys of a section as the library writes them, with some replaced or dropped
// (a value of "-" drops the key).
Keys LunKeys(int lid, const std::map<std::string, std::string> &changes = {}) {
    Keys keys = {{"lid", std::to_string(lid)},
                 {"rootpath", "/volume1"},
                 {"name", "lun" + std::to_string(lid)},
                 {"uuid", UuidOf(lid)},
                 {"vpd_unit_serial", "serial" + std::to_string(lid)},
                 {"bytes", "1048576"},
                 {"restored_time", "0"},
                 {"devtype", "1"},
                 {"pre_alloc", "yes"},
                 {"bkp_obj", "0"},
                 {"vaai_support", "no"}};
    for (const auto &c : changes) {
        bool found = false;
        for (auto &kv : keys)
            if (kv.first == c.first) {
                kv.second = c.second;
                found = true;
            }
        if (!found) keys.emplace_back(c.first, c.second);
    }
    Keys out;
    for (const auto &kv : keys)
        if (kv.second != "-") out.push_back(kv);
    return out;
}

std::string LunSection(int lid, const std::map<std::string, std::string> &changes = {}) {
    return Section("LUN_" + UuidOf(lid), LunKeys(lid, changes));
}

std::vector<int> Lids(ORLOiSCSILunList *list) {
    std::vector<int> lids;
    for (const ORLOiSCSILun &l : Records(list)) lids.push_back(l.lid);
    return lids;
}

class LunConfReadTest : public LunTest {
  protected:
    // Loads the global file with flags (and the filter's operands) into a fresh list.
    uint32_t Load(ORLOiSCSILunFilter filter) {
        ORLOiSCSILunListFree(&list_);
        return ORLOiSCSILunConfLoad(&filter, &list_);
    }
    std::vector<int> LoadLids(ORLOiSCSILunFilter filter) {
        EXPECT_EQ(0u, Load(filter)) << log_.Dump();
        return Lids(&list_);
    }
};

TEST_F(LunConfReadTest, MissingFileIsEmptyAndSectionsKeepTheirFileOrder) {
    EXPECT_EQ(0u, ORLOiSCSILunConfGetAll(&list_, 0));
    EXPECT_EQ(0, list_.count);
    EXPECT_EQ(&list_.head, list_.head.next);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    // Comments, blank lines, a stray line before the first header, CRLF endings and blanks
    // around "=" do not disturb the reader; names keep their inner spaces.
    WriteFile(kGlobalConf, "stray=1\n# LUNs\n" + LunSection(3, {{"name", "my third lun"}}) + "\n; note\n" +
                               "[LUN_" + UuidOf(1) + "]\r\n\tlid = 1\r\n\tname=lun1\r\n\trootpath=/volume1\r\n" +
                               "\tbytes=5\r\n\tpre_alloc=yes\r\n\tuuid=" + UuidOf(1) + "\r\n" + LunSection(2));
    ASSERT_EQ(0u, ORLOiSCSILunConfGetAll(&list_, 0)) << log_.Dump();
    ASSERT_EQ(3, list_.count);
    std::vector<ORLOiSCSILun> luns = Records(&list_);
    ASSERT_EQ(3u, luns.size());
    EXPECT_EQ(3, luns[0].lid);
    EXPECT_STREQ("my third lun", luns[0].name);
    EXPECT_EQ(1, luns[1].lid);
    EXPECT_EQ(5u, luns[1].size);
    EXPECT_STREQ(UuidOf(1).c_str(), luns[1].uuid);
    EXPECT_EQ(2, luns[2].lid);
    EXPECT_EQ(-1, luns[2].lockHandle) << "a loaded record holds no lock";
    // The one section without a serial says so.
    EXPECT_TRUE(log_.Contains("lun_struct_create.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("warning: vpd_unit_serial not found in config of 'lun1'")) << log_.Dump();

    // Reading again appends to what the list holds; freeing empties it.
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByLid(2, 0, &list_));
    EXPECT_EQ(4, list_.count);
    ORLOiSCSILunListFree(&list_);
    EXPECT_EQ(0, list_.count);
    EXPECT_EQ(&list_.head, list_.head.next);
}

TEST_F(LunConfReadTest, MissingRequiredKeyFailsTheReadOnlyWhenTheSectionIsAccepted) {
    WriteFile(kGlobalConf, LunSection(1) + LunSection(2, {{"pre_alloc", "-"}}) + LunSection(3));
    EXPECT_EQ(18990033u, ORLOiSCSILunConfGetAll(&list_, 0));
    EXPECT_EQ(0, list_.count) << "a failed read leaves the list empty";
    EXPECT_EQ(&list_.head, list_.head.next);
    EXPECT_TRUE(log_.Contains("\"pre_alloc\") failed")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("iscsi_lun_conf_load_by_path.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to create LUN struct.")) << log_.Dump();

    // Passed over by the filter, the same section does no harm.
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByLid(3, 0, &list_)) << log_.Dump();
    EXPECT_EQ(std::vector<int>({3}), Lids(&list_));

    // The required keys are checked in the order lid, name, rootpath, bytes, pre_alloc.
    ORLOiSCSILunListFree(&list_);
    WriteFile(kGlobalConf, LunSection(4, {{"bytes", "-"}, {"name", "-"}}));
    log_.Clear();
    EXPECT_EQ(18990033u, ORLOiSCSILunConfGetAll(&list_, 0));
    EXPECT_TRUE(log_.Contains("\"name\") failed")) << log_.Dump();
    EXPECT_FALSE(log_.Contains("\"bytes\") failed")) << log_.Dump();
}

TEST_F(LunConfReadTest, TypeComesFromDevtypeAndTheFlagKeysOrFromTheRootPath) {
    struct Case {
        std::map<std::string, std::string> keys;
        uint32_t type;
    };
    const std::vector<Case> cases = {
        {{{"devtype", "1"}, {"pre_alloc", "yes"}}, 3},
        {{{"devtype", "1"}, {"pre_alloc", "YES"}}, 3},
        {{{"devtype", "1"}, {"pre_alloc", "no"}}, 7},
        {{{"devtype", "1"}, {"pre_alloc", "no"}, {"vaai_support", "yes"}}, 15},
        {{{"devtype", "1"}, {"pre_alloc", "yes"}, {"vaai_support", "yes"}}, 3},
        {{{"devtype", "1"}, {"pre_alloc", "no"}, {"bkp_obj", "1"}}, 71},
        {{{"devtype", "1"}, {"pre_alloc", "no"}, {"vaai_support", "Yes"}, {"bkp_obj", "1"}}, 79},
        {{{"devtype", "1"}, {"pre_alloc", "yes"}, {"bkp_obj", "1"}}, 3},
        {{{"devtype", "2"}, {"rootpath", "/dev/sdb"}}, 1},
        {{{"devtype", "3"}, {"pre_alloc", "no"}}, 31},
        {{{"devtype", "4"}, {"pre_alloc", "no"}}, 143},
        {{{"devtype", "5"}, {"pre_alloc", "no"}}, 263},
        {{{"devtype", "6"}, {"pre_alloc", "no"}}, 47},
        {{{"devtype", "7"}, {"pre_alloc", "no"}}, 295},
        // Sections older than "devtype" (or with one that names nothing).
        {{{"devtype", "-"}, {"rootpath", "/volume2"}, {"pre_alloc", "no"}}, 7},
        {{{"devtype", "9"}, {"rootpath", "/volume2"}, {"pre_alloc", "yes"}}, 3},
        {{{"devtype", "-"}, {"rootpath", ""}, {"pre_alloc", "no"}}, 1},
        {{{"devtype", "-"}, {"rootpath", "/dev/md3"}, {"pre_alloc", "no"}}, 1},
    };
    std::string file;
    for (size_t i = 0; i < cases.size(); ++i) file += LunSection(static_cast<int>(i) + 1, cases[i].keys);
    WriteFile(kGlobalConf, file);
    ASSERT_EQ(0u, ORLOiSCSILunConfGetAll(&list_, ORLO_ISCSI_LUN_FILTER_BKP)) << log_.Dump();
    std::vector<ORLOiSCSILun> luns = Records(&list_);
    ASSERT_EQ(cases.size(), luns.size());
    for (size_t i = 0; i < cases.size(); ++i) EXPECT_EQ(cases[i].type, luns[i].type) << "case " << i;
    EXPECT_EQ(0u, luns[0].extentSize) << "only advanced LUNs have an extent size";

    WriteFile(kGlobalConf, LunSection(1) + LunSection(2, {{"devtype", "-"}, {"rootpath", "/share/x"}}));
    log_.Clear();
    EXPECT_EQ(18990500u, ORLOiSCSILunConfGetAll(&list_, 0));
    EXPECT_EQ(0, list_.count);
    EXPECT_TRUE(log_.Contains("unknown device type: [/share/x]")) << log_.Dump();
}

TEST_F(LunConfReadTest, ValuesAndTheDefaultsOfMissingKeys) {
    std::string longName(300, 'n');
    WriteFile(kGlobalConf,
              LunSection(1, {{"blocksize", "1024"}, {"restored_time", "-"}, {"uuid", "-"}}) +
                  LunSection(2, {{"blocksize", "4096"}, {"restored_time", "18446744073709551615"},
                                 {"bytes", "18446744073709551615"}, {"vpd_unit_serial", "-"}}) +
                  LunSection(3, {{"name", longName}, {"restored_time", "1700000000"}}));
    ASSERT_EQ(0u, ORLOiSCSILunConfGetAll(&list_, 0)) << log_.Dump();
    std::vector<ORLOiSCSILun> luns = Records(&list_);
    ASSERT_EQ(3u, luns.size());
    EXPECT_EQ(512u, luns[0].blockSize) << "only 4096 is kept; anything else is 512";
    EXPECT_EQ(0, luns[0].restoredTime);
    EXPECT_STREQ("", luns[0].uuid);
    EXPECT_STREQ("serial1", luns[0].vpdUnitSerial);
    EXPECT_TRUE(log_.Contains("warning: uuid not found in config of 'lun1'")) << log_.Dump();

    EXPECT_EQ(4096u, luns[1].blockSize);
    EXPECT_EQ(-1, luns[1].restoredTime) << "the stored form of a negative time reads back";
    EXPECT_EQ(UINT64_MAX, luns[1].size);
    EXPECT_STREQ("", luns[1].vpdUnitSerial);
    EXPECT_TRUE(log_.Contains("warning: vpd_unit_serial not found in config of 'lun2'")) << log_.Dump();

    EXPECT_EQ(std::string(255, 'n'), luns[2].name) << "a long name in the file is cut to the record's size";
    EXPECT_EQ(1700000000, luns[2].restoredTime);
}

TEST_F(LunConfReadTest, FilterFlagsSelectAsDocumented) {
    WriteFile(kGlobalConf,
              LunSection(1, {{"name", "a"}}) +
                  LunSection(2, {{"name", "b"}, {"rootpath", "/volume2"}, {"pre_alloc", "no"}, {"vaai_support", "yes"}}) +
                  LunSection(3, {{"name", "c"}, {"pre_alloc", "no"}, {"bkp_obj", "1"}}) +
                  LunSection(4, {{"name", "d"}, {"devtype", "5"}, {"pre_alloc", "no"}}) +
                  LunSection(5, {{"name", "e"}, {"devtype", "6"}, {"pre_alloc", "no"}, {"vaai_support", "yes"}}));
    auto F = [](uint32_t flags) {
        ORLOiSCSILunFilter f = {};
        f.flags = flags;
        return f;
    };
    EXPECT_EQ(std::vector<int>({1, 2, 4, 5}), LoadLids(F(0x7000))) << "0x7000 leaves out backup objects";
    EXPECT_EQ(std::vector<int>({1, 2, 3, 4, 5}), LoadLids(F(0x7400)));
    EXPECT_EQ(std::vector<int>({1, 2, 3, 4, 5}), LoadLids(F(0x2000))) << "no criterion: everything";
    EXPECT_EQ(std::vector<int>({1, 2}), LoadLids(F(0x2000 | 0x200000)));
    EXPECT_EQ(std::vector<int>({2, 5}), LoadLids(F(0x2000 | 0x800)));
    EXPECT_EQ(std::vector<int>({1}), LoadLids(F(0x2000 | 0x400000)));

    ORLOiSCSILunFilter f = F(0x2000 | 0x2);
    f.rootPath = "/volume2";
    EXPECT_EQ(std::vector<int>({2}), LoadLids(f));

    // 0x20 decides on the lid, but an earlier failed test still rejects.
    f = F(0x2000 | 0x20 | 0x10);
    f.lid = 1;
    f.name = "b";
    EXPECT_EQ(std::vector<int>(), LoadLids(f));
    f.name = "a";
    EXPECT_EQ(std::vector<int>({1}), LoadLids(f));

    // 0x80 accepts on the lid alone: the failed name test is not consulted.
    const int32_t lids[] = {4, 2};
    f = F(0x2000 | 0x80 | 0x10);
    f.name = "nobody";
    f.lids = lids;
    f.lidCount = 2;
    EXPECT_EQ(std::vector<int>({2, 4}), LoadLids(f));
    // Without a usable array the other tests decide.
    f.lidCount = 0;
    EXPECT_EQ(std::vector<int>(), LoadLids(f));

    // A flag without its operand rejects every section and says so.
    log_.Clear();
    f = F(0x2000 | 0x100000);
    EXPECT_EQ(std::vector<int>(), LoadLids(f));
    EXPECT_TRUE(log_.Contains("iscsi_lun_filter_apply.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Bad parameters")) << log_.Dump();
}

TEST_F(LunConfReadTest, LookupsByLidNameUuidAndFromAVolumeCopy) {
    WriteFile(kGlobalConf, LunSection(1, {{"name", "a"}}) + LunSection(2, {{"name", "b"}}));
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByLid(2, 0, &list_));
    EXPECT_EQ(std::vector<int>({2}), Lids(&list_));
    ORLOiSCSILunListFree(&list_);
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByLunName("a", 0, &list_));
    EXPECT_EQ(std::vector<int>({1}), Lids(&list_));
    ORLOiSCSILunListFree(&list_);
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByLid(9, 0, &list_));
    EXPECT_EQ(0, list_.count);

    ORLOiSCSILun lun = lun_test::MakeLun(77, 3);
    ASSERT_EQ(0u, ORLOiSCSILunConfGetByUuid(UuidOf(2).c_str(), &lun));
    EXPECT_EQ(2, lun.lid);
    EXPECT_STREQ("b", lun.name);
    log_.Clear();
    EXPECT_EQ(18990531u, ORLOiSCSILunConfGetByUuid(UuidOf(3).c_str(), &lun));
    EXPECT_EQ(2, lun.lid) << "the record is left alone when there is no such LUN";
    EXPECT_EQ(18990003u, ORLOiSCSILunConfGetByUuid(nullptr, &lun));
    EXPECT_EQ(18990003u, ORLOiSCSILunConfGetByUuid("", &lun));

    // A volume's copy: every LUN, backup objects included.
    WriteFile("/volume2/@iSCSI/LUN/iscsi_lun.conf",
              LunSection(5, {{"rootpath", "/volume2"}}) +
                  LunSection(6, {{"rootpath", "/volume2"}, {"pre_alloc", "no"}, {"bkp_obj", "1"}}));
    ASSERT_EQ(0u, ORLOiSCSILunConfInVolumeLoad("/volume2", &list_)) << log_.Dump();
    EXPECT_EQ(std::vector<int>({5, 6}), Lids(&list_));
    ASSERT_EQ(0u, ORLOiSCSILunConfInVolumeLoadByUuid("/volume2", UuidOf(6).c_str(), &lun));
    EXPECT_EQ(71u, lun.type);
    EXPECT_EQ(18990531u, ORLOiSCSILunConfInVolumeLoadByUuid("/volume2", UuidOf(1).c_str(), &lun));
    ORLOiSCSILunListFree(&list_);
    EXPECT_EQ(0u, ORLOiSCSILunConfInVolumeLoad("/volume3", &list_)) << "a volume without the file has no LUNs";
    EXPECT_EQ(0, list_.count);

    // A volume path whose copy's path does not fit is refused, not cut.
    std::string deep = "/volume2/" + std::string(300, 'd');
    log_.Clear();
    EXPECT_EQ(18990050u, ORLOiSCSILunConfInVolumeLoad(deep.c_str(), &list_));
    EXPECT_TRUE(log_.Contains("snprintf() failed with buffer size 320")) << log_.Dump();
}

}  // namespace
