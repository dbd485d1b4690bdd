// The target life cycle against the simulated kernel: create, update, remove, enable and
// disable, taking the targets of one LUN down and back, and the status questions
// (alive count, sessions, connection status).
#include <sys/stat.h>

#include <string>
#include <vector>

#include "target_kernel/life_fixture.h"

namespace life_test {
namespace {

using service_test::HasLog;
using service_test::Messages;
using Strings = std::vector<std::string>;

class LifecycleTest : public LifeTest {
  protected:
    // The value of a key in a target's stored section, or "<none>".
    std::string Key(int tid, const std::string &key) {
        const std::string conf = ReadFile(target_test::kTargetConf);
        const std::string head = "[iSCSI_T" + std::to_string(tid) + "]\n";
        size_t at = conf.find(head);
        if (at == std::string::npos) return "<none>";
        size_t end = conf.find("\n[", at + 1);
        const std::string section = conf.substr(at, end == std::string::npos ? std::string::npos : end - at);
        size_t k = section.find("\t" + key + "=");
        if (k == std::string::npos) return "<none>";
        k += key.size() + 2;
        return section.substr(k, section.find('\n', k) - k);
    }
    // Only the operations that changed something in the kernel tree.
    bool KernelUntouched() {
        return Changes().empty();
    }
    std::vector<std::string> Sessions(int tid, int *count) {
        ORLOiSCSISessionStateList list = {};
        *count = ORLOiSCSITargetSessionStateListGet(tid, &list);
        std::vector<std::string> out;
        if (ORLOiSCSIListIsInit(&list)) {
            ORLOiSCSIListLink *link;
            ORLOiSCSISessionState *s;
            ORLO_ISCSI_SESSION_STATE_LIST_FOREACH(&list, link, s) {
                out.push_back(std::string(s->iqn) + "|" + s->ip + "|" + s->cid);
            }
        }
        ORLOiSCSITargetSessionStateListFree(&list);
        return out;
    }
    int Connection(int tid) {
        char c = 42;
        EXPECT_EQ(0u, ORLOiSCSITargetConnectionStatusGet(tid, &c)) << log_.Dump();
        return c;
    }
};

TEST_F(LifecycleTest, CreateStoresFirstAndKeepsTheSectionWhenTheKernelLoadFails) {
    ORLOiSCSITarget stopped = target_test::MakeTarget(0);
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSITargetCreate(&stopped)) << log_.Dump();
    EXPECT_EQ(1, stopped.tid);
    EXPECT_EQ("no", Key(1, "enabled"));
    EXPECT_EQ(0, Status(stopped));
    EXPECT_TRUE(KernelUntouched()) << TraceDump();
    EXPECT_TRUE(log_.Contains("[D] iSCSIWebAPI:iscsi_target_create.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains(":ORLOiSCSITargetCreate Target ID: 1")) << log_.Dump();

    // Enabled, and the kernel refuses the node: 18990722, the section stays as asked.
    ORLOiSCSITarget failing = target_test::MakeTarget(0);
    snprintf(failing.name, sizeof(failing.name), "failing");
    snprintf(failing.iqn, sizeof(failing.iqn), "iqn.2000-01.com.orlo-nas:store.failing");
    failing.enabled = true;
    ASSERT_EQ(0, SetFault("mkdir", std::string("/target/iscsi/") + failing.iqn, "EIO"));
    log_.Clear();
    EXPECT_EQ(18990722u, ORLOiSCSITargetCreate(&failing));
    EXPECT_EQ(2, failing.tid);
    EXPECT_EQ("yes", Key(2, "enabled"));
    EXPECT_FALSE(InKernel(Node(failing)));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSITargetLoad(").size()) << log_.Dump();

    // Enabled and loadable: the node is built and takes logins.
    ORLOiSCSITarget loaded = target_test::MakeTarget(0);
    snprintf(loaded.name, sizeof(loaded.name), "loaded");
    snprintf(loaded.iqn, sizeof(loaded.iqn), "iqn.2000-01.com.orlo-nas:store.loaded");
    loaded.enabled = true;
    ASSERT_EQ(0u, ORLOiSCSITargetCreate(&loaded)) << log_.Dump();
    EXPECT_EQ(3, loaded.tid);
    EXPECT_EQ(3, Status(loaded));

    // A record the file refuses gets no tid's section; null is refused at once.
    // A name or an IQN another target has is refused before anything is written (the
    // IQN compared without case); the free tid stays free.
    const std::string stored = ReadFile(target_test::kTargetConf);
    ORLOiSCSITarget twin = target_test::MakeTarget(0);
    snprintf(twin.name, sizeof(twin.name), "loaded");
    snprintf(twin.iqn, sizeof(twin.iqn), "iqn.2000-01.com.orlo-nas:store.twin");
    log_.Clear();
    EXPECT_EQ(18990700u, ORLOiSCSITargetCreate(&twin));
    EXPECT_TRUE(log_.Contains("Target name is used by tid 3 already: loaded")) << log_.Dump();
    snprintf(twin.name, sizeof(twin.name), "twin");
    snprintf(twin.iqn, sizeof(twin.iqn), "iqn.2000-01.com.orlo-nas:STORE.loaded");
    EXPECT_EQ(18990701u, ORLOiSCSITargetCreate(&twin));
    EXPECT_EQ(stored, ReadFile(target_test::kTargetConf));

    ORLOiSCSITarget bad = target_test::MakeTarget(0);
    snprintf(bad.name, sizeof(bad.name), "bad");
    snprintf(bad.iqn, sizeof(bad.iqn), "not an iqn");
    log_.Clear();
    EXPECT_EQ(18990725u, ORLOiSCSITargetCreate(&bad));
    EXPECT_EQ("<none>", Key(4, "tid"));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSITargetConfAdd(").size()) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetCreate(nullptr));
}

TEST_F(LifecycleTest, UpdateRestartsOnlyWhatRunsAndIgnoresAnUnknownTid) {
    ORLOiSCSITarget t = StoreTarget(1);
    const std::string before = ReadFile(target_test::kTargetConf);

    // Unknown tid: success, nothing written.
    ORLOiSCSITarget unknown = target_test::MakeTarget(7);
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSITargetUpdate(&unknown));
    EXPECT_EQ(before, ReadFile(target_test::kTargetConf));
    EXPECT_EQ(Strings({"Failed to zero target_cnt 0, pOrgTrg 0x(nil)"}), Messages(log_, "Failed to zero"));

    // Disabled to disabled: the section changes, the kernel does not.
    snprintf(t.name, sizeof(t.name), "renamed");
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSITargetUpdate(&t)) << log_.Dump();
    EXPECT_EQ("renamed", Key(1, "name"));
    EXPECT_EQ(0, Status(t));
    EXPECT_TRUE(KernelUntouched()) << TraceDump();

    // Disabled to enabled: built and switched on.
    t.enabled = true;
    ASSERT_EQ(0u, ORLOiSCSITargetUpdate(&t)) << log_.Dump();
    EXPECT_EQ(3, Status(t));
    EXPECT_EQ("yes", Key(1, "enabled"));

    // Enabled to enabled: the running node is taken down and built again.
    t.max_sessions = 4;
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSITargetUpdate(&t)) << log_.Dump();
    const Strings changes = Changes();
    const std::string rmTpg = "rmdir " + Tpg(t) + " 0", mkTpg = "mkdir " + Tpg(t) + " 0";
    int rm = -1, mk = -1;
    for (size_t i = 0; i < changes.size(); ++i) {
        if (changes[i] == rmTpg && rm < 0) rm = static_cast<int>(i);
        if (changes[i] == mkTpg) mk = static_cast<int>(i);
    }
    EXPECT_GE(rm, 0) << TraceDump();
    EXPECT_GT(mk, rm) << TraceDump();
    EXPECT_EQ("4", CfgRead(Tpg(t) + "/max_session"));
    EXPECT_EQ(3, Status(t));

    // Enabled to disabled: out of the kernel.
    t.enabled = false;
    ASSERT_EQ(0u, ORLOiSCSITargetUpdate(&t)) << log_.Dump();
    EXPECT_EQ(0, Status(t));
    EXPECT_FALSE(InKernel(Node(t)));
    EXPECT_EQ("no", Key(1, "enabled"));

    // An enable that fails is 18990718, after the section was written.
    t.enabled = true;
    t.max_sessions = 5;
    ASSERT_EQ(0, SetFault("write", Tpg(t) + "/enable", "EIO"));
    log_.Clear();
    EXPECT_EQ(18990718u, ORLOiSCSITargetUpdate(&t));
    EXPECT_EQ("5", Key(1, "max_sessions"));
    EXPECT_EQ("yes", Key(1, "enabled"));
    EXPECT_EQ(0, Status(t) & ORLO_ISCSI_TARGET_STATUS_ENABLED);
    EXPECT_TRUE(HasLog(log_, "iscsi_target_update.cpp", "ORLOiSCSITargetUpdate",
                       "Failed to Enable target, tid:1 name:renamed"))
        << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSITargetUpdate(nullptr));
}

TEST_F(LifecycleTest, DisableAndEnableLeaveTheStoredFlagAndRemoveTakesEverything) {
    ORLOiSCSITarget t = StoreTarget(1, true);
    ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost1.c_str(), 3));
    StoreLun(1);
    StoreLun(2);
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&t)) << log_.Dump();
    EXPECT_EQ(3, Status(t));
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 1, 256)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 2, 256)) << log_.Dump();
    EXPECT_TRUE(InKernel(Tpg(t) + "/acls/" + kHost1 + "/lun_1/lio_lun"));

    ASSERT_EQ(0u, ORLOiSCSITargetDisable(&t)) << log_.Dump();
    EXPECT_EQ(0, Status(t));
    EXPECT_EQ("yes", Key(1, "enabled")) << "the next start brings it back";
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&t)) << log_.Dump();
    EXPECT_EQ(3, Status(t));
    EXPECT_TRUE(InKernel(Tpg(t) + "/lun/lun_1")) << "enabling brings the mappings back";

    // An unload that fails stops the removal before anything stored is touched.
    ASSERT_EQ(0, SetFault("rmdir", Tpg(t), "EBUSY"));
    log_.Clear();
    EXPECT_EQ(18990723u, ORLOiSCSITargetRemove(&t));
    EXPECT_TRUE(HasLog(log_, "iscsi_target_remove.cpp", "ORLOiSCSITargetRemove",
                       "Failed to Unload target, tid:1 name:Target-1"))
        << log_.Dump();
    EXPECT_EQ(Strings({"1:1:0", "1:2:1"}), Mappings());
    EXPECT_EQ("1", Key(1, "tid"));

    // Then: out of the kernel, mappings, section and access list gone.
    ASSERT_EQ(0u, ORLOiSCSITargetRemove(&t)) << log_.Dump();
    EXPECT_FALSE(InKernel(Node(t)));
    EXPECT_TRUE(Mappings().empty());
    EXPECT_EQ("<none>", Key(1, "tid"));
    EXPECT_FALSE(ORLOiSCSITargetConfAclIsExist(1, kHost1.c_str()));
    EXPECT_EQ(18990003u, ORLOiSCSITargetRemove(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSITargetEnable(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSITargetDisable(nullptr));
}

TEST_F(LifecycleTest, DisableByLidTakesDownRunningTargetsAndEnableByLidBringsBackOnlyThose) {
    ORLOiSCSITarget running = StoreTarget(1, true);
    ORLOiSCSITarget off = StoreTarget(2, true);
    ORLOiSCSITarget stored = StoreTarget(3);
    ORLOiSCSITarget other = StoreTarget(4, true);
    ORLOiSCSITarget stuck = StoreTarget(5, true);
    StoreLun(1);
    StoreLun(2);
    for (int tid : {1, 2, 3, 5}) ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(tid, 1, 0)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(4, 2, 0)) << log_.Dump();
    for (ORLOiSCSITarget *t : {&running, &off, &other, &stuck}) ASSERT_EQ(0u, ORLOiSCSITargetEnable(t)) << log_.Dump();
    ASSERT_EQ(0, CfgWrite(Tpg(off) + "/enable", "0"));
    // A target beyond the state array, mapped by an older writer and running.
    ORLOiSCSITarget beyond = target_test::MakeTarget(300);
    WriteFile(target_test::kTargetConf,
              ReadFile(target_test::kTargetConf) + target_test::Section(300, "Beyond"));
    snprintf(beyond.iqn, sizeof(beyond.iqn), "iqn.2000-01.com.orlo-nas:t300");
    WriteFile(kMappingConf, ReadFile(kMappingConf) + "[iSCSI_MAP_T300_L1]\n\ttid=300\n\tlid=1\n\tlun=0\n");
    MakeNode(beyond, true);
    if (HasFatalFailure()) return;
    ASSERT_EQ(3, Status(running));
    ASSERT_EQ(1, Status(off));
    ASSERT_EQ(0, Status(stored));

    std::vector<int32_t> state(ORLO_ISCSI_TARGET_STATE_ENTRIES, 0);
    ASSERT_EQ(0, SetFault("rmdir", Tpg(stuck), "EBUSY"));
    EXPECT_EQ(0, ORLOiSCSITargetDisableByLid(state.data(), 1)) << log_.Dump();
    EXPECT_EQ(1, state[1]);
    EXPECT_EQ(0, state[2]) << "a disabled portal group is left alone";
    EXPECT_EQ(0, state[3]);
    EXPECT_EQ(0, state[4]) << "not mapped to the LUN";
    EXPECT_EQ(-1, state[5]);
    EXPECT_EQ(0, Status(running));
    EXPECT_EQ(1, Status(off));
    EXPECT_EQ(3, Status(other));
    EXPECT_EQ(3, Status(beyond)) << "tids above 256 are not considered";
    const int stuckStatus = Status(stuck);
    EXPECT_NE(0, stuckStatus & ORLO_ISCSI_TARGET_STATUS_PRESENT);

    EXPECT_EQ(0u, ORLOiSCSITargetEnableByLid(state.data(), 1)) << log_.Dump();
    EXPECT_EQ(3, Status(running));
    EXPECT_TRUE(InKernel(Tpg(running) + "/lun/lun_0")) << "back with its mapping";
    EXPECT_EQ(1, Status(off));
    EXPECT_EQ(0, Status(stored));
    EXPECT_EQ(stuckStatus, Status(stuck)) << "a target that could not be stopped is not touched";

    // Arguments.
    EXPECT_EQ(-1, ORLOiSCSITargetDisableByLid(nullptr, 1));
    EXPECT_EQ(-1, ORLOiSCSITargetDisableByLid(state.data(), 0));
    EXPECT_EQ(-1, ORLOiSCSITargetDisableByLid(state.data(), 1025));
    EXPECT_EQ(18990004u, ORLOiSCSITargetEnableByLid(nullptr, 1));
    EXPECT_EQ(18990004u, ORLOiSCSITargetEnableByLid(state.data(), 0));
}

