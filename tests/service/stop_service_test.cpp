// Stopping the service in the simulated kernel: the order in which the fabrics, the
// backstores and the module sets go, what a failure leaves behind, and that each stop
// carries on past a failure and reports the first one.
#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_base.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"
#include "service/service_test_util.h"

namespace service_test {
namespace {

const std::string kIqnA = "iqn.2000-01.com.orlo:a";
const std::string kIqnB = "iqn.2000-01.com.orlo:b";  // in no configuration file
const std::string kTargetConf = "/usr/orlo/etc/iscsi_target.conf";

std::string UuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "6a1f0c2e-0000-4000-8000-%012d", lid);
    return buf;
}

class StopService : public ServiceSimTest {
  protected:
    void SetUp() override {
        ServiceSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
    }

    int Mkdir(const std::string &inside) { return mkdir(Cfg(inside).c_str(), 0700) == 0 ? 0 : errno; }
    int Link(const std::string &targetInside, const std::string &linkInside) {
        return symlink(Cfg(targetInside).c_str(), Cfg(linkInside).c_str()) == 0 ? 0 : errno;
    }
    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }

    static ORLOiSCSILun FileLun(int lid) {
        ORLOiSCSILun lun;
        memset(&lun, 0, sizeof(lun));
        lun.lid = lid;
        lun.lockHandle = -1;
        lun.type = ORLO_ISCSI_LUN_TYPE_FILE;
        lun.blockSize = 512;
        lun.size = 1048576ULL * static_cast<uint64_t>(lid);
        snprintf(lun.uuid, sizeof(lun.uuid), "%s", UuidOf(lid).c_str());
        snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "serial-%d", lid);
        snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
        snprintf(lun.name, sizeof(lun.name), "LUN-%d", lid);
        return lun;
    }
    // Stores a file LUN with its data file, as creation leaves it.
    ORLOiSCSILun StoreLun(int lid) {
        ORLOiSCSILun lun = FileLun(lid);
        EXPECT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        char data[4096];
        EXPECT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
        WriteFile(data, "");
        EXPECT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE)) << log_.Dump();
        return lun;
    }
    static std::string Backstore(int lid) { return "/target/core/fileio_0/LUN_" + UuidOf(lid); }

    // A node with one portal group, a portal, an access list and a LUN entry linked to
    // the backstore.
    void IscsiNode(const std::string &iqn, const std::string &backstore) {
        const std::string tpg = "/target/iscsi/" + iqn + "/tpgt_1";
        for (const std::string &d : {"/target/iscsi/" + iqn, tpg, tpg + "/np/127.0.0.1:3260", tpg + "/lun/lun_0",
                                     tpg + "/acls/iqn.1991-05.com.example:h", tpg + "/acls/iqn.1991-05.com.example:h/lun_0"})
            ASSERT_EQ(0, Mkdir(d)) << d;
        ASSERT_EQ(0, Link(backstore, tpg + "/lun/lun_0/LUN"));
        ASSERT_EQ(0, Link(tpg + "/lun/lun_0", tpg + "/acls/iqn.1991-05.com.example:h/lun_0/lio_lun"));
        ASSERT_EQ(0, CfgWrite(tpg + "/enable", "1"));
    }
    // A vhost or loopback node with an attached nexus and one LUN entry.
    void OtherNode(const std::string &fabric, const std::string &wwn, const std::string &backstore) {
        const std::string tpg = "/target/" + fabric + "/" + wwn + "/tpgt_1";
        for (const std::string &d : {"/target/" + fabric + "/" + wwn, tpg, tpg + "/lun/lun_0"})
            ASSERT_EQ(0, Mkdir(d)) << d;
        ASSERT_EQ(0, Link(backstore, tpg + "/lun/lun_0/" + backstore.substr(backstore.rfind('/') + 1)));
        ASSERT_EQ(0, CfgWrite(tpg + "/nexus", "naa.5001405000000099"));
    }

    std::vector<std::string> Changes() {
        std::vector<std::string> out;
        for (const orlotest::SimOp &op : Trace()) {
            if (op.op == "read") continue;
            out.push_back(op.op + " " + op.path + (op.op == "write" ? " " + op.value : "") + " " + op.result);
        }
        return out;
    }
    // Index of the first change line that begins with text, or -1.
    int IndexOf(const std::vector<std::string> &lines, const std::string &text) {
        for (size_t i = 0; i < lines.size(); ++i)
            if (lines[i].compare(0, text.size(), text) == 0) return static_cast<int>(i);
        return -1;
    }
};

