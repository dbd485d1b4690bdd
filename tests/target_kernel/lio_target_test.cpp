// Building target nodes in the simulated kernel: the tree a load leaves value by value
// and in order, what a failure leaves behind, the default entry, mappings with their
// LUNs, the status word, portals, and the self-test.
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"
#include "lun/lun_fixture.h"
#include "service/service_test_util.h"
#include "target/target_fixture.h"

namespace target_kernel_test {
namespace {

using service_test::HasLog;
using service_test::Messages;

const std::string kHost1 = "iqn.1991-05.com.example:host1";
const std::string kHost2 = "iqn.1991-05.com.example:host2";
const std::string kDefault = ORLO_ISCSI_DEFAULT_ACL_INITIATOR;
const std::string kPortal = "192.0.2.10:3260";

class LioTargetTest : public service_test::ServiceSimTest {
  protected:
    virtual int Version() const { return 4; }

    void SetUp() override {
        ServiceSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, Version()));
        ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
        defaults_ = ReadFile("/etc.defaults/orloinfo.conf");
    }

    // A target as the file holds it: enabled, listening on one configured portal.
    static ORLOiSCSITarget Record(int tid) {
        ORLOiSCSITarget t = target_test::MakeTarget(tid);
        t.enabled = true;
        t.max_recv_seg_bytes = 8192;
        t.max_send_seg_bytes = 65536;
        strcpy(t.network_portals, kPortal.c_str());
        return t;
    }
    static std::string Node(const ORLOiSCSITarget &t) { return std::string("/target/iscsi/") + t.iqn; }
    static std::string Tpg(const ORLOiSCSITarget &t) { return Node(t) + "/tpgt_1"; }

    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
    std::string Val(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
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
    void SetDefaults(const std::string &extra) { WriteFile("/etc.defaults/orloinfo.conf", defaults_ + extra); }

    // A file LUN on /volume1, stored as creation leaves it (section and sparse image).
    ORLOiSCSILun StoredFileLun(int lid) {
        ORLOiSCSILun lun = lun_test::MakeLun(lid, ORLO_ISCSI_LUN_TYPE_FILE);
        lun.size = 1048576;
        EXPECT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        char data[4096];
        EXPECT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
        EXPECT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE)) << log_.Dump();
        return lun;
    }
    static std::string Backstore(const ORLOiSCSILun &lun) {
        return std::string("/target/core/fileio_0/LUN_") + lun.uuid;
    }

    std::string defaults_;
};

class LioTargetV2Test : public LioTargetTest {
  protected:
    const char *TargetType() const override { return "lio"; }
    int Version() const override { return 2; }
};

// The access list of a tid as ORLOiSCSILioTargetEnable takes it; freed by the holder.
struct Acls {
    explicit Acls(int tid) {
        ORLOiSCSIListInit(&list);
        EXPECT_EQ(0u, ORLOiSCSITargetConfAclLoad(tid, &list));
    }
    ~Acls() { ORLOiSCSITargetAclListFree(&list); }
    ORLOiSCSIAclList list;
};

