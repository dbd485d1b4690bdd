// Taking target nodes out of the simulated kernel's iSCSI fabric: the exact order in
// which the tree is dismantled, what stays after an injected failure, and that a
// repeated unload finishes the job.
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"

namespace service_test {
namespace {

const std::string kIqn = "iqn.2000-01.com.orlo:t1";
const std::string kNode = "/target/iscsi/" + kIqn;
const std::string kTpg = kNode + "/tpgt_1";
const std::string kHost1 = "iqn.1991-05.com.example:host1";
const std::string kHost2 = "iqn.1991-05.com.example:host2";

class TargetUnload : public ServiceSimTest {
  protected:
    void SetUp() override {
        ServiceSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
        ASSERT_EQ(0, Mkdir("/target/iscsi"));
    }

    int Mkdir(const std::string &inside) { return mkdir(Cfg(inside).c_str(), 0700) == 0 ? 0 : errno; }
    int Link(const std::string &targetInside, const std::string &linkInside) {
        return symlink(Cfg(targetInside).c_str(), Cfg(linkInside).c_str()) == 0 ? 0 : errno;
    }
    void Backstore(const std::string &name) {
        WriteFile("/volume1/" + name + ".img", "");
        const std::string bs = "/target/core/fileio_0/" + name;
        ASSERT_EQ(0, Mkdir(bs));
        ASSERT_EQ(0, CfgWrite(bs + "/control", "fd_dev_name=/volume1/" + name + ".img,fd_dev_size=1048576"));
        ASSERT_EQ(0, CfgWrite(bs + "/enable", "1"));
    }
    // A node as a full load leaves it: two portals, two LUN entries linked to file
    // backstores, and two initiators' access lists with LUN entries linked to them.
    void FullNode() {
        Backstore("LUN_a");
        Backstore("LUN_b");
        for (const std::string &d : {kNode, kTpg, kTpg + "/np/127.0.0.1:3260", kTpg + "/np/[::1]:3260",
                                     kTpg + "/lun/lun_0", kTpg + "/lun/lun_1"})
            ASSERT_EQ(0, Mkdir(d)) << d;
        ASSERT_EQ(0, Link("/target/core/fileio_0/LUN_a", kTpg + "/lun/lun_0/LUN_a"));
        ASSERT_EQ(0, Link("/target/core/fileio_0/LUN_b", kTpg + "/lun/lun_1/LUN_b"));
        for (const std::string &d : {kTpg + "/acls/" + kHost1, kTpg + "/acls/" + kHost1 + "/lun_0",
                                     kTpg + "/acls/" + kHost1 + "/lun_1", kTpg + "/acls/" + kHost2,
                                     kTpg + "/acls/" + kHost2 + "/lun_0"})
            ASSERT_EQ(0, Mkdir(d)) << d;
        ASSERT_EQ(0, Link(kTpg + "/lun/lun_0", kTpg + "/acls/" + kHost1 + "/lun_0/lio_lun"));
        ASSERT_EQ(0, Link(kTpg + "/lun/lun_1", kTpg + "/acls/" + kHost1 + "/lun_1/lio_lun"));
        ASSERT_EQ(0, Link(kTpg + "/lun/lun_1", kTpg + "/acls/" + kHost2 + "/lun_0/lio_lun"));
        ASSERT_EQ(0, CfgWrite(kTpg + "/enable", "1"));
        ASSERT_EQ(0, AddSession(kIqn, 1, kHost1, "192.0.2.7", 0));
    }
    // The operations that changed the tree, as "op path result" (writes with their value).
    std::vector<std::string> Changes() {
        std::vector<std::string> out;
        for (const orlotest::SimOp &op : Trace()) {
            if (op.op == "read") continue;
            out.push_back(op.op + " " + op.path + (op.op == "write" ? " " + op.value : "") + " " + op.result);
        }
        return out;
    }
    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
};

TEST_F(TargetUnload, AFullNodeIsDismantledBottomUpAndASecondUnloadFindsNothingToDo) {
    FullNode();
    if (HasFatalFailure()) return;
    ClearTrace();
    ASSERT_EQ(ORLO_OK, ORLOiSCSITargetUnloadByIqn(kIqn.c_str())) << log_.Dump() << TraceDump();
    const std::string a1 = kTpg + "/acls/" + kHost1, a2 = kTpg + "/acls/" + kHost2;
    std::vector<std::string> expected = {
        "write " + kTpg + "/enable 0 0",
        "rmdir " + kTpg + "/np/127.0.0.1:3260 0",
        "rmdir " + kTpg + "/np/[::1]:3260 0",
        "unlink " + a1 + "/lun_0/lio_lun 0",
        "rmdir " + a1 + "/lun_0 0",
        "unlink " + a1 + "/lun_1/lio_lun 0",
        "rmdir " + a1 + "/lun_1 0",
        "rmdir " + a1 + " 0",
        "unlink " + a2 + "/lun_0/lio_lun 0",
        "rmdir " + a2 + "/lun_0 0",
        "rmdir " + a2 + " 0",
        "unlink " + kTpg + "/lun/lun_0/LUN_a 0",
        "rmdir " + kTpg + "/lun/lun_0 0",
        "unlink " + kTpg + "/lun/lun_1/LUN_b 0",
        "rmdir " + kTpg + "/lun/lun_1 0",
        "rmdir " + kTpg + " 0",
        "rmdir " + kNode + " 0",
    };
    EXPECT_EQ(expected, Changes()) << TraceDump();
    EXPECT_FALSE(InKernel(kNode));
    // The backstores stay loaded: only the fabric's hold on them went.
    EXPECT_TRUE(InKernel("/target/core/fileio_0/LUN_a"));
    EXPECT_TRUE(InKernel("/target/core/fileio_0/LUN_b"));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_portal_group_lun_remove_entry.cpp",
                       "ORLOiSCSITargetPortalGroupLunRemoveEntry",
                       "isTCMLunPathBlockLun(\"/config" + kTpg + "/lun/lun_0/LUN_a\") = false, unlinking /config" +
                           kTpg + "/lun/lun_0/LUN_a -> ../../../../../../target/core/fileio_0/LUN_a"))
        << log_.Dump();

