// LUN-target mappings: the choice of LUN numbers, the order of kernel and file steps
// when a mapping is added to or removed from a running target, what a failure leaves,
// and the checks of the several-LUN forms.
#include <sys/stat.h>

#include <algorithm>
#include <string>
#include <vector>

#include "target_kernel/life_fixture.h"

namespace life_test {
namespace {

using service_test::HasLog;
using service_test::Messages;
using Strings = std::vector<std::string>;

class MappingTest : public LifeTest {
  protected:
    bool Has(const Strings &v, const std::string &s) { return std::find(v.begin(), v.end(), s) != v.end(); }
    // Index of a line in v, or -1.
    int IndexOf(const Strings &v, const std::string &s) {
        auto it = std::find(v.begin(), v.end(), s);
        return it == v.end() ? -1 : static_cast<int>(it - v.begin());
    }
    // A LUN section as an older writer leaves it, without a data file.
    static std::string LunSection(int lid) {
        const std::string uuid = lun_test::UuidOf(lid);
        return "[LUN_" + uuid + "]\n\tlid=" + std::to_string(lid) + "\n\tname=LUN-" + std::to_string(lid) +
               "\n\trootpath=/volume1\n\tuuid=" + uuid + "\n\tvpd_unit_serial=s" + std::to_string(lid) +
               "\n\tbytes=1048576\n\trestored_time=0\n\tdevtype=1\n\tpre_alloc=yes\n\tbkp_obj=0\n\tvaai_support=no\n";
    }
    static std::string MapSection(int tid, int lid, int lun) {
        return "[iSCSI_MAP_T" + std::to_string(tid) + "_L" + std::to_string(lid) + "]\n\ttid=" + std::to_string(tid) +
               "\n\tlid=" + std::to_string(lid) + "\n\tlun=" + std::to_string(lun) + "\n";
    }
};

TEST_F(MappingTest, NumbersAreCheckedOrChosenAndAStoppedTargetOnlyGetsSections) {
    StoreTarget(1);
    for (int lid = 1; lid <= 4; ++lid) StoreLun(lid);
    ClearTrace();

    EXPECT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 1, 256)) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 2, 5)) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 3, 100000)) << log_.Dump();
    EXPECT_EQ(Strings({"1:1:0", "1:2:5", "1:3:1"}), Mappings());
    EXPECT_EQ(0u, ReadFile(kMappingConf).find(MapSection(1, 1, 0))) << ReadFile(kMappingConf);
    EXPECT_TRUE(Changes().empty()) << "a target that is not in the kernel gets sections only\n" << TraceDump();

    // A number given and taken.
    log_.Clear();
    EXPECT_EQ(18990534u, ORLOiSCSITargetMappingAdd(1, 4, 5));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_mapping_add.cpp", "ORLOiSCSITargetMappingAdd",
                       "Failed to map lid:4 to tid:1 in mapLun5 which used already"))
        << log_.Dump();

    bool used = false;
    EXPECT_EQ(0u, ORLOiSCSITargetIsLunMapped(1, 5, &used));
    EXPECT_TRUE(used);
    EXPECT_EQ(0u, ORLOiSCSITargetIsLunMapped(1, 2, &used));
    EXPECT_FALSE(used);
    EXPECT_EQ(0u, ORLOiSCSITargetIsLunMapped(2, 0, &used)) << "a target without mappings";
    EXPECT_FALSE(used);
    EXPECT_EQ(18990004u, ORLOiSCSITargetIsLunMapped(1, 256, &used));
    EXPECT_EQ(18990004u, ORLOiSCSITargetIsLunMapped(1, -1, &used));
    EXPECT_EQ(18990004u, ORLOiSCSITargetIsLunMapped(257, 0, &used));
    EXPECT_EQ(18990004u, ORLOiSCSITargetIsLunMapped(1, 0, nullptr));
    EXPECT_EQ(2, ORLOiSCSILunUnusedMappingNumberGet(1));
    EXPECT_EQ(0, ORLOiSCSILunUnusedMappingNumberGet(2));
    EXPECT_EQ(-1, ORLOiSCSILunUnusedMappingNumberGet(0));

    // A target or a LUN that is not stored.
    log_.Clear();
    EXPECT_EQ(18990425u, ORLOiSCSITargetMappingAdd(9, 4, 256));
    EXPECT_EQ(18990425u, ORLOiSCSITargetMappingAdd(1, 99, 256));
    EXPECT_EQ(Strings({"Failed to zero target_cnt:0, lun_cnt:1, mapping_cnt:0",
                       "Failed to zero target_cnt:1, lun_cnt:0, mapping_cnt:0"}),
              Messages(log_, "Failed to zero"));

    // Arguments.
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingAdd(0, 4, 0));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingAdd(257, 4, 0));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingAdd(1, 0, 0));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingAdd(1, 1025, 0));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingAdd(1, 4, -1));
    EXPECT_EQ(Strings({"1:1:0", "1:2:5", "1:3:1"}), Mappings()) << "no refused call wrote anything";
}