TEST_F(LioTargetTest, LoadWritesEveryValueInOrderForEachAuthentication) {
    struct Case {
        int auth;
        bool hdr, data;
        int sessions;
        const char *wantSessions;
    } cases[] = {
        {ORLO_ISCSI_AUTH_NONE, true, false, 0, "65535"},
        {ORLO_ISCSI_AUTH_CHAP, false, true, 7, "7"},
        {ORLO_ISCSI_AUTH_MUTUAL_CHAP, true, true, 100000, "65535"},
    };
    int tid = 0;
    for (const Case &c : cases) {
        SCOPED_TRACE("auth_type " + std::to_string(c.auth));
        ORLOiSCSITarget t = Record(++tid);
        t.auth_type = c.auth;
        t.has_header_checksum = c.hdr;
        t.has_data_checksum = c.data;
        t.max_sessions = c.sessions;
        t.max_recv_seg_bytes = 8192 * tid;
        strcpy(t.user, "tuser");
        strcpy(t.password, "tsecret123456");
        strcpy(t.mutual_user, "muser");
        strcpy(t.mutual_password, "msecret123456");
        const std::string n = Node(t), g = Tpg(t);

        ClearTrace();
        ASSERT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false)) << log_.Dump();
        std::vector<std::string> want = {
            "mkdir " + n + " 0",
            "mkdir " + g + " 0",
            "write " + g + "/attrib/generate_node_acls 0 0",
            "write " + g + "/attrib/default_cmdsn_depth 16 0",
            "mkdir " + g + "/np/" + kPortal + " 0",
        };
        if (c.auth == ORLO_ISCSI_AUTH_NONE) {
            // The kernel starts with authentication on: switched off, once.
            want.push_back("write " + g + "/attrib/authentication 0 0");
        } else {
            // Already 1 in the kernel: not written.
            want.push_back("write " + g + "/auth/userid tuser 0");
            want.push_back("write " + g + "/auth/password tsecret123456 0");
            if (c.auth == ORLO_ISCSI_AUTH_MUTUAL_CHAP) {
                want.push_back("write " + g + "/auth/userid_mutual muser 0");
                want.push_back("write " + g + "/auth/password_mutual msecret123456 0");
            }
        }
        const std::string dd = c.data ? "CRC32C" : "CRC32C,None", hd = c.hdr ? "CRC32C" : "CRC32C,None";
        for (const std::string &w : std::vector<std::string>{
                 "param/DataDigest " + dd, "param/HeaderDigest " + hd,
              "param/MaxRecvDataSegmentLength " + std::to_string(8192 * tid), "param/MaxXmitDataSegmentLength 65536",
                 std::string("max_session ") + c.wantSessions, "param/TargetAlias Orlo Target"})
            want.push_back("write " + g + "/" + w + " 0");
        EXPECT_EQ(want, Changes());

        // What the kernel now holds.
        EXPECT_EQ(c.auth == ORLO_ISCSI_AUTH_NONE ? "0" : "1", Val(g + "/attrib/authentication"));
        EXPECT_EQ(c.wantSessions, Val(g + "/max_session"));
        EXPECT_EQ("Orlo Target", Val(g + "/param/TargetAlias"));
        EXPECT_EQ(dd, Val(g + "/param/DataDigest"));
        EXPECT_EQ(std::to_string(8192 * tid), Val(g + "/param/MaxRecvDataSegmentLength"));
        EXPECT_EQ(c.auth == ORLO_ISCSI_AUTH_MUTUAL_CHAP ? "1" : "0", Val(g + "/auth/authenticate_target"));
        EXPECT_EQ("0", Val(g + "/enable")) << "Load leaves the portal group off";
        EXPECT_EQ(ORLO_ISCSI_TARGET_STATUS_PRESENT, ORLOiSCSITargetStatusGet(t.tid, &t));
    }
    // No secret reached the log.
    EXPECT_FALSE(log_.Contains("secret123456")) << log_.Dump();
}

TEST_F(LioTargetTest, PresentNodeIsLoadedAlreadyAndRecordsTheKernelWouldRefuseNeverReachIt) {
    ORLOiSCSITarget t = Record(1);
    t.enabled = false;
    ASSERT_EQ(0, mkdir(Cfg(Node(t)).c_str(), 0700));
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_TRUE(Trace().empty()) << TraceDump();  // not even a read
    EXPECT_FALSE(t.enabled) << "nothing else is done, the record is not stored";
    EXPECT_FALSE(Exists(target_test::kTargetConf));
    // The self-test's trial never counts a present node as its own.
    EXPECT_EQ(0xFFFFFFFFu, ORLOiSCSILioTargetLoad(&t, true));
    EXPECT_TRUE(InKernel(Node(t)));

    struct Bad {
        const char *what;
        void (*spoil)(ORLOiSCSITarget *);
        uint32_t code;
    } bad[] = {
        {"iqn with a slash", [](ORLOiSCSITarget *r) { strcpy(r->iqn, "iqn.2000-01.com.orlo:a/../b"); }, 18990701u},
        {"upper-case iqn", [](ORLOiSCSITarget *r) { strcpy(r->iqn, "IQN.2000-01.com.orlo:x"); }, 18990701u},
        {"recv segment", [](ORLOiSCSITarget *r) { r->max_recv_seg_bytes = 511; }, 18990738u},
        {"send segment", [](ORLOiSCSITarget *r) { r->max_send_seg_bytes = 16777216; }, 18990739u},
        {"sessions", [](ORLOiSCSITarget *r) { r->max_sessions = -1; }, 18990703u},
        {"user", [](ORLOiSCSITarget *r) { memset(r->user, 'u', sizeof(r->user)); }, 18990004u},
    };
    for (const Bad &b : bad) {
        ORLOiSCSITarget r = Record(2);
        b.spoil(&r);
        ClearTrace();
        EXPECT_EQ(b.code, ORLOiSCSILioTargetLoad(&r, false)) << b.what;
        EXPECT_TRUE(Changes().empty()) << b.what;
    }
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetLoad(nullptr, false));
}

