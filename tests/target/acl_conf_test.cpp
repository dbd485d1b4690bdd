// Access-list entries and their file: exact sections, upsert, update of existing entries
// only, removal of one or all of a target's entries, the load's edge cases and refusal of
// bad entries before anything changes.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "olibc.h"
#include "target/target_fixture.h"

namespace {

using namespace target_test;

class AclConfTest : public TargetTest {
  protected:
    std::vector<std::pair<std::string, int>> Load(int tid, uint32_t *ret = nullptr) {
        ORLOiSCSIAclList list = {};
        uint32_t r = ORLOiSCSITargetConfAclLoad(tid, &list);
        if (ret != nullptr) *ret = r;
        std::vector<std::pair<std::string, int>> out;
        ORLOiSCSIListLink *link;
        ORLOiSCSIAcl *acl;
        ORLO_ISCSI_ACL_LIST_FOREACH(&list, link, acl) {
            EXPECT_EQ(tid, acl->tid);
            out.emplace_back(acl->initiator, acl->authority);
        }
        EXPECT_EQ(static_cast<int>(out.size()), list.count);
        ORLOiSCSITargetAclListFree(&list);
        return out;
    }
};

const char kHostA[] = "iqn.1991-05.com.microsoft:host-a";
const char kHostB[] = "iqn.1993-08.org.debian:01:abcdef";

TEST_F(AclConfTest, EntriesRoundTripThroughExactSections) {
    EXPECT_EQ(36u, strlen(ORLO_ISCSI_DEFAULT_ACL_INITIATOR));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHostA, ISCSI_TARGET_AUTHORITY_RW)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(12, kHostA, ISCSI_TARGET_AUTHORITY_RO));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, ISCSI_TARGET_AUTHORITY_NONE));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHostA, ISCSI_TARGET_AUTHORITY_RO));  // replaced in place
    EXPECT_EQ("[iSCSI_ACL_T1_iqn.1991-05.com.microsoft:host-a]\n\tauthority=1\n"
              "[iSCSI_ACL_T12_iqn.1991-05.com.microsoft:host-a]\n\tauthority=1\n"
              "[iSCSI_ACL_T1_iqn.2000-01.com.orlo-nas:default.acl]\n\tauthority=0\n",
              ReadFile(kAclConf));
    EXPECT_EQ((std::vector<std::pair<std::string, int>>{{kHostA, 1}, {ORLO_ISCSI_DEFAULT_ACL_INITIATOR, 0}}),
              Load(1));
    EXPECT_EQ((std::vector<std::pair<std::string, int>>{{kHostA, 1}}), Load(12));
    uint32_t ret = 1;
    EXPECT_TRUE(Load(2, &ret).empty());
    EXPECT_EQ(0u, ret);

    EXPECT_TRUE(ORLOiSCSITargetConfAclIsExist(1, kHostA));
    EXPECT_FALSE(ORLOiSCSITargetConfAclIsExist(1, kHostB));
    EXPECT_FALSE(ORLOiSCSITargetConfAclIsExist(2, kHostA));

    // Update changes an existing entry only.
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclUpdate(12, kHostA, ISCSI_TARGET_AUTHORITY_RW));
    EXPECT_EQ(3, Load(12)[0].second);
    std::string before = ReadFile(kAclConf);
    EXPECT_EQ(18990000u, ORLOiSCSITargetConfAclUpdate(12, kHostB, ISCSI_TARGET_AUTHORITY_RW));
    EXPECT_EQ(before, ReadFile(kAclConf));

    // Removal of one entry, of a missing one, then of all a tid's entries (tid 12 stays).
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclRemove(1, kHostA));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclRemove(1, kHostB));
    EXPECT_FALSE(ORLOiSCSITargetConfAclIsExist(1, kHostA));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHostB, 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclsRemove(1));
    EXPECT_EQ("[iSCSI_ACL_T12_iqn.1991-05.com.microsoft:host-a]\n\tauthority=3\n", ReadFile(kAclConf));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclsRemove(1));  // nothing left of it: fine

    // No file at all.
    ASSERT_EQ(0, unlink(Real(kAclConf).c_str()));
    EXPECT_EQ(0u, ORLOiSCSITargetConfAclRemove(12, kHostA));
    EXPECT_EQ(0u, ORLOiSCSITargetConfAclsRemove(12));
    EXPECT_TRUE(Load(12, &ret).empty());
    EXPECT_EQ(0u, ret);
    EXPECT_FALSE(Exists(kAclConf));
}

TEST_F(AclConfTest, BadEntriesAreRefusedBeforeAnythingChanges) {
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHostA, 3));
    const std::string before = ReadFile(kAclConf);
    struct Case {
        int tid;
        const char *initiator;
        int authority;
        uint32_t code;
    };
    const std::string tooLong = "iqn.2000-01.com.orlo:" + std::string(203, 'x');
    const Case cases[] = {
        {0, kHostA, 3, 18990710},
        {257, kHostA, 3, 18990710},
        {1, nullptr, 3, 18990004},
        {1, "", 3, 18990711},
        {1, "host a", 3, 18990711},
        {1, "iqn.1991-05.com.microsoft:host-a]\n[x", 3, 18990711},
        {1, "IQN.1991-05.com.microsoft:host-a", 3, 18990711},
        {1, tooLong.c_str(), 3, 18990711},
        {1, kHostB, 4, 18990712},
        {1, kHostB, -1, 18990712},
    };
    for (const Case &c : cases) {
        log_.Clear();
        EXPECT_EQ(c.code, ORLOiSCSITargetConfAclAdd(c.tid, c.initiator, c.authority)) << c.tid << " " << c.authority;
        EXPECT_EQ(1u, log_.Lines().size()) << log_.Dump();
        EXPECT_EQ(before, ReadFile(kAclConf));
    }
    // Authority 2 comes from older configurations and is kept.
    EXPECT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, 2));
}

TEST_F(AclConfTest, LoadEdgeCases) {
    // An initiator part longer than 255 characters fails the load, leaving the list empty.
    const std::string longInit = "iqn.2000-01.com.orlo:" + std::string(240, 'y');
    WriteFile(kAclConf, std::string("[iSCSI_ACL_T1_") + kHostA + "]\n\tauthority=3\n[iSCSI_ACL_T1_" + longInit +
                            "]\n\tauthority=1\n");
    uint32_t ret = 0;
    EXPECT_TRUE(Load(1, &ret).empty());
    EXPECT_EQ(18990050u, ret);
    EXPECT_EQ(1, Load(2, &ret).size() + 1);  // other tids are not read
    EXPECT_EQ(0u, ret);

    // A missing authority.
    WriteFile(kAclConf, std::string("[iSCSI_ACL_T1_") + kHostA + "]\n\tauth=3\n");
    log_.Clear();
    EXPECT_TRUE(Load(1, &ret).empty());
    EXPECT_EQ(18990033u, ret);
    EXPECT_EQ(1, LinesWith("\"authority\") failed")) << log_.Dump();

    // A section whose name does not scan is logged and passed over.
    WriteFile(kAclConf, std::string("[stray]\n\tauthority=1\n[iSCSI_ACL_T1_") + kHostA + "]\n\tauthority=3\n");
    log_.Clear();
    EXPECT_EQ((std::vector<std::pair<std::string, int>>{{kHostA, 3}}), Load(1, &ret));
    EXPECT_EQ(0u, ret);
    EXPECT_EQ(1, LinesWith("sscanf(\"stray\", \"iSCSI_ACL_T%d_%s\"")) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetConfAclLoad(1, nullptr));
}

}  // namespace
