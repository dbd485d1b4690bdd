// Maskings of a target in the simulated kernel: what creating, updating and removing
// access-list entries store and what they change in a running target's node (node access
// lists, LUN entries, write protection, CHAP, the default entry's demo mode), what they
// refuse, and that a failure in the kernel leaves file and kernel as they were.
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"

namespace maskings_test {
namespace {

using service_test::HasLog;
using service_test::Messages;

const std::string kAclConf = "/usr/orlo/etc/iscsi_acl.conf";
const std::string kHost1 = "iqn.1991-05.com.example:host1";
const std::string kHost2 = "iqn.1991-05.com.example:host2";
const std::string kHost3 = "iqn.1991-05.com.example:host3";
const std::string kDefault = ORLO_ISCSI_DEFAULT_ACL_INITIATOR;

std::string UuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "5d2c9a10-0000-4000-8000-%012d", lid);
    return buf;
}

ORLOiSCSIAcl Acl(int tid, const std::string &initiator, int authority) {
    ORLOiSCSIAcl a;
    memset(&a, 0, sizeof(a));
    a.tid = tid;
    snprintf(a.initiator, sizeof(a.initiator), "%s", initiator.c_str());
    a.authority = authority;
    return a;
}

class MaskingsTest : public service_test::ServiceSimTest {
  protected:
    virtual int Version() const { return 4; }
    const char *TargetType() const override { return Version() == 4 ? "lio4x" : "lio"; }

    void SetUp() override {
        ServiceSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, Version()));
        ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
    }

    // A file LUN stored as creation leaves it.
    void StoreLun(int lid) {
        ORLOiSCSILun lun;
        memset(&lun, 0, sizeof(lun));
        lun.lid = lid;
        lun.lockHandle = -1;
        lun.type = ORLO_ISCSI_LUN_TYPE_FILE;
        lun.blockSize = 512;
        lun.size = 1048576;
        snprintf(lun.uuid, sizeof(lun.uuid), "%s", UuidOf(lid).c_str());
        snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "serial-%d", lid);
        snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
        snprintf(lun.name, sizeof(lun.name), "LUN-%d", lid);
        ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        char data[4096];
        ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
        WriteFile(data, "");
        ASSERT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE)) << log_.Dump();
    }

    // A CHAP target; when running, it is loaded into the kernel with LUNs 1 and 2 mapped
    // as numbers 0 and 1.
    ORLOiSCSITarget MakeTarget(const char *name, bool running) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        snprintf(t.name, sizeof(t.name), "%s", name);
        snprintf(t.iqn, sizeof(t.iqn), "iqn.2000-01.com.orlo-nas:%s", name);
        t.enabled = running;
        t.max_recv_seg_bytes = 262144;
        t.max_send_seg_bytes = 262144;
        t.max_sessions = 1;
        t.auth_type = ORLO_ISCSI_AUTH_CHAP;
        snprintf(t.user, sizeof(t.user), "%s-user", name);
        snprintf(t.password, sizeof(t.password), "secret-of-%s", name);
        EXPECT_EQ(0u, ORLOiSCSITargetCreate(&t)) << log_.Dump();
        return t;
    }
    void RunningTargetWithLuns() {
        StoreLun(1);
        StoreLun(2);
        if (HasFatalFailure()) return;
        target_ = MakeTarget("store", true);
        ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(target_.tid, 1, 0)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(target_.tid, 2, 1)) << log_.Dump();
        ASSERT_NE(0, ORLOiSCSITargetStatusGet(target_.tid, nullptr) & ORLO_ISCSI_TARGET_STATUS_PRESENT);
    }

    std::string Tpg() const { return "/target/iscsi/" + std::string(target_.iqn) + "/tpgt_1"; }
    std::string AclDir(const std::string &initiator) const { return Tpg() + "/acls/" + initiator; }
    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
    std::string Attr(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }
    // The stored entries of the tid as "initiator=authority", in file order.
    std::vector<std::string> Stored(int tid) {
        std::vector<ORLOiSCSIAcl> entries;
        EXPECT_EQ(0u, ORLOiSCSITargetMaskingGet(tid, entries)) << log_.Dump();
        std::vector<std::string> out;
        for (const ORLOiSCSIAcl &e : entries) out.push_back(std::string(e.initiator) + "=" + std::to_string(e.authority));
        return out;
    }
    // What the trace changed (reads left out).
    std::vector<std::string> Changes() {
        std::vector<std::string> out;
        for (const orlotest::SimOp &op : Trace())
            if (op.op != "read") out.push_back(op.op + " " + op.path + " " + op.result);
        return out;
    }

    ORLOiSCSITarget target_{};
};