TEST_F(LioTargetTest, FailedLoadTakesTheHalfBuiltNodeAway) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t));
    const std::string g = Tpg(t);

    // A refused write in the middle: 18990040, with path and value in the log.
    ASSERT_EQ(0, SetFault("write", g + "/param/MaxXmitDataSegmentLength", "EIO"));
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_FALSE(InKernel(Node(t))) << TraceDump();
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSIConfigfsPutInteger(\"/config" + g +
                                     "/param/MaxXmitDataSegmentLength\", 65536) failed, err=")
                      .size())
        << log_.Dump();

    // The command window: both lines, and the same code.
    log_.Clear();
    ASSERT_EQ(0, SetFault("write", g + "/attrib/default_cmdsn_depth", "EIO"));
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_FALSE(InKernel(Node(t)));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILioTargetDefaultCmdsnDepthLoad(").size()) << log_.Dump();

    // The portal group cannot be made.
    ASSERT_EQ(0, SetFault("mkdir", g, "ENOMEM"));
    EXPECT_EQ(18990028u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_FALSE(InKernel(Node(t)));

    // CHAP credentials refused: the callee's code, the secret masked in the line.
    t.auth_type = ORLO_ISCSI_AUTH_CHAP;
    strcpy(t.user, "tuser");
    strcpy(t.password, "tsecret123456");
    log_.Clear();
    ASSERT_EQ(0, SetFault("write", g + "/auth/password", "EINVAL"));
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_FALSE(InKernel(Node(t)));
    EXPECT_EQ(std::vector<std::string>({"ORLOiSCSILioTargetChapAuthAdd(ISCSI_AUTH_SINGLE_CHAP, \"" +
                                        std::string(t.iqn) +
                                        "\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, \"tuser\", \"********\") failed, "
                                        "err=Failed to write file"}),
              Messages(log_, "ORLOiSCSILioTargetChapAuthAdd("));
    EXPECT_FALSE(log_.Contains("tsecret123456")) << log_.Dump();

    // A failing read of the authentication switch is a read failure.
    ASSERT_EQ(0, SetFault("read", g + "/attrib/authentication", "EIO"));
    EXPECT_EQ(18990039u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_FALSE(InKernel(Node(t)));

    // An authentication type nobody knows ends the load there, without a failure: the
    // node stays, without its parameters.
    t.auth_type = 5;
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_TRUE(InKernel(g));
    EXPECT_EQ("LIO Target", Val(g + "/param/TargetAlias"));
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_target_load.cpp", "AuthLoad",
                       "Failed to set CHAP for iSCSI Target Portal Group: " + std::string(t.iqn) +
                           " 1, Un-supported CHAP type 5"))
        << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSITargetUnloadByIqn(t.iqn));

    // The self-test's trial clears up by itself: a failure leaves the node.
    t.auth_type = ORLO_ISCSI_AUTH_NONE;
    ASSERT_EQ(0, SetFault("write", g + "/param/TargetAlias", "EIO"));
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetLoad(&t, true));
    EXPECT_TRUE(InKernel(g));
}

TEST_F(LioTargetTest, LoadStoresTheEnabledFlagAndReadsTheCommandWindowFromTheDefaults) {
    ORLOiSCSITarget t = Record(1);
    t.enabled = false;
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t));
    ASSERT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false)) << log_.Dump();
    EXPECT_TRUE(t.enabled);
    ORLOiSCSITarget stored;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByTid(1, 0, &stored));
    EXPECT_TRUE(stored.enabled);
    ASSERT_EQ(0u, ORLOiSCSITargetUnloadByIqn(t.iqn));

    // The record cannot be stored: 18990726, the flag cleared again, the node gone.
    WriteFile(target_test::kTargetConf, target_test::Section(2, "other"));
    ORLOiSCSITarget lost = Record(3);
    lost.enabled = false;
    log_.Clear();
    EXPECT_EQ(18990726u, ORLOiSCSILioTargetLoad(&lost, false));
    EXPECT_FALSE(lost.enabled);
    EXPECT_FALSE(InKernel(Node(lost)));
    EXPECT_FALSE(Messages(log_, "ORLOiSCSITargetConfUpdate(").empty()) << log_.Dump();

    struct Depth {
        const char *line;  // appended to the defaults file
        const char *want;
    } depths[] = {
        {"", "16"},
        {"iscsitrg_cmdsn_depth=\"0\"\n", "16"},
        {"iscsitrg_cmdsn_depth=\"-4\"\n", "16"},
        {"iscsitrg_cmdsn_depth=\"deep\"\n", "16"},
        {"iscsitrg_cmdsn_depth=\"12345678901234567890\"\n", "16"},
        {"iscsitrg_cmdsn_depth=\"32\"\n", "32"},
        {"iscsitrg_cmdsn_depth=\"4096\"\n", "512"},
    };
    ORLOiSCSITarget d = Record(1);
    for (const Depth &c : depths) {
        SetDefaults(c.line);
        ASSERT_EQ(0u, ORLOiSCSILioTargetLoad(&d, false)) << c.line << log_.Dump();
        EXPECT_EQ(c.want, Val(Tpg(d) + "/attrib/default_cmdsn_depth")) << c.line;
        ASSERT_EQ(0u, ORLOiSCSITargetUnloadByIqn(d.iqn));
    }
}

