// Targets announced to a real iSNS server (Debian's isnsd on the loopback address) and
// withdrawn: the service start, the target life cycle and the service stop as isnsadm
// sees them; registrations that outlive the process that made them; a server that
// restarts without its registrations; turning iSNS on and off and moving it to another
// server.
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "isns/isns_fixture.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"

namespace isns_test {
namespace {

using Strings = std::vector<std::string>;

class IsnsServerTest : public IsnsSimTest {
  protected:
    void SetUp() override {
        IsnsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_TRUE(server_.Start()) << "isnsd did not come up";
    }

    // A file LUN with its section and image on /volume1.
    void StoreLun(int lid) {
        ORLOiSCSILun lun;
        memset(&lun, 0, sizeof(lun));
        lun.lid = lid;
        lun.lockHandle = -1;
        lun.type = ORLO_ISCSI_LUN_TYPE_FILE;
        lun.blockSize = 512;
        lun.size = 1048576;
        snprintf(lun.uuid, sizeof(lun.uuid), "7b3e1d20-0000-4000-8000-%012d", lid);
        snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "serial-%d", lid);
        snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
        snprintf(lun.name, sizeof(lun.name), "LUN-%d", lid);
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1")) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        char data[4096];
        ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
        WriteFile(data, "");
        ASSERT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE)) << log_.Dump();
    }

    // Targets 1 (enabled, two portals, one of them IPv6), 2 (enabled, LUN 1 mapped), 3
    // (stored disabled).
    void StoreConfiguration() {
        t1_ = StoreTarget(1, true, "127.0.0.1:3260,[::1]:3261");
        t2_ = StoreTarget(2, true, "127.0.0.2:3262");
        t3_ = StoreTarget(3, false, "127.0.0.3:3260");
        StoreLun(1);
        ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(2, 1, 0));
    }

    IsnsServer server_;
    ORLOiSCSITarget t1_, t2_, t3_;
};

TEST_F(IsnsServerTest, RunningTargetsAreRegisteredWithTheirPortalsAndWithdrawnAsTheyLeaveTheKernel) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    Configure(true, server_.address());

    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_TRUE(ORLOiSCSIiSNSIsConnected());
    EXPECT_TRUE(server_.HasEntity());
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes()) << "the disabled target 3 stays out";
    EXPECT_EQ((Strings{"127.0.0.1:3260/tcp 1", "::1:3261/tcp 1"}), server_.PortalGroups(IqnOf(1)));
    EXPECT_EQ((Strings{"127.0.0.2:3262/tcp 1"}), server_.PortalGroups(IqnOf(2)));
    EXPECT_EQ("reg-1", server_.Alias(IqnOf(1)));
    EXPECT_TRUE(IsnsLines().empty()) << log_.Dump();

    // Disable takes a target out of the server; enable brings it back with its portals.
    ASSERT_EQ(0u, ORLOiSCSITargetDisable(&t1_)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(2)}), server_.Nodes());
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&t1_)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());
    EXPECT_EQ((Strings{"127.0.0.1:3260/tcp 1", "::1:3261/tcp 1"}), server_.PortalGroups(IqnOf(1)));

    // A new enabled target is announced as it is created; removing it withdraws it.
    ORLOiSCSITarget t5;
    memset(&t5, 0, sizeof(t5));
    snprintf(t5.name, sizeof(t5.name), "five");
    snprintf(t5.iqn, sizeof(t5.iqn), "%s", IqnOf(5).c_str());
    snprintf(t5.network_portals, sizeof(t5.network_portals), "127.0.0.5:3265");
    t5.enabled = true;
    t5.max_recv_seg_bytes = t5.max_send_seg_bytes = 262144;
    t5.max_sessions = 1;
    ASSERT_EQ(0u, ORLOiSCSITargetCreate(&t5)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2), IqnOf(5)}), server_.Nodes());
    EXPECT_EQ((Strings{"127.0.0.5:3265/tcp 1"}), server_.PortalGroups(IqnOf(5)));
    ASSERT_EQ(0u, ORLOiSCSITargetRemove(&t5)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());

    // An update restarts the target: the server sees the new name and the new portals.
    ORLOiSCSITarget changed = t2_;
    snprintf(changed.name, sizeof(changed.name), "renamed");
    snprintf(changed.network_portals, sizeof(changed.network_portals), "127.0.0.2:3263");
    ASSERT_EQ(0u, ORLOiSCSITargetUpdate(&changed)) << log_.Dump();
    EXPECT_EQ("renamed", server_.Alias(IqnOf(2)));
    EXPECT_EQ((Strings{"127.0.0.2:3263/tcp 1"}), server_.PortalGroups(IqnOf(2)));
    // Updating a target to disabled takes it out of the server too.
    ORLOiSCSITarget off = t1_;
    off.enabled = false;
    ASSERT_EQ(0u, ORLOiSCSITargetUpdate(&off)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(2)}), server_.Nodes());

    // Taking a LUN away from initiators withdraws its targets until they come back.
    int32_t state[257] = {0};
    ASSERT_EQ(0, ORLOiSCSITargetDisableByLid(state, 1)) << log_.Dump();
    EXPECT_TRUE(server_.Nodes().empty());
    ASSERT_EQ(0u, ORLOiSCSITargetEnableByLid(state, 1)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(2)}), server_.Nodes());

    // The stop withdraws the whole appliance, entity included.
    ASSERT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    EXPECT_FALSE(server_.HasEntity());
    EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    EXPECT_TRUE(IsnsLines().empty()) << log_.Dump();
}