TEST_F(MaskingsTest, CreateRefusesBadRequestsAndLeavesEverythingAsItWas) {
    RunningTargetWithLuns();
    if (HasFatalFailure()) return;
    const int tid = target_.tid;
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingCreate(Acl(tid, kHost1, ISCSI_TARGET_AUTHORITY_RO))) << log_.Dump();
    const std::string before = ReadFile(kAclConf);
    ClearTrace();
    log_.Clear();

    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingsCreate({Acl(tid, kHost2, 3), Acl(tid + 1, kHost3, 3)}));
    EXPECT_TRUE(HasLog(log_, "masking_util.cpp", "CheckRequest", "NOT All tid the same in ACL array")) << log_.Dump();
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(Acl(77, kHost2, 3)));
    EXPECT_TRUE(HasLog(log_, "masking_util.cpp", "CheckRequest", "Failed to get target config of tid:77"))
        << log_.Dump();
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(Acl(0, kHost2, 3)));
    // One initiator already listed refuses the whole request.
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingsCreate({Acl(tid, kHost2, 3), Acl(tid, kHost1, 3)}));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_maskings_create.cpp", "ORLOiSCSITargetMaskingsCreate",
                       "Existent iSCSI ACL"))
        << log_.Dump();
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingsCreate({}));
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingsCreate({Acl(tid, kHost2, 3), Acl(tid, kHost2, 1)}));
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(Acl(tid, "not an iqn", 3)));
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(Acl(tid, kHost2, 4)));
    ORLOiSCSIAcl unterminated = Acl(tid, kHost2, 3);
    memset(unterminated.initiator, 'a', sizeof(unterminated.initiator));
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(unterminated));

    EXPECT_EQ(before, ReadFile(kAclConf));
    EXPECT_TRUE(Changes().empty()) << TraceDump();

    // A target that is not in the kernel only gets its entries stored.
    ORLOiSCSITarget idle = MakeTarget("idle", false);
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSITargetMaskingCreate(Acl(idle.tid, kHost1, 3))) << log_.Dump();
    EXPECT_EQ(std::vector<std::string>{kHost1 + "=3"}, Stored(idle.tid));
    EXPECT_TRUE(Changes().empty()) << TraceDump();

    bool included = true;
    EXPECT_EQ(0u, ORLOiSCSITargetAclIsIncluded(tid, {Acl(tid, kHost2, 3), Acl(tid, kHost3, 3)}, included));
    EXPECT_FALSE(included);
    EXPECT_EQ(0u, ORLOiSCSITargetAclIsIncluded(tid, {Acl(tid, kHost2, 3), Acl(tid, kHost1, 0)}, included));
    EXPECT_TRUE(included);
    EXPECT_EQ(0u, ORLOiSCSITargetAclIsIncluded(tid, {}, included));
    EXPECT_FALSE(included);
    EXPECT_EQ(18990004u, ORLOiSCSITargetAclIsIncluded(0, {Acl(0, kHost1, 3)}, included));
}

