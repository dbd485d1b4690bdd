// Node access lists, their LUN entries, write protection and per-initiator CHAP in the
// simulated kernel: the exact operations, codes and log lines, and what a failure leaves.
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"

namespace target_kernel_test {
namespace {

using service_test::HasLog;
using service_test::Messages;

const std::string kIqn = "iqn.2000-01.com.orlo:t1";
const std::string kTpg = "/target/iscsi/" + kIqn + "/tpgt_1";
const std::string kHost1 = "iqn.1991-05.com.example:host1";
const std::string kHost2 = "iqn.1991-05.com.example:host2";
const std::string kDefault = ORLO_ISCSI_DEFAULT_ACL_INITIATOR;
const std::string kUuid = "0b0e7a34-5f1c-4c2e-9a61-3c8d2f0a1b2c";
const std::string kBackstore = "LUN_" + kUuid;

class AclKernelTest : public service_test::ServiceSimTest {
  protected:
    virtual int Version() const { return 4; }

    void SetUp() override {
        ServiceSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, Version()));
        ASSERT_EQ(0, Mkdir("/target/iscsi"));
        ASSERT_EQ(0, Mkdir("/target/iscsi/" + kIqn));
        ASSERT_EQ(0, Mkdir(kTpg));
    }
    void TearDown() override {
        if (roMounted_) umount2(Real("/volume1").c_str(), MNT_DETACH);
        ServiceSimTest::TearDown();
    }

    int Mkdir(const std::string &inside) { return mkdir(Cfg(inside).c_str(), 0700) == 0 ? 0 : errno; }
    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
    // A file LUN on /volume1, loaded into fileio_0 and linked as the group's lun_0; its
    // section in the LUN file tells where its volume lies.
    void MappedLun() {
        WriteFile("/volume1/lun.img", "");
        WriteFile("/usr/orlo/etc/iscsi_lun.conf",
                  "[LUN_" + kUuid + "]\n\tlid=1\n\trootpath=/volume1\n\tname=lun1\n\tuuid=" + kUuid +
                      "\n\tvpd_unit_serial=s1\n\tbytes=1048576\n\trestored_time=0\n\tdevtype=1\n"
                      "\tpre_alloc=yes\n\tbkp_obj=0\n\tvaai_support=no\n");
        const std::string bs = "/target/core/fileio_0/" + kBackstore;
        ASSERT_EQ(0, Mkdir(bs));
        ASSERT_EQ(0, CfgWrite(bs + "/control", "fd_dev_name=/volume1/lun.img,fd_dev_size=1048576"));
        ASSERT_EQ(0, CfgWrite(bs + "/enable", "1"));
        ASSERT_EQ(0, Mkdir(kTpg + "/lun/lun_0"));
        ASSERT_EQ(0, symlink(Cfg(bs).c_str(), Cfg(kTpg + "/lun/lun_0/" + kBackstore).c_str()));
    }
    // The operations that changed the tree, as "op path [value] result".
    std::vector<std::string> Changes() {
        std::vector<std::string> out;
        for (const orlotest::SimOp &op : Trace()) {
            if (op.op == "read") continue;
            out.push_back(op.op + " " + op.path + (op.op == "write" || op.op == "symlink" ? " " + op.value : "") +
                          " " + op.result);
        }
        return out;
    }
    std::string CfgReadTrimmed(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }
    ORLOiSCSIAcl Entry(const std::string &initiator, int authority) {
        ORLOiSCSIAcl e;
        memset(&e, 0, sizeof(e));
        e.tid = 1;
        strncpy(e.initiator, initiator.c_str(), sizeof(e.initiator) - 1);
        e.authority = authority;
        return e;
    }
    bool roMounted_ = false;
};