TEST_F(LioTargetTest, DefaultEntrySwitchesDemoModeAndListedInitiatorsGetNodeAcls) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost1.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kDefault.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost2.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(2, "iqn.1991-05.com.example:elsewhere", 3));

    std::vector<ORLOiSCSIAcl> entries;
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingGet(1, entries));
    ASSERT_EQ(3u, entries.size());
    EXPECT_EQ(kHost1, entries[0].initiator);
    EXPECT_EQ(kDefault, entries[1].initiator);
    EXPECT_EQ(1, entries[1].authority);
    EXPECT_EQ(nullptr, entries[2].link.next);
    ASSERT_EQ(0u, ORLOiSCSITargetMaskingGet(9, entries));
    EXPECT_TRUE(entries.empty());

    ASSERT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false)) << log_.Dump();
    const std::string g = Tpg(t);
    EXPECT_TRUE(InKernel(g + "/acls/" + kHost1));
    EXPECT_TRUE(InKernel(g + "/acls/" + kHost2));
    EXPECT_FALSE(InKernel(g + "/acls/" + kDefault));
    EXPECT_FALSE(InKernel(g + "/acls/iqn.1991-05.com.example:elsewhere"));
    EXPECT_EQ("1", Val(g + "/attrib/generate_node_acls"));
    EXPECT_EQ("1", Val(g + "/attrib/cache_dynamic_acls"));
    EXPECT_EQ("1", Val(g + "/attrib/demo_mode_write_protect"));

    // Each authority, applied to the running group.
    struct Case {
        int authority;
        std::vector<std::string> writes;  // file value
        bool suspicious;
    } cases[] = {
        {3, {"generate_node_acls 1", "cache_dynamic_acls 1", "demo_mode_write_protect 0"}, false},
        {2, {"generate_node_acls 1", "cache_dynamic_acls 1", "demo_mode_write_protect 0"}, true},
        {1, {"generate_node_acls 1", "cache_dynamic_acls 1", "demo_mode_write_protect 1"}, false},
        {0, {"generate_node_acls 0"}, false},
    };
    for (const Case &c : cases) {
        ClearTrace();
        log_.Clear();
        EXPECT_EQ(0u, ORLOiSCSITargetDefaultAclEnable(&t, c.authority)) << c.authority;
        std::vector<std::string> want;
        for (const std::string &w : c.writes) want.push_back("write " + g + "/attrib/" + w + " 0");
        EXPECT_EQ(want, Changes()) << c.authority;
        EXPECT_EQ(c.suspicious, HasLog(log_, "iscsi_target_default_acl_enable.cpp", "ORLOiSCSITargetDefaultAclEnable",
                                       "Suspicious iSCSI Target default rw permission: " + std::string(t.iqn) + " 2"))
            << c.authority << log_.Dump();
    }
    ASSERT_EQ(0, SetFault("write", g + "/attrib/cache_dynamic_acls", "EIO"));
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSITargetDefaultAclEnable(&t, 3));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSIConfigfsWrite(\"/config" + g + "/attrib/cache_dynamic_acls\", \"1\") failed")
                      .size())
        << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetDefaultAclEnable(nullptr, 1));

    // A node access list that cannot be made fails the load and takes the node away.
    ASSERT_EQ(0u, ORLOiSCSITargetUnloadByIqn(t.iqn));
    ASSERT_EQ(0, SetFault("mkdir", g + "/acls/" + kHost2, "ENOMEM"));
    log_.Clear();
    EXPECT_EQ(18990028u, ORLOiSCSILioTargetLoad(&t, false));
    EXPECT_FALSE(InKernel(Node(t)));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILioTargetAclAdd(").size()) << log_.Dump();
}

TEST_F(LioTargetV2Test, DefaultEntryIsANodeAclAndDemoModeStaysOff) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kDefault.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false)) << log_.Dump();
    const std::string g = Tpg(t);
    EXPECT_TRUE(InKernel(g + "/acls/" + kDefault));
    EXPECT_EQ("0", Val(g + "/attrib/generate_node_acls"));
    for (int authority : {0, 1, 3}) {
        ClearTrace();
        EXPECT_EQ(0u, ORLOiSCSITargetDefaultAclEnable(&t, authority));
        EXPECT_EQ(std::vector<std::string>({"write " + g + "/attrib/generate_node_acls 0 0"}), Changes());
    }

    // A mapping gives the default entry a LUN entry of its own.
    ORLOiSCSILun lun = lun_test::MakeLun(1, ORLO_ISCSI_LUN_TYPE_FILE);
    lun.size = 1048576;
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
    char data[4096];
    ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
    ASSERT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE));
    Acls acls(1);
    ASSERT_EQ(0u, ORLOiSCSILioMappingAdd(&t, &lun, 3, &acls.list)) << log_.Dump();
    EXPECT_TRUE(InKernel(g + "/acls/" + kDefault + "/lun_3/lio_lun"));
    EXPECT_EQ("0", Val(g + "/acls/" + kDefault + "/lun_3/write_protect"));
}