TEST_F(StopService, StopAllEmptiesTheFabricFromTheKernelTreeAndGoesOnPastAFailedNode) {
    // Nothing loaded at all: no fabric directory, nothing to do.
    EXPECT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();

    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    ASSERT_EQ(0, Mkdir("/target/iscsi"));
    ORLOiSCSILun l1 = StoreLun(1), l2 = StoreLun(2);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&l1)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&l2)) << log_.Dump();
    IscsiNode(kIqnA, Backstore(1));
    IscsiNode(kIqnB, Backstore(2));
    if (HasFatalFailure()) return;
    const std::string conf = "[iSCSI_T1]\n\ttid=1\n\tiqn=" + kIqnA + "\n\tenabled=yes\n";
    WriteFile(kTargetConf, conf);

    ClearTrace();
    log_.Clear();
    ASSERT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump() << TraceDump();
    std::vector<std::string> changes = Changes();
    // Node a is dismantled completely before node b is touched, each bottom-up.
    const int enableA = IndexOf(changes, "write /target/iscsi/" + kIqnA + "/tpgt_1/enable 0");
    const int nodeA = IndexOf(changes, "rmdir /target/iscsi/" + kIqnA + " 0");
    const int enableB = IndexOf(changes, "write /target/iscsi/" + kIqnB + "/tpgt_1/enable 0");
    const int nodeB = IndexOf(changes, "rmdir /target/iscsi/" + kIqnB + " 0");
    ASSERT_TRUE(enableA >= 0 && nodeA > enableA && enableB > nodeA && nodeB > enableB) << TraceDump();
    EXPECT_EQ(static_cast<int>(changes.size()) - 1, nodeB) << TraceDump();
    EXPECT_FALSE(InKernel("/target/iscsi/" + kIqnA));
    EXPECT_FALSE(InKernel("/target/iscsi/" + kIqnB));
    // The backstores and the fabric directory stay; the files are not touched.
    EXPECT_TRUE(InKernel(Backstore(1)));
    EXPECT_TRUE(InKernel(Backstore(2)));
    EXPECT_TRUE(InKernel("/target/iscsi"));
    EXPECT_EQ(conf, ReadFile(kTargetConf));
    EXPECT_TRUE(HasLog(log_, "iscsi_stop_all_without_lock.cpp", "ORLOiSCSIStopAllWithoutLock",
                       "Successfully stopped iSCSI service."))
        << log_.Dump();
    bool shortForm = false;
    for (const std::string &l : log_.Lines())
        shortForm |= std::regex_match(l, std::regex("iscsi_stop_all_without_lock\\.cpp:[0-9]+ Successfully stopped "
                                                     "iSCSI service\\."));
    EXPECT_TRUE(shortForm) << log_.Dump();

    // Again: nothing left to do, nothing changed.
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    EXPECT_TRUE(Changes().empty()) << TraceDump();

    // A node that cannot be removed is logged and left; the next one still goes and the
    // first failure is returned without the success line.
    IscsiNode(kIqnA, Backstore(1));
    IscsiNode(kIqnB, Backstore(2));
    if (HasFatalFailure()) return;
    ASSERT_EQ(0, SetFault("rmdir", "/target/iscsi/" + kIqnA + "/tpgt_1", "EIO"));
    log_.Clear();
    EXPECT_EQ(18990029u, ORLOiSCSIStopAll());
    EXPECT_TRUE(InKernel("/target/iscsi/" + kIqnA + "/tpgt_1"));
    EXPECT_FALSE(InKernel("/target/iscsi/" + kIqnA + "/tpgt_1/lun/lun_0"));
    EXPECT_FALSE(InKernel("/target/iscsi/" + kIqnB));
    EXPECT_TRUE(HasLog(log_, "iscsi_stop_all_without_lock.cpp", "ORLOiSCSIStopAllWithoutLock",
                       "ORLOiSCSITargetUnloadByConfigfsPath(\"/config/target/iscsi/" + kIqnA +
                           "\") failed, err=Failed to remove directory"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_stop_all.cpp", "ORLOiSCSIStopAll",
                       "ORLOiSCSIStopAllWithoutLock() failed, err=Failed to remove directory"))
        << log_.Dump();
    EXPECT_TRUE(Messages(log_, "Successfully stopped").empty()) << log_.Dump();
    // The repeat finishes the job.
    EXPECT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    EXPECT_FALSE(InKernel("/target/iscsi/" + kIqnA));
}

