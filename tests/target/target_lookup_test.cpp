// Lookups over the target file: by name and tid, name use, the free tid and free name,
// and removal of a target with its access lists under the documented lock order.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <string>
#include <thread>

#include "olibc.h"
#include "target/target_fixture.h"

namespace {

using namespace target_test;

class TargetLookupTest : public TargetTest {
  protected:
    void AddTargets(std::initializer_list<int> tids) {
        for (int tid : tids) {
            ORLOiSCSITarget t = MakeTarget(tid);
            ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t)) << log_.Dump();
        }
    }
    int FreeTid() {
        ORLOiSCSITarget t = MakeTarget(99);
        uint32_t ret = ORLOiSCSITargetUnusedTidFind(&t);
        return ret == 0 ? t.tid : -static_cast<int>(ret);
    }
};

TEST_F(TargetLookupTest, ByNameAndTid) {
    AddTargets({1, 2});
    ORLOiSCSITarget bkp = MakeTarget(3);
    bkp.bkp_obj = true;
    snprintf(bkp.name, sizeof(bkp.name), "%s", "Target-1");  // a second target of that name
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&bkp));

    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    ASSERT_EQ(0u, ORLOiSCSITargetGetByName("Target-2", 0, &t));
    EXPECT_EQ(2, t.tid);
    ASSERT_EQ(0u, ORLOiSCSITargetGetByName("Target-1", 0, &t));
    EXPECT_EQ(1, t.tid);  // the first in file order
    ASSERT_EQ(0u, ORLOiSCSITargetGetByTid(3, 0, &t));  // only load-all hides backup objects
    EXPECT_TRUE(t.bkp_obj);

    ORLOiSCSITarget untouched = t;
    EXPECT_EQ(18990713u, ORLOiSCSITargetGetByName("target-2", 0, &t));  // case-sensitive
    EXPECT_EQ(18990713u, ORLOiSCSITargetGetByTid(9, 0, &t));
    EXPECT_EQ(0, memcmp(&untouched, &t, sizeof(t)));
    EXPECT_EQ(18990003u, ORLOiSCSITargetGetByName(nullptr, 0, &t));
    EXPECT_EQ(18990003u, ORLOiSCSITargetGetByTid(1, 0, nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSITargetGetByFilter(nullptr, nullptr));

    ORLOiSCSITargetList list = {};
    ASSERT_EQ(0u, ORLOiSCSITargetConfGetByName("Target-1", 0, &list));
    EXPECT_EQ((std::vector<int>{1, 3}), Tids(&list));
    ORLOiSCSITargetListFree(&list);

    EXPECT_EQ(2, ORLOiSCSITargetIsNameUsed("Target-1"));
    EXPECT_EQ(1, ORLOiSCSITargetIsNameUsed("Target-2"));
    EXPECT_EQ(0, ORLOiSCSITargetIsNameUsed("Target-9"));
    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSITargetIsNameUsed(nullptr));
    EXPECT_EQ(1, LinesWith("Bad parameters"));
}

TEST_F(TargetLookupTest, FreeTidIsTheSmallestUnused) {
    EXPECT_EQ(1, FreeTid());
    AddTargets({1, 2, 5});
    EXPECT_EQ(3, FreeTid());
    ORLOiSCSITarget one = MakeTarget(1);
    ASSERT_EQ(0, ORLOiSCSITargetConfRemove(&one));
    AddTargets({3, 4});  // now 2, 3, 4, 5
    EXPECT_EQ(1, FreeTid());
    AddTargets({1});
    ORLOiSCSITarget five = MakeTarget(5);
    ASSERT_EQ(0, ORLOiSCSITargetConfRemove(&five));  // 1, 2, 3, 4
    EXPECT_EQ(5, FreeTid());
    ORLOiSCSITarget bkp = MakeTarget(5);
    bkp.bkp_obj = true;
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&bkp));
    EXPECT_EQ(6, FreeTid());  // backup-object targets hold their tid too

    // All 256 taken: no tid is handed out.
    std::string text;
    for (int tid = 1; tid <= 256; ++tid) text += Section(tid, "t" + std::to_string(tid));
    WriteFile(kTargetConf, text);
    EXPECT_EQ(-18990710, FreeTid());
    EXPECT_EQ(18990003u, ORLOiSCSITargetUnusedTidFind(nullptr));
    // A file that cannot be loaded.
    WriteFile(kTargetConf, Section(1, "x", "", "tid"));
    EXPECT_EQ(-18990724, FreeTid());
}