TEST_F(AclKernelTest, NodeAclIsMadeOnceAndTheDefaultEntryMakesNone) {
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kHost1.c_str()));
    EXPECT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kHost1.c_str())) << "an existing list is kept";
    EXPECT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kDefault.c_str()));
    // A new list gets the appliance's command window (16 without a setting), an existing
    // one is left alone.
    EXPECT_EQ(std::vector<std::string>({"mkdir " + kTpg + "/acls/" + kHost1 + " 0",
                                        "write " + kTpg + "/acls/" + kHost1 + "/cmdsn_depth 16 0"}),
              Changes());
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_target_node_acl_add.cpp", "ORLOiSCSILioTargetNodeAclAdd",
                       "Default ACL of lio is deprecated."))
        << log_.Dump();

    // A failing mkdir is logged with the logical path and gives 18990028.
    ASSERT_EQ(0, SetFault("mkdir", kTpg + "/acls/" + kHost2, "EIO"));
    EXPECT_EQ(18990028u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kHost2.c_str()));
    EXPECT_EQ(std::vector<std::string>(
                  {"mkdir(\"/config" + kTpg + "/acls/" + kHost2 + "\", S_IRWXU) failed, err=Input/output error"}),
              Messages(log_, "mkdir("));
    EXPECT_FALSE(InKernel(kTpg + "/acls/" + kHost2));

    // Arguments.
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetNodeAclAdd(nullptr, 1, kHost1.c_str()));
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, nullptr));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 0, kHost1.c_str()));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, "../x"));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, ""));
    EXPECT_EQ(18990050u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, std::string(300, 'a').c_str()));
}

TEST_F(AclKernelTest, LunEntryIsLinkedProtectedByAuthorityAndRemovedInOrder) {
    MappedLun();
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kHost1.c_str()));
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), 0));
    EXPECT_EQ(std::vector<std::string>({"mkdir " + kTpg + "/acls/" + kHost1 + "/lun_0 0",
                                        "symlink " + kTpg + "/acls/" + kHost1 + "/lun_0/lio_lun " + kTpg +
                                            "/lun/lun_0 0"}),
              Changes());
    // Adding again keeps the entry and its link.
    EXPECT_EQ(0u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), 0));

    const std::string wp = kTpg + "/acls/" + kHost1 + "/lun_0/write_protect";
    struct Case {
        int authority;
        const char *want;
    } cases[] = {{3, "0"}, {1, "1"}, {2, "0"}, {0, "1"}, {7, "1"}};
    for (const Case &c : cases) {
        ORLOiSCSIAcl e = Entry(kHost1, c.authority);
        ClearTrace();
        EXPECT_EQ(0u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &e, 0)) << c.authority;
        EXPECT_EQ(std::vector<std::string>({"write " + wp + " " + c.want + " 0"}), Changes()) << c.authority;
        EXPECT_EQ(c.want, CfgReadTrimmed(wp)) << c.authority;
    }

    // A refused write is reported as a configfs write failure, with path and value.
    ASSERT_EQ(0, SetFault("write", wp, "EIO"));
    ORLOiSCSIAcl rw = Entry(kHost1, 3);
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &rw, 0));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSIConfigfsWrite(\"/config" + wp + "\", \"0\") failed, err=").size())
        << log_.Dump();

    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetLunAclInitiatorRemove(kIqn.c_str(), 1, kHost1.c_str(), 0));
    EXPECT_EQ(std::vector<std::string>({"unlink " + kTpg + "/acls/" + kHost1 + "/lun_0/lio_lun 0",
                                        "rmdir " + kTpg + "/acls/" + kHost1 + "/lun_0 0"}),
              Changes());
    EXPECT_TRUE(InKernel(kTpg + "/acls/" + kHost1));
    EXPECT_EQ(0u, ORLOiSCSILioTargetLunAclInitiatorRemove(kIqn.c_str(), 1, kHost1.c_str(), 0))
        << "an entry already gone counts as removed";

    // A LUN entry without a backstore behind it has no volume to judge.
    ASSERT_EQ(0, Mkdir(kTpg + "/lun/lun_3"));
    ASSERT_EQ(0, Mkdir(kTpg + "/acls/" + kHost1 + "/lun_3"));
    EXPECT_EQ(18990011u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &rw, 3));
    EXPECT_EQ("0", CfgReadTrimmed(kTpg + "/acls/" + kHost1 + "/lun_3/write_protect"));
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, nullptr, 0));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &rw, 256));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), -1));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetLunAclInitiatorRemove(kIqn.c_str(), 1, kHost1.c_str(), 256));
}