TEST_F(MaskingsTest, CreateOnARunningTargetGivesEachInitiatorItsLunsAndChap) {
    RunningTargetWithLuns();
    if (HasFatalFailure()) return;
    const int tid = target_.tid;
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingsCreate({Acl(tid, kHost1, ISCSI_TARGET_AUTHORITY_RO),
                                                 Acl(tid, kHost2, ISCSI_TARGET_AUTHORITY_RW),
                                                 Acl(tid, kHost3, ISCSI_TARGET_AUTHORITY_NONE)}))
        << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{kHost1 + "=1", kHost2 + "=3", kHost3 + "=0"}), Stored(tid));
    for (int n : {0, 1}) {
        const std::string lun = "/lun_" + std::to_string(n);
        EXPECT_EQ("1", Attr(AclDir(kHost1) + lun + "/write_protect")) << n;
        EXPECT_EQ("0", Attr(AclDir(kHost2) + lun + "/write_protect")) << n;
        EXPECT_EQ("1", Attr(AclDir(kHost3) + lun + "/write_protect")) << n;
        EXPECT_TRUE(InKernel(AclDir(kHost2) + lun + "/lio_lun")) << n;
    }
    for (const std::string &h : {kHost1, kHost2, kHost3}) {
        EXPECT_EQ("store-user", Attr(AclDir(h) + "/auth/userid")) << h;
        EXPECT_EQ("secret-of-store", Attr(AclDir(h) + "/auth/password")) << h;
    }

    // The default entry is the portal group's demo mode, not a node access list.
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingCreate(Acl(tid, kDefault, ISCSI_TARGET_AUTHORITY_RO))) << log_.Dump();
    EXPECT_FALSE(InKernel(AclDir(kDefault)));
    EXPECT_EQ("1", Attr(Tpg() + "/attrib/generate_node_acls"));
    EXPECT_EQ("1", Attr(Tpg() + "/attrib/demo_mode_write_protect"));

    // The kernel refuses the second LUN entry of a new initiator: the entry and the node
    // access list made for it go again, and so does its stored entry.
    const std::string host4 = "iqn.1991-05.com.example:host4";
    ASSERT_EQ(0, SetFault("mkdir", AclDir(host4) + "/lun_1", "EIO"));
    log_.Clear();
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(Acl(tid, host4, ISCSI_TARGET_AUTHORITY_RW)));
    EXPECT_FALSE(InKernel(AclDir(host4))) << TraceDump();
    EXPECT_EQ((std::vector<std::string>{kHost1 + "=1", kHost2 + "=3", kHost3 + "=0", kDefault + "=1"}), Stored(tid));
    EXPECT_EQ(1u, Messages(log_, "Failed to add ACL masking of tid:" + std::to_string(tid) +
                                     " to the kernel, err=Failed to cerate directory")
                      .size())
        << log_.Dump();

    // A node access list the kernel will not make leaves nothing stored either.
    ASSERT_EQ(0, SetFault("mkdir", AclDir(host4), "ENOMEM"));
    EXPECT_EQ(18990715u, ORLOiSCSITargetMaskingCreate(Acl(tid, host4, ISCSI_TARGET_AUTHORITY_RW)));
    EXPECT_EQ(4u, Stored(tid).size());
    // Once the kernel takes it, the same request succeeds.
    EXPECT_EQ(0u, ORLOiSCSITargetMaskingCreate(Acl(tid, host4, ISCSI_TARGET_AUTHORITY_RW))) << log_.Dump();
    EXPECT_EQ("0", Attr(AclDir(host4) + "/lun_1/write_protect"));
}

TEST_F(MaskingsTest, UpdateRewritesWriteProtectionAndRestoresNodeAclsAndChap) {
    RunningTargetWithLuns();
    if (HasFatalFailure()) return;
    const int tid = target_.tid;
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingsCreate({Acl(tid, kHost1, ISCSI_TARGET_AUTHORITY_RO),
                                                 Acl(tid, kHost2, ISCSI_TARGET_AUTHORITY_RW),
                                                 Acl(tid, kDefault, ISCSI_TARGET_AUTHORITY_NONE)}))
        << log_.Dump();
    EXPECT_EQ("0", Attr(Tpg() + "/attrib/generate_node_acls"));

    ASSERT_EQ(0u, ORLOiSCSITargetMaskingsUpdate({Acl(tid, kHost1, ISCSI_TARGET_AUTHORITY_RW),
                                                 Acl(tid, kDefault, ISCSI_TARGET_AUTHORITY_RW)}))
        << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{kHost1 + "=3", kHost2 + "=3", kDefault + "=3"}), Stored(tid));
    EXPECT_EQ("0", Attr(AclDir(kHost1) + "/lun_0/write_protect"));
    EXPECT_EQ("0", Attr(AclDir(kHost1) + "/lun_1/write_protect"));
    EXPECT_EQ("1", Attr(Tpg() + "/attrib/generate_node_acls"));
    EXPECT_EQ("0", Attr(Tpg() + "/attrib/demo_mode_write_protect"));

    // A node access list lost from the kernel comes back with its LUNs and credentials.
    ASSERT_EQ(0u, ORLOiSCSITargetPortalGroupNodeAclRemove(("/config" + AclDir(kHost2)).c_str())) << log_.Dump();
    ASSERT_FALSE(InKernel(AclDir(kHost2)));
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingUpdate(Acl(tid, kHost2, ISCSI_TARGET_AUTHORITY_RO))) << log_.Dump();
    EXPECT_EQ("1", Attr(AclDir(kHost2) + "/lun_0/write_protect"));
    EXPECT_EQ("1", Attr(AclDir(kHost2) + "/lun_1/write_protect"));
    EXPECT_EQ("store-user", Attr(AclDir(kHost2) + "/auth/userid"));

    // Only listed initiators can be updated; the whole request is refused.
    const std::string before = ReadFile(kAclConf);
    log_.Clear();
    EXPECT_EQ(18990717u, ORLOiSCSITargetMaskingsUpdate({Acl(tid, kHost1, 1), Acl(tid, kHost3, 1)}));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_maskings_update.cpp", "ORLOiSCSITargetMaskingsUpdate",
                       "Non-existent iSCSI ACL, tid:" + std::to_string(tid) + " initiator:" + kHost3))
        << log_.Dump();
    EXPECT_EQ(18990717u, ORLOiSCSITargetMaskingsUpdate({Acl(tid, kHost1, 1), Acl(tid + 1, kHost2, 1)}));
    EXPECT_EQ(18990717u, ORLOiSCSITargetMaskingUpdate(Acl(tid, kHost1, -1)));
    EXPECT_EQ(before, ReadFile(kAclConf));
    EXPECT_EQ("0", Attr(AclDir(kHost1) + "/lun_0/write_protect"));

    // The kernel refuses the new protection of the second LUN: the stored authority and
    // the first LUN's protection go back to read-write.
    ASSERT_EQ(0, SetFault("write", AclDir(kHost1) + "/lun_1/write_protect", "EIO"));
    EXPECT_EQ(18990717u, ORLOiSCSITargetMaskingUpdate(Acl(tid, kHost1, ISCSI_TARGET_AUTHORITY_RO)));
    EXPECT_EQ(before, ReadFile(kAclConf));
    EXPECT_EQ("0", Attr(AclDir(kHost1) + "/lun_0/write_protect"));
    EXPECT_EQ("0", Attr(AclDir(kHost1) + "/lun_1/write_protect"));
}