TEST_F(LioTargetTest, EnableMapsStoredLunsAndSwitchesTheGroupOnStatusFollows) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost1.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kDefault.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost2.c_str(), 1));
    ORLOiSCSILun lun = StoredFileLun(4);
    ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(1, 4, 2));
    ORLOiSCSILun unmapped = StoredFileLun(5);
    SetDefaults("iscsi_defer_queue_mode=\"single\"\n");
    const std::string g = Tpg(t);

    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_FALSE(ORLOiSCSITargetIsAlive(1));
    Acls acls(1);
    ASSERT_EQ(0u, ORLOiSCSILioTargetEnable(&t, &acls.list)) << log_.Dump() << TraceDump();
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, &t));
    EXPECT_TRUE(ORLOiSCSITargetIsAlive(1));
    EXPECT_TRUE(ORLOiSCSILioIsTargetAlive(t.iqn, 1));
    EXPECT_FALSE(ORLOiSCSILioIsTargetAlive(t.iqn, 2));
    EXPECT_FALSE(ORLOiSCSILioIsTargetAlive("../..", 1));

    const std::string bs = Backstore(lun);
    EXPECT_EQ("1", Val(bs + "/enable"));
    EXPECT_EQ("single", Val(bs + "/attrib/defer_queue_mode"));
    char link[512] = "";
    ASSERT_GT(readlink(Cfg(g + "/lun/lun_2/LUN_" + std::string(lun.uuid)).c_str(), link, sizeof(link) - 1), 0);
    EXPECT_NE(std::string::npos, std::string(link).find("target/core/fileio_0/LUN_" + std::string(lun.uuid)));
    EXPECT_TRUE(InKernel(g + "/acls/" + kHost1 + "/lun_2/lio_lun"));
    EXPECT_EQ("0", Val(g + "/acls/" + kHost1 + "/lun_2/write_protect"));
    EXPECT_EQ("1", Val(g + "/acls/" + kHost2 + "/lun_2/write_protect"));
    EXPECT_FALSE(InKernel(g + "/acls/" + kDefault)) << "the demo mode stands for the default entry";
    EXPECT_FALSE(InKernel(Backstore(unmapped))) << "only mapped LUNs are loaded";

    // Enabling a running target adds nothing new and leaves the switch alone.
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILioTargetEnable(&t, &acls.list)) << log_.Dump();
    for (const std::string &c : Changes()) {
        EXPECT_EQ(std::string::npos, c.find(g + "/enable")) << c;
        EXPECT_NE("rmdir", c.substr(0, 5)) << c;
    }
    EXPECT_TRUE(InKernel(g + "/acls/" + kHost2 + "/lun_2/lio_lun"));

    // Allow writes only while the group is off; Disable switches it off and stores.
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetAllow(&t));
    EXPECT_TRUE(Changes().empty());
    ASSERT_EQ(0u, ORLOiSCSILioTargetDisable(&t));
    EXPECT_EQ(1, ORLOiSCSITargetStatusGet(1, nullptr));
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetAllow(&t));
    EXPECT_EQ(std::vector<std::string>({"write " + g + "/enable 1 0"}), Changes());
    ASSERT_EQ(0u, ORLOiSCSILioTargetDisallow(&t));

    // A group whose switch cannot be read counts as present only.
    ASSERT_EQ(0u, ORLOiSCSILioTargetAllow(&t));
    ASSERT_EQ(0, SetFault("read", g + "/enable", "EIO"));
    EXPECT_EQ(1, ORLOiSCSITargetStatusGet(1, &t));

    // Unload by record: off, stored, gone.
    ASSERT_EQ(0u, ORLOiSCSITargetUnload(&t)) << log_.Dump();
    EXPECT_FALSE(InKernel(Node(t)));
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSITargetUnload(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetEnable(&t, nullptr));

    // Unknown tids and a failing query report "not in the kernel".
    log_.Clear();
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(77, nullptr));
    EXPECT_FALSE(ORLOiSCSITargetIsAlive(77));
    EXPECT_EQ(2u, Messages(log_, "Failed, get zero target").size()) << log_.Dump();
}