TEST_F(AclKernelTest, FailedLinkTakesTheNewEntryAwayButKeepsAnOlderOne) {
    MappedLun();
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kHost1.c_str()));
    const std::string entry = kTpg + "/acls/" + kHost1 + "/lun_0";

    ASSERT_EQ(0, SetFault("symlink", entry + "/lio_lun", "EIO"));
    ClearTrace();
    EXPECT_EQ(18990036u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), 0));
    EXPECT_EQ(std::vector<std::string>({"mkdir " + entry + " 0",
                                        "symlink " + entry + "/lio_lun  EIO",
                                        "rmdir " + entry + " 0"}),
              Changes());
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSIConfigfsSymlink(\"/config" + kTpg + "/lun/lun_0\", \"/config" + entry +
                                     "/lio_lun\") failed, err=")
                      .size())
        << log_.Dump();
    EXPECT_FALSE(InKernel(entry));

    // An entry that was there before the call is not taken away.
    ASSERT_EQ(0, Mkdir(entry));
    ASSERT_EQ(0, SetFault("symlink", entry + "/lio_lun", "EIO"));
    EXPECT_EQ(18990036u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), 0));
    EXPECT_TRUE(InKernel(entry));

    // Without a node access list there is nowhere to put the entry.
    EXPECT_EQ(18990028u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost2.c_str(), 0));

    // A link the kernel will not give up is reported, and the entry stays.
    ASSERT_EQ(0u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), 0));
    ASSERT_EQ(0, SetFault("unlink", entry + "/lio_lun", "EBUSY"));
    EXPECT_EQ(18990037u, ORLOiSCSILioTargetLunAclInitiatorRemove(kIqn.c_str(), 1, kHost1.c_str(), 0));
    EXPECT_TRUE(InKernel(entry + "/lio_lun"));
}

TEST_F(AclKernelTest, ReadOnlyVolumeProtectsEvenReadWriteAccess) {
    MappedLun();
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kHost1.c_str()));
    ASSERT_EQ(0u, ORLOiSCSILioTargetLunAclInitiatorAdd(kIqn.c_str(), 1, kHost1.c_str(), 0));
    const std::string vol = Real("/volume1");
    ASSERT_EQ(0, mount(vol.c_str(), vol.c_str(), nullptr, MS_BIND, nullptr)) << strerror(errno);
    roMounted_ = true;
    ASSERT_EQ(0, mount(nullptr, vol.c_str(), nullptr, MS_BIND | MS_REMOUNT | MS_RDONLY, nullptr)) << strerror(errno);
    ORLOiSCSIAcl rw = Entry(kHost1, 3);
    EXPECT_EQ(0u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &rw, 0));
    EXPECT_EQ("1", CfgReadTrimmed(kTpg + "/acls/" + kHost1 + "/lun_0/write_protect"));
    ASSERT_EQ(0, umount2(vol.c_str(), MNT_DETACH));
    roMounted_ = false;
    EXPECT_EQ(0u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &rw, 0));
    EXPECT_EQ("0", CfgReadTrimmed(kTpg + "/acls/" + kHost1 + "/lun_0/write_protect"));

    // A volume that cannot be asked is a failure, logged with statvfs's own words.
    ASSERT_EQ(0, rename(vol.c_str(), (vol + ".gone").c_str()));
    log_.Clear();
    EXPECT_EQ(18990021u, ORLOiSCSILioTargetLunInitiatorRw(kIqn.c_str(), 1, &rw, 0));
    EXPECT_EQ(1u, Messages(log_, "statvfs(\"/volume1\", ").size()) << log_.Dump();
}