TEST_F(IsnsServerTest, RegistrationsOutliveTheProcessesThatMadeThemAndANewProcessDropsStaleNodes) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    Configure(true, server_.address());
    // Each step runs in a process of its own that ends right after it, as the command
    // line does.
    auto inChild = [](auto step) {
        pid_t pid = fork();
        if (pid == 0) _exit(step() == 0 ? 0 : 1);
        int status = -1;
        waitpid(pid, &status, 0);
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    };
    ASSERT_EQ(0, inChild([] { return ORLOiSCSIStartAll(); }));
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());

    // A target that no longer runs but is still registered (left by a process that died
    // between the kernel and the server), and a portal no target has, are withdrawn by
    // the next process that connects.
    server_.Adm({"--register", std::string("entity=") + kEntity, "target=" + IqnOf(3), "portal=127.0.0.9:3260"});
    ASSERT_EQ((Strings{IqnOf(1), IqnOf(2), IqnOf(3)}), server_.Nodes());
    ASSERT_EQ(0, inChild([this] { return ORLOiSCSITargetDisable(&t2_); }));
    EXPECT_EQ((Strings{IqnOf(1)}), server_.Nodes());
    EXPECT_EQ((Strings{"127.0.0.1:3260/tcp 1", "::1:3261/tcp 1"}), server_.PortalGroups(IqnOf(1)));
    for (const Object &o : server_.Entity())
        if (o.type == "Portal") {
            EXPECT_NE("127.0.0.9", o.attrs.at("Portal IP address"));
        }

    ASSERT_EQ(0, inChild([] { return ORLOiSCSIStopAll(); }));
    EXPECT_FALSE(server_.HasEntity());
}