TEST_F(LifecycleTest, SessionsConnectionStatusAndAliveCount) {
    ORLOiSCSITarget t = StoreTarget(1, true);
    ORLOiSCSITarget idle = StoreTarget(2, true);
    ORLOiSCSITarget stored = StoreTarget(3);
    ORLOiSCSITarget backup = target_test::MakeTarget(4);
    backup.bkp_obj = true;
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&backup));
    EXPECT_EQ(0, ORLOiSCSITargetAliveCountGet());
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&t)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&idle)) << log_.Dump();
    MakeNode(backup, true);
    if (HasFatalFailure()) return;
    EXPECT_EQ(2, ORLOiSCSITargetAliveCountGet()) << "backup objects are not counted";

    ASSERT_EQ(0, AddSession(t.iqn, 1, kHost1, "10.0.0.5", 3));
    ASSERT_EQ(0, AddSession(t.iqn, 1, kHost2, "fe80::1", 0));
    int count = -2;
    EXPECT_EQ(Strings({kHost1 + "|10.0.0.5|3", kHost2 + "|fe80::1|0"}), Sessions(1, &count));
    EXPECT_EQ(2, count);
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_ACTIVE, Connection(1));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_NONE, Connection(2));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_DOWN, Connection(3));
    EXPECT_TRUE(Sessions(2, &count).empty());
    EXPECT_EQ(0, count);
    EXPECT_TRUE(Sessions(3, &count).empty()) << "no portal group, no dynamic_sessions";
    EXPECT_EQ(0, count);

    ASSERT_EQ(0, DropSession(t.iqn, 1, kHost1));
    EXPECT_EQ(Strings({kHost2 + "|fe80::1|0"}), Sessions(1, &count));
    ASSERT_EQ(0, DropSession(t.iqn, 1, kHost2));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_NONE, Connection(1));

    // A portal group switched off is not running, whatever its sessions.
    ASSERT_EQ(0, AddSession(t.iqn, 1, kHost1, "10.0.0.5", 1));
    ASSERT_EQ(0, CfgWrite(Tpg(t) + "/enable", "0"));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_DOWN, Connection(1));

    // A session list that cannot be read leaves the status as it was.
    ASSERT_EQ(0, CfgWrite(Tpg(t) + "/enable", "1"));
    ASSERT_EQ(0, SetFault("open", Tpg(t) + "/dynamic_sessions", "EIO", false));
    char c = 42;
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSITargetConnectionStatusGet(1, &c));
    EXPECT_EQ(42, c);
    EXPECT_TRUE(HasLog(log_, "iscsi_target_connection_status_get.cpp", "ORLOiSCSITargetConnectionStatusGet",
                       "Failed to get session of tid: 1"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_target_session_state_list_get.cpp", "ORLOiSCSITargetSessionStateListGet",
                       "Failed to Get Session of tid:1, LIO"))
        << log_.Dump();

    // Arguments and unknown targets.
    EXPECT_EQ(18990004u, ORLOiSCSITargetConnectionStatusGet(0, &c));
    EXPECT_EQ(18990004u, ORLOiSCSITargetConnectionStatusGet(1, nullptr));
    EXPECT_EQ(18990713u, ORLOiSCSITargetConnectionStatusGet(9, &c));
    EXPECT_EQ(-1, ORLOiSCSITargetSessionStateListGet(1, nullptr));
    EXPECT_TRUE(Sessions(9, &count).empty());
    EXPECT_EQ(-1, count);
    (void)stored;
}

}  // namespace
}  // namespace life_test