    ClearTrace();
    EXPECT_EQ(ORLO_OK, ORLOiSCSITargetUnloadByIqn(kIqn.c_str())) << log_.Dump();
    EXPECT_TRUE(Changes().empty()) << TraceDump();
}

TEST_F(TargetUnload, DisabledAndHalfBuiltNodesGoWithoutTouchingEnable) {
    // A load that failed after making the portal group: the group is still disabled.
    ASSERT_EQ(0, Mkdir(kNode));
    ASSERT_EQ(0, Mkdir(kTpg));
    ASSERT_EQ(0, Mkdir(kTpg + "/np/192.0.2.1:3260"));
    // A load that failed right after making the node.
    const std::string bare = "/target/iscsi/iqn.2000-01.com.orlo:bare";
    ASSERT_EQ(0, Mkdir(bare));
    ClearTrace();
    ASSERT_EQ(ORLO_OK, ORLOiSCSITargetUnloadByConfigfsPath(("/config" + kNode).c_str())) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"rmdir " + kTpg + "/np/192.0.2.1:3260 0", "rmdir " + kTpg + " 0",
                                        "rmdir " + kNode + " 0"}),
              Changes())
        << TraceDump();
    ClearTrace();
    ASSERT_EQ(ORLO_OK, ORLOiSCSITargetUnloadByConfigfsPath(("/config" + bare).c_str())) << log_.Dump();
    EXPECT_EQ(std::vector<std::string>{"rmdir " + bare + " 0"}, Changes());

    // Names that are not one node of the fabric are refused before anything is touched.
    EXPECT_EQ(ORLO_ERR_NULL_POINTER, ORLOiSCSITargetUnloadByIqn(nullptr));
    EXPECT_EQ(ORLO_ERR_NULL_POINTER, ORLOiSCSITargetUnloadByConfigfsPath(""));
    EXPECT_EQ(ORLO_ERR_BAD_PARAMETER, ORLOiSCSITargetUnloadByIqn(".."));
    EXPECT_EQ(ORLO_ERR_BAD_PARAMETER, ORLOiSCSITargetUnloadByIqn("../core/fileio_0"));
    EXPECT_EQ(ORLO_ERR_PARSE_STRING, ORLOiSCSITargetUnloadByIqn(std::string(300, 'x').c_str()));
    EXPECT_TRUE(InKernel("/target/iscsi"));
}