TEST_F(IsnsServerTest, AServerRestartedWithoutItsRegistrationsHoldsTheRunningTargetsAfterTheNextRefresh) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    Configure(true, server_.address());
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    ASSERT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());

    ASSERT_TRUE(server_.Restart());
    ASSERT_TRUE(server_.Nodes().empty()) << "the server's database is in memory";
    ASSERT_EQ(0u, ORLOiSCSIiSNSRefresh()) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());
    EXPECT_EQ((Strings{"127.0.0.1:3260/tcp 1", "::1:3261/tcp 1"}), server_.PortalGroups(IqnOf(1)));
    EXPECT_TRUE(ORLOiSCSIiSNSIsConnected());

    // A refresh with the server gone fails once, logged once, and the process is no
    // longer connected; the next one after the server is back registers again.
    server_.Stop();
    log_.Clear();
    EXPECT_EQ(18990211u, ORLOiSCSIiSNSRefresh());
    EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    EXPECT_EQ(1u, IsnsLines().size()) << log_.Dump();
    ASSERT_TRUE(server_.Start());
    EXPECT_EQ(0u, ORLOiSCSIiSNSRefresh()) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());
}

TEST_F(IsnsServerTest, AConnectedProcessRenewsEveryRegistrationOnceHalfThePeriodHasPassedWaitsTwoSeconds) {
    // This server grants four seconds whatever is asked: renewal is due after two.
    IsnsServer shortPeriod;
    ASSERT_TRUE(shortPeriod.Start("4s"));
    // Two targets on the same portals, as targets on the interfaces' addresses are.
    ORLOiSCSITarget a = StoreTarget(1, true, "127.0.0.1:3260,127.0.0.2:3260");
    StoreTarget(2, true, "127.0.0.1:3260,127.0.0.2:3260");
    Configure(true, shortPeriod.address());
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    ORLOiSCSIiSNSStatus st;
    ASSERT_EQ(0u, ORLOiSCSIiSNSStatusGet(&st));
    EXPECT_EQ(4, st.granted_period);
    EXPECT_EQ(3600, st.registration_period);

    // Before renewal is due, registering one target registers that one only ...
    shortPeriod.Adm({"--deregister", "iscsi-name=" + IqnOf(2)});
    ASSERT_EQ((Strings{IqnOf(1)}), shortPeriod.Nodes());
    ASSERT_EQ(0u, ORLOiSCSITargetiSNSRegister(&a));
    EXPECT_EQ((Strings{IqnOf(1)}), shortPeriod.Nodes());
    EXPECT_EQ((Strings{"127.0.0.1:3260/tcp 1", "127.0.0.2:3260/tcp 1"}), shortPeriod.PortalGroups(IqnOf(1)));
    // ... after it, the same call renews every running target.
    usleep(2100 * 1000);
    ASSERT_EQ(0u, ORLOiSCSITargetiSNSRegister(&a)) << log_.Dump();
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), shortPeriod.Nodes());
    EXPECT_EQ((Strings{"127.0.0.1:3260/tcp 1", "127.0.0.2:3260/tcp 1"}), shortPeriod.PortalGroups(IqnOf(2)));
    EXPECT_TRUE(IsnsLines().empty()) << log_.Dump();
}