TEST_F(LioTargetTest, FailedMappingAddTakesAwayWhatItMade) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost1.c_str(), 3));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost2.c_str(), 1));
    ASSERT_EQ(0u, ORLOiSCSILioTargetLoad(&t, false)) << log_.Dump();
    ORLOiSCSILun lun = StoredFileLun(1);
    Acls acls(1);
    const std::string g = Tpg(t);

    // The second initiator's write protection is refused: every initiator entry and
    // the group's lun_0 with its link go again.
    ASSERT_EQ(0, SetFault("write", g + "/acls/" + kHost2 + "/lun_0/write_protect", "EIO"));
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSILioMappingAdd(&t, &lun, 0, &acls.list));
    EXPECT_FALSE(InKernel(g + "/acls/" + kHost1 + "/lun_0"));
    EXPECT_FALSE(InKernel(g + "/acls/" + kHost2 + "/lun_0"));
    EXPECT_FALSE(InKernel(g + "/lun/lun_0")) << TraceDump();
    EXPECT_TRUE(InKernel(g + "/acls/" + kHost1));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILioTargetLunACLInitiatorsAdd(\"" + std::string(t.iqn) +
                                     "\", ISCSI_TARGET_DEFAULT_TPGT_NUMBER, 0, ")
                      .size())
        << log_.Dump();

    // The backstore link is refused.
    ASSERT_EQ(0, SetFault("symlink", g + "/lun/lun_0/*", "EIO"));
    EXPECT_EQ(18990036u, ORLOiSCSILioMappingAdd(&t, &lun, 0, &acls.list));
    EXPECT_FALSE(InKernel(g + "/lun/lun_0"));

    // The backstore's queueing mode is refused.
    ASSERT_EQ(0, SetFault("write", Backstore(lun) + "/attrib/defer_queue_mode", "EINVAL"));
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSILioMappingAdd(&t, &lun, 0, &acls.list));
    EXPECT_FALSE(InKernel(g + "/lun/lun_0"));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILunConfigfsAttribSet(").size()) << log_.Dump();

    // After all that a clean add works, and repeating it keeps everything.
    ASSERT_EQ(0u, ORLOiSCSILioMappingAdd(&t, &lun, 0, &acls.list)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSILioMappingAdd(&t, &lun, 0, &acls.list)) << log_.Dump();
    EXPECT_TRUE(InKernel(g + "/acls/" + kHost2 + "/lun_0/lio_lun"));
    EXPECT_EQ("multi", Val(Backstore(lun) + "/attrib/defer_queue_mode"));

    // A failure on an entry that was there before leaves the group's entry in place.
    ASSERT_EQ(0, SetFault("write", g + "/acls/" + kHost1 + "/lun_0/write_protect", "EIO"));
    EXPECT_EQ(18990040u, ORLOiSCSILioMappingAdd(&t, &lun, 0, &acls.list));
    EXPECT_TRUE(InKernel(g + "/lun/lun_0/LUN_" + std::string(lun.uuid)));

    EXPECT_EQ(18990003u, ORLOiSCSILioMappingAdd(&t, nullptr, 0, &acls.list));
    EXPECT_EQ(18990003u, ORLOiSCSILioMappingAdd(&t, &lun, 0, nullptr));
    EXPECT_EQ(18990004u, ORLOiSCSILioMappingAdd(&t, &lun, 256, &acls.list));
    EXPECT_EQ(18990004u, ORLOiSCSILunConfigfsAttribSet(&lun, "../enable", "1"));
    EXPECT_EQ(18990003u, ORLOiSCSILunConfigfsAttribSet(&lun, "emulate_sync_cache", nullptr));
}

TEST_F(LioTargetTest, PortalListParsesWhatItCanAndSkipsTheRest) {
    ORLOiSCSIPortal p[8];
    log_.Clear();
    int n = ORLOiSCSITargetNetworkPortalConfParse(
        " 192.0.2.1:3260,[2001:db8::1]:3261,,bad,10.0.0.300:3260,192.0.2.2:0,192.0.2.3:70000,"
        "[fe80::1%2]:3260,192.0.2.4:32x,[2001:db8::2:3260,192.0.2.5 : 3262 ,",
        p, 8);
    ASSERT_EQ(3, n) << log_.Dump();
    EXPECT_EQ("192.0.2.1", std::string(p[0].addr));
    EXPECT_EQ(3260, p[0].port);
    EXPECT_EQ("2001:db8::1", std::string(p[1].addr));
    EXPECT_EQ(3261, p[1].port);
    EXPECT_EQ("fe80::1%2", std::string(p[2].addr));
    EXPECT_EQ(7u, Messages(log_, "Bad network portal \"").size()) << log_.Dump();

    EXPECT_EQ(2, ORLOiSCSITargetNetworkPortalConfParse("192.0.2.1:1,192.0.2.2:2,192.0.2.3:3", p, 2));
    EXPECT_EQ(0, ORLOiSCSITargetNetworkPortalConfParse("", p, 8));
    EXPECT_EQ(0, ORLOiSCSITargetNetworkPortalConfParse(
                     (std::string(70, '1') + ":3260,[" + std::string(70, 'a') + "]:3260").c_str(), p, 8));
    EXPECT_EQ(-1, ORLOiSCSITargetNetworkPortalConfParse(nullptr, p, 8));
    EXPECT_EQ(-1, ORLOiSCSITargetNetworkPortalConfParse("192.0.2.1:1", nullptr, 8));
}