TEST_F(MappingTest, AFullTargetHasNoFreeNumberAndIncorrectNumbersAreIgnored) {
    StoreTarget(1);
    std::string luns, maps;
    for (int lid = 1; lid <= 257; ++lid) luns += LunSection(lid);
    for (int i = 0; i < 256; ++i) maps += MapSection(1, i + 1, i);
    WriteFile("/usr/orlo/etc/iscsi_lun.conf", luns);
    WriteFile(kMappingConf, maps + MapSection(1, 300, 300));

    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSILunUnusedMappingNumberGet(1));
    EXPECT_TRUE(HasLog(log_, "iscsi_lun_unused_mapping_number_get.cpp", "ORLOiSCSILunUnusedMappingNumberGet",
                       "INCORRECT mapped lun:300, tid:1 name:Target-1"))
        << log_.Dump();
    log_.Clear();
    EXPECT_EQ(18990555u, ORLOiSCSITargetMappingAdd(1, 257, 256));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_mapping_add.cpp", "ORLOiSCSITargetMappingAdd",
                       "Failed to find a valid lun without mapped in tid:1 for lid:257"))
        << log_.Dump();

    // A mapping table the several-LUN form cannot trust: more than 256 mappings...
    log_.Clear();
    const int32_t one[] = {257};
    WriteFile("/usr/orlo/etc/iscsi_lun.conf", luns + LunSection(300));
    EXPECT_EQ(18990731u, ORLOiSCSITargetMappingsAdd(1, one, 1));
    EXPECT_EQ(Strings({"Failed to Init mapping table entry, mapping_cnt[257] exceed 256"}),
              Messages(log_, "Failed to Init"));

    // ... and, with exactly 256 valid ones, no number left.
    WriteFile("/usr/orlo/etc/iscsi_lun.conf", luns);
    log_.Clear();
    EXPECT_EQ(18990555u, ORLOiSCSITargetMappingsAdd(1, one, 1));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_mappings_add.cpp", "ORLOiSCSITargetMappingsAdd",
                       "Failed to mapped lid:257 into tid:1 with INVALID lun:-1"))
        << log_.Dump();

    // One number set free is the next one given.
    EXPECT_EQ(0u, ORLOiSCSITargetConfMappingRemove(1, 8));
    EXPECT_EQ(7, ORLOiSCSILunUnusedMappingNumberGet(1));
    EXPECT_EQ(0u, ORLOiSCSITargetMappingsAdd(1, one, 1)) << log_.Dump();
    const Strings stored = Mappings();
    EXPECT_TRUE(Has(stored, "1:257:7"));
    EXPECT_FALSE(Has(stored, "1:8:7"));
}

