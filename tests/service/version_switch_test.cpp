// Switching the target-core generation in the simulated kernel: the old core's modules
// come out, the new version is written to the defaults file, and the start on the new
// core brings the same targets back with the advanced LUN's backstore moved to the
// extent-pool host of the new version.
#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_configfs.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"

namespace service_test {
namespace {

const std::string kIqn = "iqn.2000-01.com.orlo-nas:switch";
const std::string kTpg = "/target/iscsi/" + kIqn + "/tpgt_1";
const std::string kHost = "iqn.1991-05.com.example:host";
const std::string kDefaults = "/etc.defaults/orloinfo.conf";

std::string UuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "3c9d7e40-0000-4000-8000-%012d", lid);
    return buf;
}

class VersionSwitch : public ServiceSimTest {
  protected:
    // LUN 1 advanced, LUN 2 a file LUN, both mapped into one enabled target with an
    // access list; the service started on the newer core.
    void StartWithAdvancedLun() {
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1")) << log_.Dump();
        for (int lid : {1, 2}) {
            ORLOiSCSILun lun;
            memset(&lun, 0, sizeof(lun));
            lun.lid = lid;
            lun.lockHandle = -1;
            lun.type = lid == 1 ? ORLO_ISCSI_LUN_TYPE_ADV : ORLO_ISCSI_LUN_TYPE_FILE;
            lun.blockSize = 512;
            lun.size = 1073741824ULL;
            snprintf(lun.uuid, sizeof(lun.uuid), "%s", UuidOf(lid).c_str());
            snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "serial-%d", lid);
            snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
            snprintf(lun.name, sizeof(lun.name), "LUN-%d", lid);
            ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
            char data[4096];
            ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
            if (lid == 1) {
                ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate(lun.rootPath, 0)) << log_.Dump();
                ASSERT_EQ(0u, ORLOiSCSIEpMapFileMetaInit(data, lun.rootPath, lun.size)) << log_.Dump();
            } else {
                WriteFile(data, "");
                ASSERT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE));
            }
        }
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        t.tid = 1;
        t.enabled = true;
        snprintf(t.name, sizeof(t.name), "switch");
        snprintf(t.iqn, sizeof(t.iqn), "%s", kIqn.c_str());
        t.max_recv_seg_bytes = 262144;
        t.max_send_seg_bytes = 262144;
        t.max_sessions = 1;
        ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(1, 1, 0));
        ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(1, 2, 1));
        ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost.c_str(), ISCSI_TARGET_AUTHORITY_RO));
        // No LUN-backup daemon runs here; killall says so and the stop goes on.
        WriteFile("/bin/killall", "#!/bin/sh\nexit 1\n", 0755);
        ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    }

    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
    std::string Attr(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }
    std::string LinkOf(const std::string &inside) {
        char buf[512];
        ssize_t n = readlink(Cfg(inside).c_str(), buf, sizeof(buf) - 1);
        return n > 0 ? std::string(buf, static_cast<size_t>(n)) : "";
    }
    std::vector<std::string> Modules4(const std::string &iscsi) {
        std::vector<std::string> m = ModuleSetNames(kTcmModules, 4);
        m.push_back(iscsi);
        return m;
    }
};

TEST_F(VersionSwitch, AdvancedLunMovesBetweenEpioAndFileioAndTheTargetRunsOn) {
    StartWithAdvancedLun();
    if (HasFatalFailure()) return;
    const std::string adv = "LUN_" + UuidOf(1), file = "LUN_" + UuidOf(2);
    ASSERT_TRUE(InKernel("/target/core/epio_0/" + adv)) << TraceDump();
    ASSERT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));

    // The same version changes nothing at all.
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSIConfigfsChangeCurrentVersion(4)) << log_.Dump();
    for (const orlotest::SimOp &op : Trace()) EXPECT_EQ("read", op.op) << op.path;
    EXPECT_EQ(18990004u, ORLOiSCSIConfigfsChangeCurrentVersion(3));
    EXPECT_EQ(18990004u, ORLOiSCSIConfigfsChangeCurrentVersion(0));

    ASSERT_EQ(0u, ORLOiSCSIConfigfsChangeCurrentVersion(2)) << log_.Dump();
    EXPECT_EQ(2u, ORLOiSCSIGetLioVersion());
    std::vector<std::string> older = ModuleSetNames(kTcmModules, 2);
    older.push_back("iscsi_target_mod_4_0");
    EXPECT_EQ(older, Modules());
    EXPECT_NE(std::string::npos, ReadFile(kDefaults).find("iscsi_target_type=\"lio\"\n")) << ReadFile(kDefaults);
    EXPECT_EQ(std::string::npos, ReadFile(kDefaults).find("lio4x"));
    EXPECT_TRUE(InKernel("/target/core/fileio_0/" + adv)) << TraceDump();
    EXPECT_TRUE(InKernel("/target/core/fileio_0/" + file));
    EXPECT_FALSE(InKernel("/target/core/epio_0"));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_NE(std::string::npos, LinkOf(kTpg + "/lun/lun_0/" + adv).find("target/core/fileio_0/" + adv));
    EXPECT_EQ("1", Attr(kTpg + "/acls/" + kHost + "/lun_0/write_protect"));
    EXPECT_EQ("1", Attr(kTpg + "/acls/" + kHost + "/lun_1/write_protect"));
    // A process that starts afresh reads the new choice from the defaults file.
    orlo::LioReset();
    EXPECT_EQ(2u, ORLOiSCSIGetLioVersion());

    ASSERT_EQ(0u, ORLOiSCSIConfigfsChangeCurrentVersion(4)) << log_.Dump();
    EXPECT_EQ(Modules4("iscsi_target_mod"), Modules());
    EXPECT_NE(std::string::npos, ReadFile(kDefaults).find("iscsi_target_type=\"lio4x\"\n"));
    EXPECT_TRUE(InKernel("/target/core/epio_0/" + adv));
    EXPECT_FALSE(InKernel("/target/core/fileio_0/" + adv));
    EXPECT_NE(std::string::npos, LinkOf(kTpg + "/lun/lun_0/" + adv).find("target/core/epio_0/" + adv));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
}

TEST_F(VersionSwitch, AFailedStopKeepsTheVersionAndTheDefaultsFile) {
    StartWithAdvancedLun();
    if (HasFatalFailure()) return;
    const std::string before = ReadFile(kDefaults);
    // The node cannot be taken down, so the stop fails before anything is unloaded.
    ASSERT_EQ(0, SetFault("rmdir", "/target/iscsi/" + kIqn, "EBUSY"));
    log_.Clear();
    EXPECT_NE(0u, ORLOiSCSIConfigfsChangeCurrentVersion(2));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSIStopAll() failed, err=").size()) << log_.Dump();
    EXPECT_EQ(4u, ORLOiSCSIGetLioVersion());
    EXPECT_EQ(before, ReadFile(kDefaults));
    EXPECT_EQ(Modules4("iscsi_target_mod"), Modules());

    // A module that will not come out stops the switch as well, before the version
    // changes.
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    ASSERT_EQ(0, SetFault("rmdir", "/target/core/fileio_0/LUN_" + UuidOf(2), "EBUSY"));
    log_.Clear();
    EXPECT_NE(0u, ORLOiSCSIConfigfsChangeCurrentVersion(2));
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILunServiceStopAll() failed, err=").size()) << log_.Dump();
    EXPECT_EQ(4u, ORLOiSCSIGetLioVersion());
    EXPECT_EQ(before, ReadFile(kDefaults));
}

}  // namespace
}  // namespace service_test