TEST_F(AclKernelTest, ChapCredentialsGoToEveryListedInitiatorButTheDefault) {
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost1.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kDefault.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost2.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(2, "iqn.1991-05.com.example:other", 3));
    for (const std::string &h : {kHost1, kHost2}) ASSERT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, h.c_str()));

    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    t.tid = 1;
    strcpy(t.iqn, kIqn.c_str());
    strcpy(t.user, "tuser");
    strcpy(t.password, "tsecret123456");
    strcpy(t.mutual_user, "muser");
    strcpy(t.mutual_password, "msecret123456");

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILioTargetMaskingsChapAuthAdd(&t, 2));
    std::vector<std::string> want;
    for (const std::string &h : {kHost1, kHost2}) {
        const std::string a = kTpg + "/acls/" + h + "/auth/";
        want.push_back("write " + a + "userid tuser 0");
        want.push_back("write " + a + "password tsecret123456 0");
        want.push_back("write " + a + "userid_mutual muser 0");
        want.push_back("write " + a + "password_mutual msecret123456 0");
    }
    EXPECT_EQ(want, Changes());

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILioTargetMaskingsChapAuthAdd(&t, 1));
    std::vector<std::string> oneWay;
    for (const std::string &w : want)
        if (w.find("_mutual") == std::string::npos) oneWay.push_back(w);
    EXPECT_EQ(oneWay, Changes());

    ClearTrace();
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetMaskingsChapAuthAdd(&t, 5));
    EXPECT_TRUE(Changes().empty());
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_target_maskings_chap_auth_add.cpp", "ORLOiSCSILioTargetMaskingsChapAuthAdd",
                       "Invalid CHAP type 5 for iSCSI Initaitor " + kHost1))
        << log_.Dump();

    // A failed write stops the walk; this walk's own line keeps the secret out.
    ASSERT_EQ(0, SetFault("write", kTpg + "/acls/" + kHost2 + "/auth/password", "EIO"));
    ClearTrace();
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetMaskingsChapAuthAdd(&t, 2));
    EXPECT_EQ(6u, Changes().size());
    EXPECT_EQ(std::vector<std::string>({"ORLOiSCSIConfigfsWrite(\"/config" + kTpg + "/acls/" + kHost2 +
                                        "/auth/password\", \"********\") failed, err=Failed to write file"}),
              Messages(log_, "ORLOiSCSIConfigfsWrite("));

    // A target without access-list entries writes nothing.
    t.tid = 3;
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetMaskingsChapAuthAdd(&t, 5));
    EXPECT_TRUE(Changes().empty());
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetMaskingsChapAuthAdd(nullptr, 1));
}

// The older target core has no demo mode: the default entry is an access list like any.
class AclKernelV2Test : public AclKernelTest {
  protected:
    const char *TargetType() const override { return "lio"; }
    int Version() const override { return 2; }
};

TEST_F(AclKernelV2Test, DefaultEntryGetsItsOwnNodeAclAndCredentials) {
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetNodeAclAdd(kIqn.c_str(), 1, kDefault.c_str()));
    EXPECT_EQ(std::vector<std::string>({"mkdir " + kTpg + "/acls/" + kDefault + " 0",
                                        "write " + kTpg + "/acls/" + kDefault + "/cmdsn_depth 16 0"}),
              Changes());
    EXPECT_FALSE(log_.Contains("Default ACL of lio is deprecated."));

    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kDefault.c_str(), 3));
    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    t.tid = 1;
    strcpy(t.iqn, kIqn.c_str());
    strcpy(t.user, "tuser");
    strcpy(t.password, "tsecret123456");
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetMaskingsChapAuthAdd(&t, 1));
    EXPECT_EQ(std::vector<std::string>({"write " + kTpg + "/acls/" + kDefault + "/auth/userid tuser 0",
                                        "write " + kTpg + "/acls/" + kDefault + "/auth/password tsecret123456 0"}),
              Changes());
}

}  // namespace
}  // namespace target_kernel_test