TEST_F(MappingTest, RunningTargetGetsTheKernelSideFirstAndLosesItBeforeTheSection) {
    ORLOiSCSITarget t = StoreTarget(1);
    MakeNode(t, true);
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost1.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost2.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, 3));
    ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(t.iqn, 1, kHost1.c_str()));
    ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(t.iqn, 1, kHost2.c_str()));
    ORLOiSCSILun lun1 = StoreLun(1);
    ORLOiSCSILun lun2 = StoreLun(2);
    const std::string tpg = Tpg(t);
    const std::string link0 = tpg + "/lun/lun_0/LUN_" + lun1.uuid;

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 1, 256)) << log_.Dump();
    EXPECT_TRUE(InKernel(Backstore(lun1))) << "the LUN is loaded on the way";
    struct stat st;
    ASSERT_EQ(0, lstat(Cfg(link0).c_str(), &st));
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    const std::string target = LinkOf(link0);
    EXPECT_EQ(Backstore(lun1), target.substr(target.size() - Backstore(lun1).size())) << target;
    EXPECT_TRUE(InKernel(tpg + "/acls/" + kHost1 + "/lun_0/lio_lun"));
    EXPECT_EQ("0", CfgRead(tpg + "/acls/" + kHost1 + "/lun_0/write_protect"));
    EXPECT_EQ("1", CfgRead(tpg + "/acls/" + kHost2 + "/lun_0/write_protect"));
    EXPECT_FALSE(InKernel(tpg + "/acls/" + ORLO_ISCSI_DEFAULT_ACL_INITIATOR)) << "no entry for the default";
    EXPECT_EQ(Strings({"1:1:0"}), Mappings());
    bool present = false;
    ORLOiSCSIMapping m = {};
    m.tid = 1;
    m.lid = 1;
    m.lun = 0;
    EXPECT_EQ(0u, ORLOiSCSITargetLunIsMapped(&m, &present));
    EXPECT_TRUE(present);
    m.lun = 1;
    EXPECT_EQ(0u, ORLOiSCSITargetLunIsMapped(&m, &present));
    EXPECT_FALSE(present);
    m.tid = 9;
    EXPECT_EQ(18990724u, ORLOiSCSITargetLunIsMapped(&m, &present));
    EXPECT_EQ(18990003u, ORLOiSCSITargetLunIsMapped(nullptr, &present));

    // A kernel add that fails leaves neither kernel entries nor a section.
    ASSERT_EQ(0, SetFault("symlink", tpg + "/acls/" + kHost2 + "/lun_1/lio_lun", "EIO"));
    EXPECT_NE(0u, ORLOiSCSITargetMappingAdd(1, 2, 256));
    EXPECT_FALSE(InKernel(tpg + "/lun/lun_1"));
    EXPECT_FALSE(InKernel(tpg + "/acls/" + kHost1 + "/lun_1"));
    EXPECT_EQ(Strings({"1:1:0"}), Mappings());

    // Removal: every initiator's entry, then the group's entry, then the section.
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSITargetMappingRemove(1, 1)) << log_.Dump();
    const std::string e1 = tpg + "/acls/" + kHost1 + "/lun_0", e2 = tpg + "/acls/" + kHost2 + "/lun_0";
    EXPECT_EQ(Strings({"unlink " + e1 + "/lio_lun 0", "rmdir " + e1 + " 0", "unlink " + e2 + "/lio_lun 0",
                       "rmdir " + e2 + " 0", "unlink " + link0 + " 0", "rmdir " + tpg + "/lun/lun_0 0"}),
              Changes());
    EXPECT_TRUE(Mappings().empty());
    EXPECT_TRUE(InKernel(Backstore(lun1))) << "the backstore stays loaded";

    // A kernel removal that fails keeps the section, and a repeat finishes the job.
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 1, 0)) << log_.Dump();
    ASSERT_EQ(0, SetFault("rmdir", tpg + "/lun/lun_0", "EBUSY"));
    log_.Clear();
    EXPECT_EQ(18990729u, ORLOiSCSITargetMappingRemove(1, 1));
    EXPECT_EQ(Strings({"ORLOiSCSITargetMappingUnload(1, 1, NULL) failed, err=Failed to remove target mapping"}),
              Messages(log_, "ORLOiSCSITargetMappingUnload("));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILioMappingUnlink(").size()) << log_.Dump();
    EXPECT_EQ(Strings({"1:1:0"}), Mappings());
    EXPECT_EQ(0u, ORLOiSCSITargetMappingRemove(1, 1)) << log_.Dump();
    EXPECT_FALSE(InKernel(tpg + "/lun/lun_0"));
    EXPECT_TRUE(Mappings().empty());

    // A mapping that is not stored cannot be unloaded.
    log_.Clear();
    EXPECT_EQ(18990729u, ORLOiSCSITargetMappingRemove(1, 2));
    EXPECT_EQ(Strings({"Failed to zero mapping_cnt:0"}), Messages(log_, "Failed to zero"));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingRemove(0, 1));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingRemove(1, 1025));
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingUnload(257, 1, nullptr));
    (void)lun2;
}