TEST_F(MaskingsTest, RemoveTakesTheInitiatorsNodeAclAndLunEntriesOut) {
    RunningTargetWithLuns();
    if (HasFatalFailure()) return;
    const int tid = target_.tid;
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingsCreate({Acl(tid, kHost1, ISCSI_TARGET_AUTHORITY_RO),
                                                 Acl(tid, kHost2, ISCSI_TARGET_AUTHORITY_RW),
                                                 Acl(tid, kDefault, ISCSI_TARGET_AUTHORITY_RW)}))
        << log_.Dump();

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingRemove(Acl(tid, kHost1, 0))) << log_.Dump();
    EXPECT_FALSE(InKernel(AclDir(kHost1)));
    EXPECT_TRUE(InKernel(AclDir(kHost2) + "/lun_1/lio_lun"));
    EXPECT_EQ((std::vector<std::string>{kHost2 + "=3", kDefault + "=3"}), Stored(tid));
    // LUN entries lose their links and go before the node access list.
    const std::vector<std::string> removal = {
        "unlink " + AclDir(kHost1) + "/lun_0/lio_lun 0", "rmdir " + AclDir(kHost1) + "/lun_0 0",
        "unlink " + AclDir(kHost1) + "/lun_1/lio_lun 0", "rmdir " + AclDir(kHost1) + "/lun_1 0",
        "rmdir " + AclDir(kHost1) + " 0"};
    EXPECT_EQ(removal, Changes()) << TraceDump();
    // What is already gone is removed.
    EXPECT_EQ(0u, ORLOiSCSITargetMaskingRemove(Acl(tid, kHost1, 0))) << log_.Dump();

    // Without the default entry only listed initiators may log in.
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingRemove(Acl(tid, kDefault, 0))) << log_.Dump();
    EXPECT_EQ("0", Attr(Tpg() + "/attrib/generate_node_acls"));
    EXPECT_EQ(std::vector<std::string>{kHost2 + "=3"}, Stored(tid));

    // The kernel keeps the node access list: the entry is stored again and its LUN
    // entries are back.
    ASSERT_EQ(0, SetFault("rmdir", AclDir(kHost2), "EBUSY"));
    log_.Clear();
    EXPECT_EQ(18990716u, ORLOiSCSITargetMaskingRemove(Acl(tid, kHost2, 0)));
    EXPECT_EQ(std::vector<std::string>{kHost2 + "=3"}, Stored(tid));
    EXPECT_TRUE(InKernel(AclDir(kHost2) + "/lun_0/lio_lun"));
    EXPECT_TRUE(InKernel(AclDir(kHost2) + "/lun_1/lio_lun"));
    EXPECT_EQ("0", Attr(AclDir(kHost2) + "/lun_1/write_protect"));
    EXPECT_FALSE(Messages(log_, "Failed to delete ACL masking of tid:").empty()) << log_.Dump();

    EXPECT_EQ(18990716u, ORLOiSCSITargetMaskingRemove(Acl(99, kHost2, 0)));
    EXPECT_EQ(18990716u, ORLOiSCSITargetMaskingsRemove({}));
}