TEST_F(LioTargetTest, PortalsComeFromTheListTheLoopbackOrTheInterfaces) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0, mkdir(Cfg(Node(t)).c_str(), 0700));
    ASSERT_EQ(0, mkdir(Cfg(Tpg(t)).c_str(), 0700));
    const std::string np = Tpg(t) + "/np/";

    // The configured list replaces the interfaces; a bad entry is skipped.
    snprintf(t.network_portals, sizeof(t.network_portals), "%s",
             "192.0.2.1:3260,[2001:db8::1]:3261,nonsense,[fe80::1%3]:3260");
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetNetworkPortalLoad(&t)) << log_.Dump();
    EXPECT_EQ(std::vector<std::string>({"mkdir " + np + "192.0.2.1:3260 0", "mkdir " + np + "[2001:db8::1]:3261 0",
                                        "mkdir " + np + "[fe80::1%3]:3260 0"}),
              Changes());

    // A failing portal is logged and the others are still made.
    ASSERT_EQ(0u, ORLOiSCSITargetPortalGroupNpUnload(("/config" + Tpg(t)).c_str()));
    ASSERT_EQ(0, SetFault("mkdir", np + "192.0.2.1:3260", "EIO"));
    log_.Clear();
    EXPECT_EQ(18990028u, ORLOiSCSILioTargetNetworkPortalLoad(&t));
    EXPECT_TRUE(InKernel(np + "[fe80::1%3]:3260"));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILioTargetNetworkPortalAdd(").size()) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSILioTargetNetworkPortalRemove(&t, "fe80::1%3", 3260));
    EXPECT_FALSE(InKernel(np + "[fe80::1%3]:3260"));
    EXPECT_EQ(0u, ORLOiSCSILioTargetNetworkPortalRemove(&t, "fe80::1%3", 3260)) << "already gone";

    // A backup object listens on the loopback address only.
    ASSERT_EQ(0u, ORLOiSCSITargetPortalGroupNpUnload(("/config" + Tpg(t)).c_str()));
    t.bkp_obj = true;
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetNetworkPortalLoad(&t));
    EXPECT_EQ(std::vector<std::string>({"mkdir " + np + "127.0.0.1:3260 0"}), Changes());

    // No list: every interface that is up with a link or a static address, on 3260.
    ASSERT_EQ(0u, ORLOiSCSITargetPortalGroupNpUnload(("/config" + Tpg(t)).c_str()));
    t.bkp_obj = false;
    strcpy(t.network_portals, " , ");
    OLIB_NET_IFINFO ifs[NUM_MAXIFACES];
    int nif = OLIBNetGetInterfaceInfo(ifs, NUM_MAXIFACES, static_cast<ORLONICENUM>(NIC_LOGICAL_PPP | NIC_HA_DATA));
    ASSERT_GE(nif, 0);
    std::vector<std::string> want;
    int linkLocal = 0;
    for (int i = 0; i < nif; ++i) {
        if (!(ifs[i].flags & (OLIB_NET_IF_LINK | OLIB_NET_IF_STATIC))) continue;
        EXPECT_STRNE("lo", ifs[i].szName);
        if (ifs[i].szIP[0] != '\0') want.push_back("mkdir " + np + ifs[i].szIP + ":3260 0");
        ORLO_V6_IP v6[NUM_MAXIFACES];
        int m = ORLOLnxV6IPGet(ifs[i].szName, v6, NUM_MAXIFACES);
        ASSERT_GE(m, 0);
        for (int j = 0; j < m; ++j) {
            // Link-local addresses (fe80::/10, given with their scope) never become portals.
            std::string a = v6[j].szIP;
            if (a.rfind("fe", 0) == 0 && strchr("89ab", a[2]) != nullptr) {
                EXPECT_NE(0, v6[j].scopeId) << a;
                ++linkLocal;
                continue;
            }
            want.push_back("mkdir " + np + "[" + a + "]:3260 0");
        }
    }
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetNetworkPortalLoad(&t)) << log_.Dump();
    EXPECT_EQ(want, Changes());
    for (const std::string &c : Changes()) EXPECT_EQ(std::string::npos, c.find("[fe80")) << c;
    if (linkLocal == 0) std::printf("note: no link-local IPv6 address on this machine to leave out\n");

    // Arguments.
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetNetworkPortalAdd(&t, "192.0.2.1/x", 3260));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetNetworkPortalAdd(&t, "192.0.2.1", 0));
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetNetworkPortalAdd(&t, "host.example", 3260));
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetNetworkPortalAdd(&t, nullptr, 3260));
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetNetworkPortalLoad(nullptr));
    EXPECT_EQ(-1, OLIBNetGetInterfaceInfo(nullptr, 1, NIC_PHYSICAL));
    ORLO_V6_IP none[1];
    EXPECT_EQ(0, ORLOLnxV6IPGet("no-such-if0", none, 1));
    EXPECT_EQ(-1, ORLOLnxV6IPGet(nullptr, none, 1));
}