TEST_F(MappingTest, SeveralAtOnceAreCheckedBeforeAnyChange) {
    StoreTarget(1);
    ORLOiSCSITarget running = StoreTarget(2);
    MakeNode(running, true);
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(2, kHost1.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(running.iqn, 1, kHost1.c_str()));
    for (int lid = 1; lid <= 4; ++lid) StoreLun(lid);
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 1, 0)) << log_.Dump();

    struct Refused {
        int32_t tid;
        std::vector<int32_t> lids;
        uint32_t code;
        std::string log;
    } refused[] = {
        {0, {2}, 18990004u, "Bad parameters"},
        {257, {2}, 18990004u, "Bad parameters"},
        {1, {2, 0}, 18990004u, "Bad parameters, lid[1] is In-Valid[0]"},
        {1, {1025}, 18990004u, "Bad parameters, lid[0] is In-Valid[1025]"},
        {9, {2}, 18990713u, "Failed to mapping all lids, No such tid:9"},
        {1, {2, 1}, 18990534u, "Repeated mapping lun of lid: 1"},
        {1, {2, 3, 2}, 18990534u, "Repeated mapping lun of lid: 2"},
        {1, {2, 77}, 18990531u, "Failed to find LUN of lid:77 to map into tid:1"},
    };
    for (const Refused &r : refused) {
        log_.Clear();
        EXPECT_EQ(r.code, ORLOiSCSITargetMappingsAdd(r.tid, r.lids.data(), static_cast<int>(r.lids.size())))
            << r.log;
        EXPECT_TRUE(HasLog(log_, "iscsi_target_mappings_add.cpp", "ORLOiSCSITargetMappingsAdd", r.log))
            << log_.Dump();
    }
    EXPECT_EQ(18990004u, ORLOiSCSITargetMappingsAdd(1, nullptr, 1));
    EXPECT_EQ(Strings({"1:1:0"}), Mappings());

    // Accepted: each gets the smallest free number, in the order given; only the
    // running target gets kernel entries.
    const int32_t toStopped[] = {3, 2};
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSITargetMappingsAdd(1, toStopped, 2)) << log_.Dump();
    EXPECT_TRUE(Changes().empty()) << TraceDump();
    const int32_t toRunning[] = {4, 1};
    EXPECT_EQ(0u, ORLOiSCSITargetMappingsAdd(2, toRunning, 2)) << log_.Dump();
    EXPECT_EQ(Strings({"1:1:0", "1:3:1", "1:2:2", "2:4:0", "2:1:1"}), Mappings());
    const std::string tpg = Tpg(running);
    EXPECT_EQ(Strings({"LUN_" + lun_test::UuidOf(4)}),
              [&] {
                  Strings v;
                  for (const std::string &n : Ls(tpg + "/lun/lun_0"))
                      if (n.compare(0, 4, "LUN_") == 0) v.push_back(n);
                  return v;
              }());
    EXPECT_TRUE(InKernel(tpg + "/acls/" + kHost1 + "/lun_0/lio_lun"));
    EXPECT_TRUE(InKernel(tpg + "/acls/" + kHost1 + "/lun_1/lio_lun"));

    // Removing several: arguments first, then only the mappings asked for.
    log_.Clear();
    const int32_t bad[] = {1, 0};
    EXPECT_EQ(-1, ORLOiSCSITargetMappingsRemove(1, bad, 2));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_mappings_remove.cpp", "ORLOiSCSITargetMappingsRemove",
                       "Bad parameters, lid[1] is In-Valid[0]"))
        << log_.Dump();
    const int32_t fromStopped[] = {1, 2, 4};
    EXPECT_EQ(-1, ORLOiSCSITargetMappingsRemove(1, nullptr, 1));
    EXPECT_EQ(-1, ORLOiSCSITargetMappingsRemove(0, fromStopped, 1));
    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSITargetMappingsRemove(9, fromStopped, 1));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_mappings_remove.cpp", "ORLOiSCSITargetMappingsRemove",
                       "Failed to get target tid:9"))
        << log_.Dump();
    EXPECT_EQ(Strings({"1:1:0", "1:3:1", "1:2:2", "2:4:0", "2:1:1"}), Mappings());

    EXPECT_EQ(0, ORLOiSCSITargetMappingsRemove(1, fromStopped, 3)) << log_.Dump();
    EXPECT_EQ(Strings({"1:3:1", "2:4:0", "2:1:1"}), Mappings());
    const int32_t fromRunning[] = {1, 4};
    EXPECT_EQ(0, ORLOiSCSITargetMappingsRemove(2, fromRunning, 2)) << log_.Dump();
    EXPECT_EQ(Strings({"1:3:1"}), Mappings());
    EXPECT_TRUE(Ls(tpg + "/lun").empty());
    EXPECT_FALSE(InKernel(tpg + "/acls/" + kHost1 + "/lun_0"));
    EXPECT_FALSE(InKernel(tpg + "/acls/" + kHost1 + "/lun_1"));
}

}  // namespace
}  // namespace life_test