TEST_F(TargetUnload, AnInjectedFailureEndsTheUnloadWithItsCodeAndARepeatFinishesIt) {
    FullNode();
    if (HasFatalFailure()) return;
    const std::string tpg = "/config" + kTpg, node = "/config" + kNode;

    // An access-list link that cannot go: nothing after it is touched.
    ASSERT_EQ(0, SetFault("unlink", "*/acls/" + kHost1 + "/lun_1/lio_lun", "EIO"));
    EXPECT_EQ(ORLO_ERR_UNLINK_FILE, ORLOiSCSITargetUnloadByIqn(kIqn.c_str()));
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_unload_util.cpp", "RemoveConfigfsLink",
                       "unlink(\"" + tpg + "/acls/" + kHost1 + "/lun_1/lio_lun\") failed, err=Input/output error"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_tpg_unload.cpp", "ORLOiSCSIConfigfsTargetPortalGroupUnload",
                       "ORLOiSCSIConfigfsTargetPortalGroupACLsRemove(\"" + tpg +
                           "\") failed, err=Failed to unlink file"));
    EXPECT_FALSE(InKernel(kTpg + "/np/127.0.0.1:3260"));
    EXPECT_FALSE(InKernel(kTpg + "/acls/" + kHost1 + "/lun_0"));
    EXPECT_TRUE(InKernel(kTpg + "/acls/" + kHost1 + "/lun_1/lio_lun"));
    EXPECT_TRUE(InKernel(kTpg + "/acls/" + kHost2 + "/lun_0/lio_lun"));
    EXPECT_TRUE(InKernel(kTpg + "/lun/lun_0/LUN_a"));

    // A LUN entry whose directory cannot go after its link did.
    log_.Clear();
    ASSERT_EQ(0, SetFault("rmdir", "*/lun/lun_1", "EIO"));
    EXPECT_EQ(ORLO_ERR_RMDIR, ORLOiSCSITargetUnloadByIqn(kIqn.c_str()));
    const std::string err = "err=Failed to remove directory";
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_unload_util.cpp", "RemoveConfigfsDir",
                       "rmdir(\"" + tpg + "/lun/lun_1\") failed, err=Input/output error"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_tpg_unload.cpp", "ORLOiSCSIConfigfsTargetPortalGroupLUNRemove",
                       "ORLOiSCSITargetPortalGroupLunRemoveEntry(\"" + tpg + "/lun/lun_1\") failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_tpg_unload.cpp", "ORLOiSCSIConfigfsTargetPortalGroupUnload",
                       "ORLOiSCSIConfigfsTargetPortalGroupLUNRemove(\"" + tpg + "\") failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_unload_by_configfs_path.cpp", "ORLOiSCSITargetUnloadByConfigfsPath",
                       "ORLOiSCSIConfigfsTargetPortalGroupUnload(\"" + tpg + "\") failed, " + err));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_unload_by_iqn.cpp", "ORLOiSCSITargetUnloadByIqn",
                       "ORLOiSCSITargetUnloadByConfigfsPath(\"" + node + "\") failed, " + err));
    EXPECT_FALSE(InKernel(kTpg + "/acls/" + kHost1));
    EXPECT_FALSE(InKernel(kTpg + "/lun/lun_0"));
    EXPECT_FALSE(InKernel(kTpg + "/lun/lun_1/LUN_b"));
    EXPECT_TRUE(InKernel(kTpg + "/lun/lun_1"));

    // The repeat carries on from there and leaves nothing.
    ClearTrace();
    ASSERT_EQ(ORLO_OK, ORLOiSCSITargetUnloadByIqn(kIqn.c_str())) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"rmdir " + kTpg + "/lun/lun_1 0", "rmdir " + kTpg + " 0",
                                        "rmdir " + kNode + " 0"}),
              Changes())
        << TraceDump();
}

}  // namespace
}  // namespace service_test