TEST_F(TargetLookupTest, FreeNameCountsUpFromOne) {
    char out[256];
    ASSERT_EQ(0, ORLOiSCSITargetUnusedNameFind("Target", out, sizeof(out)));
    EXPECT_STREQ("Target-1", out);
    AddTargets({1, 2, 4});  // names Target-1, Target-2, Target-4
    ASSERT_EQ(0, ORLOiSCSITargetUnusedNameFind("Target", out, sizeof(out)));
    EXPECT_STREQ("Target-3", out);

    // Never a cut name: an output too small, or a prefix too long, is refused.
    char small[8] = "keep";
    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSITargetUnusedNameFind("Target", small, sizeof(small)));
    EXPECT_STREQ("keep", small);
    EXPECT_EQ(1u, log_.Lines().size()) << log_.Dump();
    EXPECT_EQ(-1, ORLOiSCSITargetUnusedNameFind(std::string(254, 'p').c_str(), out, sizeof(out)));
    EXPECT_EQ(0, ORLOiSCSITargetUnusedNameFind(std::string(253, 'p').c_str(), out, sizeof(out)));
    EXPECT_EQ(255u, strlen(out));
    EXPECT_EQ(-1, ORLOiSCSITargetUnusedNameFind(nullptr, out, sizeof(out)));
    EXPECT_EQ(-1, ORLOiSCSITargetUnusedNameFind("T", out, 0));

    WriteFile(kTargetConf, Section(1, "Target-1", "", "mutual_password"));
    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSITargetUnusedNameFind("Target", out, sizeof(out)));
    EXPECT_EQ(1, LinesWith("Failed to check whether target name: Target-1 exist")) << log_.Dump();
}

TEST_F(TargetLookupTest, RemoveTakesTheSectionAndItsAccessListsOnly) {
    AddTargets({1, 11});
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, "iqn.1991-05.com.microsoft:host-a", 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(11, "iqn.1991-05.com.microsoft:host-a", 1));
    ORLOiSCSITarget one = MakeTarget(1);
    ASSERT_EQ(0, ORLOiSCSITargetConfRemove(&one)) << log_.Dump();
    const std::string targets = ReadFile(kTargetConf);
    EXPECT_EQ(std::string::npos, targets.find("[iSCSI_T1]"));
    EXPECT_NE(std::string::npos, targets.find("[iSCSI_T11]"));
    EXPECT_EQ("[iSCSI_ACL_T11_iqn.1991-05.com.microsoft:host-a]\n\tauthority=1\n", ReadFile(kAclConf));

    // No target file: the access lists still go.
    ASSERT_EQ(0, unlink(Real(kTargetConf).c_str()));
    ORLOiSCSITarget eleven = MakeTarget(11);
    ASSERT_EQ(0, ORLOiSCSITargetConfRemove(&eleven));
    EXPECT_EQ("", ReadFile(kAclConf));
    EXPECT_FALSE(Exists(kTargetConf));

    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSITargetConfRemove(nullptr));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    EXPECT_EQ(1, LinesWith("Bad parameters"));
}

// Removal holds the target file's lock while it waits for the access-list file's lock:
// target file first, then access-list file.
TEST_F(TargetLookupTest, RemoveTakesTargetLockBeforeAclLock) {
    AddTargets({2});
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(2, "iqn.1991-05.com.microsoft:host-b", 3));
    int aclHandle = -1;
    ASSERT_EQ(1, OLIBCFileLockTimeByFile(kAclLock, 1, 0, &aclHandle));

    std::atomic<int> result{99};
    std::thread remover([&result]() {
        ORLOiSCSITarget t = MakeTarget(2);
        result = ORLOiSCSITargetConfRemove(&t);
    });
    // Wait until the remover holds the target lock (it then waits on the access-list lock).
    bool targetLockHeld = false;
    for (int i = 0; i < 200 && !targetLockHeld; ++i) {
        int h = -1;
        if (OLIBCFileLockTimeByFile(kTargetLock, 0, 0, &h) == 1) {
            OLIBCFileUnlockByFile(h);
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        } else {
            targetLockHeld = true;
        }
    }
    EXPECT_TRUE(targetLockHeld);
    EXPECT_EQ(99, result.load());  // still waiting for the access-list lock
    OLIBCFileUnlockByFile(aclHandle);
    remover.join();
    EXPECT_EQ(0, result.load()) << log_.Dump();
    EXPECT_EQ("", ReadFile(kAclConf));
}

}  // namespace