TEST_F(LioTargetTest, ChapCredentialsGoToTheGroupsAuthDirectory) {
    ORLOiSCSITarget t = Record(1);
    ASSERT_EQ(0, mkdir(Cfg(Node(t)).c_str(), 0700));
    ASSERT_EQ(0, mkdir(Cfg(Tpg(t)).c_str(), 0700));
    const std::string a = Tpg(t) + "/auth/";
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILioTargetChapAuthAdd(2, t.iqn, 1, "mu", "msecret123456"));
    EXPECT_EQ(std::vector<std::string>(
                  {"write " + a + "userid_mutual mu 0", "write " + a + "password_mutual msecret123456 0"}),
              Changes());
    log_.Clear();
    ClearTrace();
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetChapAuthAdd(3, t.iqn, 1, "u", "s"));
    EXPECT_TRUE(Changes().empty());
    EXPECT_TRUE(HasLog(log_, "iscsi_lio_target_chap_auth_add.cpp", "ORLOiSCSILioTargetChapAuthAdd",
                       "Unable to set CHAP for iSCSI default ACL for iSCSI Target Portal Group: " + std::string(t.iqn) +
                           " 1, Un-supported CHAP type 3"))
        << log_.Dump();
    EXPECT_EQ(18990004u, ORLOiSCSILioTargetChapAuthAdd(1, "..", 1, "u", "s"));
    EXPECT_EQ(18990003u, ORLOiSCSILioTargetChapAuthAdd(1, t.iqn, 1, nullptr, "s"));
    // The kernel refuses a name of 256 bytes or more.
    EXPECT_EQ(18990040u, ORLOiSCSILioTargetChapAuthAdd(1, t.iqn, 1, std::string(300, 'u').c_str(), "s"));
}

TEST_F(LioTargetTest, SelfTestLeavesAResultAndNoTrialNode) {
    const std::string result = "/tmp/iscsi_dummy_result";
    const std::string trial = "/target/iscsi/iqn.2000-01.com.orlo-nas:iscsitrg.dummy.test";
    WriteFile(result, "stale\n");
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILioTargetDummyTest()) << log_.Dump() << TraceDump();
    EXPECT_EQ("result=pass\nerr=0\n", ReadFile(result));
    EXPECT_FALSE(InKernel(trial));
    std::vector<std::string> changes = Changes();
    ASSERT_FALSE(changes.empty());
    EXPECT_EQ("mkdir " + trial + " 0", changes.front());
    auto has = [&changes](const std::string &line) {
        for (const std::string &c : changes)
            if (c == line) return true;
        return false;
    };
    EXPECT_TRUE(has("mkdir " + trial + "/tpgt_1/np/127.0.0.1:3260 0"));
    EXPECT_TRUE(has("write " + trial + "/tpgt_1/attrib/generate_node_acls 1 0"));
    EXPECT_TRUE(has("write " + trial + "/tpgt_1/attrib/demo_mode_discovery 0 0"));
    EXPECT_TRUE(has("rmdir " + trial + " 0"));
    EXPECT_FALSE(Exists(target_test::kTargetConf)) << "the trial is never stored";

    // A trial node left by an interrupted run is cleared first.
    ASSERT_EQ(0, mkdir(Cfg(trial).c_str(), 0700));
    ASSERT_EQ(0, mkdir(Cfg(trial + "/tpgt_1").c_str(), 0700));
    EXPECT_EQ(0u, ORLOiSCSILioTargetDummyTest()) << log_.Dump();
    EXPECT_FALSE(InKernel(trial));

    // A kernel that refuses the trial fails the test; the node still goes.
    ASSERT_EQ(0, SetFault("write", trial + "/tpgt_1/param/TargetAlias", "EIO"));
    EXPECT_EQ(18990722u, ORLOiSCSILioTargetDummyTest());
    EXPECT_EQ("result=fail\nerr=18990722\n", ReadFile(result));
    EXPECT_FALSE(InKernel(trial));

    // Forced failures, from either file, touch nothing in the kernel.
    for (const std::string forced :
         {"/root/iscsitrg_dummy_test_forced_failure", "/tmp/iscsitrg_dummy_test_forced_failure"}) {
        WriteFile(forced, "");
        ClearTrace();
        log_.Clear();
        EXPECT_EQ(18990722u, ORLOiSCSILioTargetDummyTest()) << forced;
        EXPECT_EQ("result=fail\nerr=18990722\n", ReadFile(result));
        EXPECT_TRUE(Changes().empty()) << forced;
        EXPECT_TRUE(HasLog(log_, "iscsi_lio_target_dummy_test.cpp", "ORLOiSCSILioTargetDummyTest",
                           "iscsitrg dummy test is forced to fail."))
            << log_.Dump();
        ASSERT_EQ(0, unlink(Real(forced).c_str()));
    }
}

}  // namespace
}  // namespace target_kernel_test