TEST_F(StopService, VhostAndLoopbackNodesAreDismantledAndEmptyFabricsAreSuccess) {
    // Neither fabric module in: nothing there is success.
    ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    EXPECT_EQ(0u, ORLOiSCSIVhostStopAll()) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSILoopbackStopAllWithoutLock()) << log_.Dump();

    ASSERT_EQ(0, InsertModuleSet(kVhostModules, 4));
    ASSERT_EQ(0, InsertModuleSet(kLoopbackModules, 4));
    ORLOiSCSILun l1 = StoreLun(1), l2 = StoreLun(2), l3 = StoreLun(3);
    for (ORLOiSCSILun *l : {&l1, &l2, &l3}) ASSERT_EQ(0u, ORLOiSCSILunLoad(l)) << log_.Dump();
    ASSERT_EQ(0, Mkdir("/target/vhost"));
    ASSERT_EQ(0, Mkdir("/target/loopback"));
    // Empty fabric directories.
    EXPECT_EQ(0u, ORLOiSCSIVhostStopAll()) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSILoopbackStopAllWithoutLock()) << log_.Dump();

    OtherNode("vhost", "naa.5001405000000001", Backstore(1));
    OtherNode("vhost", "naa.5001405000000002", Backstore(2));
    OtherNode("loopback", "naa.5001405000000003", Backstore(3));
    if (HasFatalFailure()) return;
    // The first vhost node's LUN link cannot go once.
    const std::string v1 = "/target/vhost/naa.5001405000000001/tpgt_1";
    const std::string v2 = "/target/vhost/naa.5001405000000002/tpgt_1";
    ASSERT_EQ(0, SetFault("unlink", v1 + "/lun/lun_0/*", "EIO"));
    ClearTrace();
    EXPECT_EQ(18990037u, ORLOiSCSIVhostStopAll());
    EXPECT_TRUE(HasLog(log_, "iscsi_vhost_stop_all.cpp", "ORLOiSCSIVhostStopAll",
                       "ORLOVHOSTSCSIStopAllWithoutLock() failed, err=Failed to unlink file"))
        << log_.Dump();
    const std::vector<std::string> expected = {
        "write " + v1 + "/nexus NULL 0",
        "unlink " + v1 + "/lun/lun_0/LUN_" + UuidOf(1) + " EIO",
        "write " + v2 + "/nexus NULL 0",
        "unlink " + v2 + "/lun/lun_0/LUN_" + UuidOf(2) + " 0",
        "rmdir " + v2 + "/lun/lun_0 0",
        "rmdir " + v2 + " 0",
        "rmdir /target/vhost/naa.5001405000000002 0",
    };
    EXPECT_EQ(expected, Changes()) << TraceDump();
    EXPECT_TRUE(InKernel("/target/loopback/naa.5001405000000003/tpgt_1/lun/lun_0")) << "another fabric";

    // The repeat finds the nexus dropped already and finishes.
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSIVhostStopAll()) << log_.Dump();
    EXPECT_EQ(-1, IndexOf(Changes(), "write")) << TraceDump();
    EXPECT_FALSE(InKernel("/target/vhost/naa.5001405000000001"));

    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILoopbackStopAllWithoutLock()) << log_.Dump();
    const std::string lb = "/target/loopback/naa.5001405000000003";
    const std::vector<std::string> loop = {
        "write " + lb + "/tpgt_1/nexus NULL 0",
        "unlink " + lb + "/tpgt_1/lun/lun_0/LUN_" + UuidOf(3) + " 0",
        "rmdir " + lb + "/tpgt_1/lun/lun_0 0",
        "rmdir " + lb + "/tpgt_1 0",
        "rmdir " + lb + " 0",
    };
    EXPECT_EQ(loop, Changes()) << TraceDump();
    // Only the fabrics' hold went: the backstores stay loaded.
    for (int lid : {1, 2, 3}) EXPECT_TRUE(InKernel(Backstore(lid))) << lid;
}