TEST_F(MaskingsTest, DefaultEntrySwitchesDemoModeOnlyWhileTheNodeIsInTheKernel) {
    RunningTargetWithLuns();
    if (HasFatalFailure()) return;
    const std::string gen = Tpg() + "/attrib/generate_node_acls";
    const std::string cache = Tpg() + "/attrib/cache_dynamic_acls";
    const std::string wp = Tpg() + "/attrib/demo_mode_write_protect";
    struct Case {
        int authority;
        const char *generate, *writeProtect;
    } cases[] = {{3, "1", "0"}, {0, "0", "0"}, {1, "1", "1"}, {2, "1", "0"}};
    for (const Case &c : cases) {
        log_.Clear();
        ASSERT_EQ(0u, ORLOiSCSITargetDefaultAclSet(&target_, c.authority)) << c.authority << log_.Dump();
        EXPECT_EQ(std::vector<std::string>{kDefault + "=" + std::to_string(c.authority)}, Stored(target_.tid));
        EXPECT_EQ(c.generate, Attr(gen)) << c.authority;
        if (c.authority != 0) {
            EXPECT_EQ("1", Attr(cache)) << c.authority;
        }
        EXPECT_EQ(c.writeProtect, Attr(wp)) << c.authority;
        EXPECT_EQ(c.authority == 2 ? 1u : 0u,
                  Messages(log_, "Suspicious iSCSI Target default rw permission: " + std::string(target_.iqn) + " 2")
                      .size())
            << log_.Dump();
    }
    EXPECT_FALSE(InKernel(AclDir(kDefault)));

    // A refused write is reported with its path and value.
    ASSERT_EQ(0, SetFault("write", wp, "EIO"));
    log_.Clear();
    EXPECT_NE(0u, ORLOiSCSITargetDefaultAclSet(&target_, ISCSI_TARGET_AUTHORITY_RO));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSITargetDefaultAclEnable(").size()) << log_.Dump();

    // Stored only, for a target not in the kernel; bad values are refused unstored.
    ORLOiSCSITarget idle = MakeTarget("idle", false);
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSITargetDefaultAclSet(&idle, ISCSI_TARGET_AUTHORITY_RO)) << log_.Dump();
    EXPECT_TRUE(Changes().empty()) << TraceDump();
    EXPECT_EQ(std::vector<std::string>{kDefault + "=1"}, Stored(idle.tid));
    log_.Clear();
    EXPECT_EQ(18990712u, ORLOiSCSITargetDefaultAclSet(&idle, 7));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSITargetConfAclAdd(" + std::to_string(idle.tid) + ", \"" + kDefault +
                                     "\", 7) failed, err=Bad target acl authority")
                      .size())
        << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetDefaultAclSet(nullptr, 1));
}

// The older target core has no demo mode for the default entry: it is a node access list
// with LUN entries like any initiator.
class MaskingsOldCoreTest : public MaskingsTest {
  protected:
    int Version() const override { return 2; }
};

TEST_F(MaskingsOldCoreTest, DefaultEntryIsANodeAclWithItsLuns) {
    RunningTargetWithLuns();
    if (HasFatalFailure()) return;
    ASSERT_EQ(2u, ORLOiSCSIGetLioVersion());
    ASSERT_EQ(0u, ORLOiSCSITargetDefaultAclSet(&target_, ISCSI_TARGET_AUTHORITY_RO)) << log_.Dump();
    EXPECT_EQ("1", Attr(AclDir(kDefault) + "/lun_0/write_protect"));
    EXPECT_EQ("1", Attr(AclDir(kDefault) + "/lun_1/write_protect"));
    EXPECT_EQ("store-user", Attr(AclDir(kDefault) + "/auth/userid"));
    EXPECT_EQ("0", Attr(Tpg() + "/attrib/generate_node_acls"));

    ASSERT_EQ(0u, ORLOiSCSITargetMaskingUpdate(Acl(target_.tid, kDefault, ISCSI_TARGET_AUTHORITY_RW)))
        << log_.Dump();
    EXPECT_EQ("0", Attr(AclDir(kDefault) + "/lun_1/write_protect"));
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingRemove(Acl(target_.tid, kDefault, 0))) << log_.Dump();
    EXPECT_FALSE(InKernel(AclDir(kDefault)));
}

}  // namespace
}  // namespace maskings_test