TEST_F(IsnsServerTest, TurningOnAndOffAndMovingToAnotherServer) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    // Off: the start registers nothing and the status says so without asking anyone.
    Configure(false, server_.address());
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_FALSE(server_.HasEntity());
    ORLOiSCSIiSNSStatus st;
    ASSERT_EQ(0u, ORLOiSCSIiSNSStatusGet(&st));
    EXPECT_FALSE(st.enabled);
    EXPECT_FALSE(st.reachable);
    EXPECT_EQ(-1, st.registered);
    EXPECT_STREQ(server_.address().c_str(), st.server);
    bool registered = true;
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSIsRegistered(&t1_, &registered));
    EXPECT_FALSE(registered);

    // On: every running target is registered at once.
    ASSERT_EQ(0u, ORLOiSCSIiSNSEnable()) << log_.Dump();
    EXPECT_NE(std::string::npos, ReadFile(kIsnsConf).find("isns_enable=yes\n"));
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), server_.Nodes());
    ASSERT_EQ(0u, ORLOiSCSIiSNSStatusGet(&st));
    EXPECT_TRUE(st.enabled);
    EXPECT_TRUE(st.reachable);
    EXPECT_EQ(2, st.registered);
    EXPECT_EQ(0u, st.error);
    EXPECT_STREQ(kEntity, st.entity);
    EXPECT_EQ(server_.port(), st.port);
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSIsRegistered(&t1_, &registered));
    EXPECT_TRUE(registered);
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSIsRegistered(&t3_, &registered));
    EXPECT_FALSE(registered);

    // Another server: withdrawn from the old one, registered with the new one.
    IsnsServer other;
    ASSERT_TRUE(other.Start());
    ASSERT_EQ(0u, ORLOiSCSIiSNSServerSet(other.address().c_str())) << log_.Dump();
    EXPECT_NE(std::string::npos, ReadFile(kIsnsConf).find("isns_server=" + other.address() + "\n"));
    EXPECT_FALSE(server_.HasEntity());
    EXPECT_EQ((Strings{IqnOf(1), IqnOf(2)}), other.Nodes());

    // Off: withdrawn, and later transitions leave the server alone.
    ASSERT_EQ(0u, ORLOiSCSIiSNSDisable()) << log_.Dump();
    EXPECT_NE(std::string::npos, ReadFile(kIsnsConf).find("isns_enable=no\n"));
    EXPECT_FALSE(other.HasEntity());
    ASSERT_EQ(0u, ORLOiSCSITargetDisable(&t1_));
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&t1_));
    EXPECT_FALSE(other.HasEntity());
    EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    EXPECT_TRUE(IsnsLines().empty()) << log_.Dump();
}

TEST_F(IsnsServerTest, BackupObjectsAndTargetsOutsideTheKernelAreNeverAnnounced) {
    Configure(true, server_.address());
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    ORLOiSCSITarget bkp = StoreTarget(7, true, "", true);
    ORLOiSCSITarget idle = StoreTarget(8, false, "127.0.0.8:3260");
    ASSERT_EQ(0u, ORLOiSCSITargetLoad(&bkp)) << log_.Dump();
    ASSERT_NE(0, ORLOiSCSITargetStatusGet(7, &bkp) & 1) << "the backup object is in the kernel";
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSRegister(&bkp));
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSRegister(&idle));
    EXPECT_EQ(0u, ORLOiSCSIiSNSRefresh());
    EXPECT_TRUE(server_.Nodes().empty());
    EXPECT_TRUE(IsnsLines().empty()) << log_.Dump();
}

TEST_F(IsnsServerTest, ManyPortalsAreRegisteredOverSeveralMessages) {
    // libisns does not survive a message of more than 8 KiB: a target with many portals
    // of its own is registered in pieces, and the other targets are not joined to them.
    std::string many;
    for (int i = 1; i <= 100; ++i) many += (i > 1 ? "," : "") + std::string("127.0.1.") + std::to_string(i) + ":3260";
    StoreTarget(1, true, many);
    StoreTarget(2, true, "127.0.0.2:3260");
    Configure(true, server_.address());
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    std::vector<std::string> groups = server_.PortalGroups(IqnOf(1));
    ASSERT_EQ(100u, groups.size());
    for (const char *g : {"127.0.1.1:3260/tcp 1", "127.0.1.57:3260/tcp 1", "127.0.1.100:3260/tcp 1"})
        EXPECT_NE(groups.end(), std::find(groups.begin(), groups.end(), g)) << g;
    EXPECT_EQ((Strings{"127.0.0.2:3260/tcp 1"}), server_.PortalGroups(IqnOf(2)));
    // A refresh (every target again, in one session) changes nothing.
    ASSERT_EQ(0u, ORLOiSCSIiSNSRefresh()) << log_.Dump();
    EXPECT_EQ(100u, server_.PortalGroups(IqnOf(1)).size());
    EXPECT_EQ((Strings{"127.0.0.2:3260/tcp 1"}), server_.PortalGroups(IqnOf(2)));
    EXPECT_TRUE(IsnsLines().empty()) << log_.Dump();
}

}  // namespace
}  // namespace isns_test