TEST_F(StopService, LunServiceStartLoadsEveryLunPastAFailureAndStopLeavesOnlyLinkedOnes) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    ORLOiSCSILun l1 = StoreLun(1), l2 = StoreLun(2), l3 = StoreLun(3);
    (void)l1;
    (void)l3;
    // LUN 2's data has gone: the kernel cannot open it.
    char data[4096];
    ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&l2, 0, data, sizeof(data)));
    ASSERT_EQ(0, unlink(Real(data).c_str()));

    uint32_t ret = ORLOiSCSILunServiceStartAllWithoutLock();
    EXPECT_NE(0u, ret);
    EXPECT_TRUE(InKernel(Backstore(1)));
    EXPECT_TRUE(!InKernel(Backstore(2)) || ReadFile("/config" + Backstore(2) + "/enable") != "1\n");
    EXPECT_TRUE(InKernel(Backstore(3))) << "LUN 3 still loaded after LUN 2 failed";
    std::vector<std::string> failed = Messages(log_, "ORLOiSCSILunLoad(");
    ASSERT_EQ(1u, failed.size()) << log_.Dump();
    EXPECT_NE(std::string::npos, failed[0].find("failed, err=" + std::string(ORLOiSCSIErrStr(ret)) +
                                                ". lid: 2, name: LUN-2"))
        << failed[0];

    // Loading again leaves the loaded ones as they are.
    ClearTrace();
    EXPECT_EQ(ret, ORLOiSCSILunServiceStartAllWithoutLock());
    EXPECT_EQ(-1, IndexOf(Changes(), "mkdir " + Backstore(1))) << TraceDump();

    // A backstore a target still links to stays, the others go, and a trash backstore
    // the files do not know goes too.
    ASSERT_EQ(0, Mkdir("/target/iscsi"));
    IscsiNode(kIqnA, Backstore(1));
    if (HasFatalFailure()) return;
    ASSERT_EQ(0, Mkdir("/target/core/epio_1/UNMAP_LUN_" + UuidOf(9)));
    log_.Clear();
    EXPECT_EQ(18990534u, ORLOiSCSILunServiceStopAll());
    EXPECT_TRUE(InKernel(Backstore(1)));
    EXPECT_FALSE(InKernel(Backstore(2)));
    EXPECT_FALSE(InKernel(Backstore(3)));
    EXPECT_FALSE(InKernel("/target/core/epio_1/UNMAP_LUN_" + UuidOf(9)));
    EXPECT_TRUE(HasLog(log_, "stop_util.cpp", "RemoveBackstore",
                       "LUN is mapped: /config/target/iscsi/" + kIqnA + "/tpgt_1/lun/lun_0/LUN links to /config" +
                           Backstore(1)))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_lun_service_stop_all.cpp", "ORLOiSCSILunServiceStopAll",
                       "ORLOiSCSILunServiceStopAllWithoutLock() failed, err=LUN is mapped"))
        << log_.Dump();

    ASSERT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSILunServiceStopAll()) << log_.Dump();
    for (const char *host : {"epio_0", "epio_1", "fileio_0", "fileio_1", "iblock_0"}) {
        std::vector<std::string> left;
        DIR *d = opendir(Cfg(std::string("/target/core/") + host).c_str());
        ASSERT_NE(nullptr, d) << host;
        while (struct dirent *e = readdir(d)) {
            struct stat st;
            std::string p = Cfg(std::string("/target/core/") + host + "/" + e->d_name);
            if (e->d_name[0] != '.' && lstat(p.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) left.push_back(e->d_name);
        }
        closedir(d);
        EXPECT_TRUE(left.empty()) << host << ": " << left.front();
    }
}

TEST_F(StopService, TotalStopUnloadsTheSetsInOrderAndGoesOnAfterAFailure) {
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    ASSERT_EQ(0, InsertModuleSet(kLoopbackModules, 4));
    ASSERT_EQ(0, InsertModuleSet(kVhostModules, 4));
    ORLOiSCSILun l1 = StoreLun(1), l2 = StoreLun(2), l3 = StoreLun(3);
    for (ORLOiSCSILun *l : {&l1, &l2, &l3}) ASSERT_EQ(0u, ORLOiSCSILunLoad(l)) << log_.Dump();
    ASSERT_EQ(0, Mkdir("/target/iscsi"));
    ASSERT_EQ(0, Mkdir("/target/vhost"));
    ASSERT_EQ(0, Mkdir("/target/loopback"));
    IscsiNode(kIqnB, Backstore(1));
    OtherNode("loopback", "naa.5001405000000003", Backstore(2));
    OtherNode("vhost", "naa.5001405000000001", Backstore(3));
    if (HasFatalFailure()) return;

    // The loopback node cannot go: its module and with it the core stay in, while every
    // later step still runs.
    ASSERT_EQ(0, SetFault("rmdir", "/target/loopback/naa.5001405000000003/tpgt_1", "EIO"));
    ClearTrace();
    log_.Clear();
    EXPECT_EQ(18990029u, ORLOiSCSITotallyStopAndUnload());
    EXPECT_TRUE(HasLog(log_, "iscsi_totally_stop_and_unload.cpp", "TotallyStopAndUnloadWithoutLock",
                       "ORLOiSCSILoopbackStopAllWithoutLock() failed, err=Failed to remove directory"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_totally_stop_and_unload.cpp", "TotallyStopAndUnloadWithoutLock",
                       "ORLOiSCSIUnloadModulesWithoutLock(LOOPBACK_KERNEL_MODULES) failed, err=Failed to rmmod "
                       "kernel module"))
        << log_.Dump();
    EXPECT_TRUE(HasLog(log_, "iscsi_totally_stop_and_unload.cpp", "TotallyStopAndUnloadWithoutLock",
                       "ORLOiSCSIUnloadModulesWithoutLock(TCM_KERNEL_MODULES) failed, err=Failed to rmmod "
                       "kernel module"))
        << log_.Dump();
    std::vector<std::string> changes = Changes();
    // The iSCSI node goes first, then loopback, vhost and the backstores.
    const int iscsi = IndexOf(changes, "rmdir /target/iscsi/" + kIqnB + " ");
    const int loop = IndexOf(changes, "rmdir /target/loopback/naa.5001405000000003/tpgt_1 EIO");
    const int vhost = IndexOf(changes, "rmdir /target/vhost/naa.5001405000000001 0");
    const int bs = IndexOf(changes, "rmdir " + Backstore(1) + " 0");
    EXPECT_TRUE(iscsi >= 0 && loop > iscsi && vhost > loop && bs > vhost) << TraceDump();
    EXPECT_TRUE(InKernel(Backstore(1)) == false);
    EXPECT_TRUE(InKernel("/target/loopback/naa.5001405000000003/tpgt_1")) << "the failed group stays";
    EXPECT_FALSE(InKernel(Backstore(3)));
    // iSCSI and vhost modules went; the core stopped at target_core_mod, which
    // tcm_loop still needs.
    const std::vector<std::string> left = {"rodsp_ep", "orlo_extent_pool", "target_core_mod", "tcm_loop"};
    EXPECT_EQ(left, Modules());
    const std::vector<std::string> unloading = {
        "Unloading module 'iscsi_target_mod'", "Unloading module 'tcm_loop'",
        "Unloading module 'vhost_scsi'",       "Unloading module 'target_core_ep'",
        "Unloading module 'target_core_file'", "Unloading module 'target_core_iblock'",
        "Unloading module 'target_core_mod'"};
    EXPECT_EQ(unloading, Messages(log_, "Unloading module")) << log_.Dump();

    // Once the fault is gone the repeat takes the loopback node and tcm_loop out; the
    // sets already out are passed over.  The core set's walk, last module first, stops
    // at target_core_ep, which the first run removed already: the module removal
    // reports a module that is not in as a failure.
    log_.Clear();
    EXPECT_EQ(18990031u, ORLOiSCSITotallyStopAndUnload()) << log_.Dump();
    EXPECT_FALSE(InKernel("/target/loopback/naa.5001405000000003"));
    EXPECT_FALSE(InKernel(Backstore(2)));
    const std::vector<std::string> rest = {"Unloading module 'tcm_loop'", "Unloading module 'target_core_ep'"};
    EXPECT_EQ(rest, Messages(log_, "Unloading module")) << log_.Dump();
    const std::vector<std::string> core = {"rodsp_ep", "orlo_extent_pool", "target_core_mod"};
    EXPECT_EQ(core, Modules());
}

TEST_F(StopService, TheJournalMoveReachesTheTotalStopThroughTheHook) {
    EXPECT_EQ(&ORLOiSCSITotallyStopAndUnload, orlo::ep::GetTotallyStopHook());
    ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
    ASSERT_EQ(0, InsertModuleSet(kVhostModules, 4));
    ASSERT_FALSE(Modules().empty());
    // The move fails afterwards (there is no journal to copy), but only after the stop
    // took every module out.
    EXPECT_NE(18990046u, ORLOiSCSIEpJournalRootPathChange("/volume1/jnl")) << log_.Dump();
    EXPECT_TRUE(Modules().empty()) << log_.Dump();
}

TEST_F(StopService, InUseWhileALunOrATargetIsStored) {
    EXPECT_EQ(18990003u, ORLOiSCSIServiceIsInUse(nullptr));
    bool inUse = true;
    ASSERT_EQ(0u, ORLOiSCSIServiceIsInUse(&inUse)) << log_.Dump();
    EXPECT_FALSE(inUse);
    StoreLun(4);
    ASSERT_EQ(0u, ORLOiSCSIServiceIsInUse(&inUse)) << log_.Dump();
    EXPECT_TRUE(inUse);
}

}  // namespace
}  // namespace service_test
