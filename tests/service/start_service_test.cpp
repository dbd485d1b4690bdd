// Starting the service in the simulated kernel from the configuration files alone: the
// modules, the backstores, the fabric and exactly the targets whose stored flag is set;
// what a failing target, a failing module load and a failing LUN do to the start; the
// plug-in daemon's start; whether the service is in use; and the background release of
// the trash, which the misc stop ends.
#include <dirent.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <regex>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"
#include "service/unmap_trash_util.h"

namespace service_test {
namespace {

const std::string kHost = "iqn.1991-05.com.example:host";

std::string UuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "7b3e1d20-0000-4000-8000-%012d", lid);
    return buf;
}

std::string IqnOf(int tid) { return "iqn.2000-01.com.orlo-nas:start-" + std::to_string(tid); }

// Processes of a group as "pid state", read from /proc.
std::vector<std::pair<pid_t, char>> GroupMembers(pid_t pgid) {
    std::vector<std::pair<pid_t, char>> out;
    DIR *d = opendir("/proc");
    if (d == nullptr) return out;
    while (struct dirent *e = readdir(d)) {
        if (e->d_name[0] < '1' || e->d_name[0] > '9') continue;
        FILE *f = fopen(("/proc/" + std::string(e->d_name) + "/stat").c_str(), "r");
        if (f == nullptr) continue;
        char buf[1024];
        size_t n = fread(buf, 1, sizeof(buf) - 1, f);
        fclose(f);
        buf[n] = '\0';
        const char *close = strrchr(buf, ')');
        char state = 0;
        int ppid = 0, group = 0;
        if (close != nullptr && sscanf(close + 1, " %c %d %d", &state, &ppid, &group) == 3 && group == pgid)
            out.emplace_back(atoi(e->d_name), state);
    }
    closedir(d);
    return out;
}

class StartService : public ServiceSimTest {
  protected:
    void StoreLun(int lid, bool withData = true) {
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
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        if (!withData) return;
        char data[4096];
        ASSERT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
        WriteFile(data, "");
        ASSERT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE)) << log_.Dump();
    }
    void StoreTarget(int tid, bool enabled, bool bkp = false) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        t.tid = tid;
        t.enabled = enabled;
        t.bkp_obj = bkp;
        snprintf(t.name, sizeof(t.name), "start-%d", tid);
        snprintf(t.iqn, sizeof(t.iqn), "%s", IqnOf(tid).c_str());
        t.max_recv_seg_bytes = 262144;
        t.max_send_seg_bytes = 262144;
        t.max_sessions = 1;
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&t)) << log_.Dump();
    }
    // Targets 1 (enabled, LUN 1 as number 0 read-write for kHost), 2 (disabled, LUN 2),
    // 3 (enabled, no LUN).
    void StoreConfiguration() {
        StoreLun(1);
        StoreLun(2);
        StoreTarget(1, true);
        StoreTarget(2, false);
        StoreTarget(3, true);
        if (HasFatalFailure()) return;
        ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(1, 1, 0));
        ASSERT_EQ(0u, ORLOiSCSITargetConfMappingAdd(2, 2, 0));
        ASSERT_EQ(0u, ORLOiSCSITargetConfAclAdd(1, kHost.c_str(), ISCSI_TARGET_AUTHORITY_RW));
    }

    static std::string Tpg(int tid) { return "/target/iscsi/" + IqnOf(tid) + "/tpgt_1"; }
    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
    std::string Attr(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }
    std::vector<std::string> Ls(const std::string &inside) {
        std::vector<std::string> out;
        DIR *d = opendir(Cfg(inside).c_str());
        if (d == nullptr) return out;
        while (struct dirent *e = readdir(d))
            if (e->d_name[0] != '.' && strncmp(e->d_name, "hba_", 4) != 0) out.push_back(e->d_name);
        closedir(d);
        std::sort(out.begin(), out.end());
        return out;
    }
    // Lines of the "FILE:LINE message" form, without the standard prefix.
    int PlainLines(const std::string &message) {
        int n = 0;
        const std::regex plain("^iscsi_start_all_without_lock\\.cpp:[0-9]+ " + message + "$");
        for (const std::string &l : log_.Lines())
            if (std::regex_match(l, plain)) ++n;
        return n;
    }
};

TEST_F(StartService, StartFromTheFilesBuildsExactlyTheEnabledTargetsAndTwiceChangesNothing) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    // A stand-in for initctl that records how it was called.
    WriteFile("/sbin/initctl", "#!/bin/sh\necho \"$@\" >> \"$ORLO_SYSROOT/tmp/initctl.calls\"\n", 0755);

    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    std::vector<std::string> modules = ModuleSetNames(kTcmModules, 4);
    modules.push_back("iscsi_target_mod");
    EXPECT_EQ(modules, Modules());
    EXPECT_EQ("start is_plugind\n", ReadFile("/tmp/initctl.calls"));
    // Every stored LUN has its backstore, mapped or not.
    EXPECT_EQ((std::vector<std::string>{"LUN_" + UuidOf(1), "LUN_" + UuidOf(2)}), Ls("/target/core/fileio_0"));
    EXPECT_EQ((std::vector<std::string>{IqnOf(1), IqnOf(3)}), Ls("/target/iscsi"));
    EXPECT_EQ("1", Attr(Tpg(1) + "/enable"));
    EXPECT_EQ("1", Attr(Tpg(3) + "/enable"));
    EXPECT_TRUE(InKernel(Tpg(1) + "/lun/lun_0/LUN_" + UuidOf(1)));
    EXPECT_EQ("0", Attr(Tpg(1) + "/acls/" + kHost + "/lun_0/write_protect"));
    EXPECT_TRUE(Ls(Tpg(3) + "/lun").empty());
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(2, nullptr));
    EXPECT_TRUE(HasLog(log_, "iscsi_start_all_without_lock.cpp", "ORLOiSCSIStartAllWithoutLock",
                       "Successfully started iSCSI service."))
        << log_.Dump();
    EXPECT_EQ(1, PlainLines("Successfully started iSCSI service.")) << log_.Dump();

    // A second start finds everything in place.
    ClearTrace();
    log_.Clear();
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ(modules, Modules());
    for (const orlotest::SimOp &op : Trace()) EXPECT_NE("mkdir", op.op) << op.path;
    EXPECT_EQ((std::vector<std::string>{IqnOf(1), IqnOf(3)}), Ls("/target/iscsi"));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(3, nullptr));
    EXPECT_EQ(1, PlainLines("Successfully started iSCSI service.")) << log_.Dump();

    // Without initctl the start goes on; the failed run is logged.
    ASSERT_EQ(0, unlink(Real("/sbin/initctl").c_str()));
    log_.Clear();
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ(1u, Messages(log_, "OLIBCExec(\"/sbin/initctl\", \"start\", \"is_plugind\", nullptr, nullptr) "
                                 "failed, ret=-1")
                      .size())
        << log_.Dump();
}

TEST_F(StartService, ATargetThatCannotBeEnabledDoesNotKeepTheOthersDown) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    ASSERT_EQ(0, SetFault("mkdir", "/target/iscsi/" + IqnOf(1), "ENOMEM"));
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(3, nullptr));
    const std::vector<std::string> failed = Messages(log_, "ORLOiSCSITargetEnable(");
    ASSERT_EQ(1u, failed.size()) << log_.Dump();
    EXPECT_NE(std::string::npos, failed[0].find(") failed, err=")) << failed[0];
    EXPECT_TRUE(HasLog(log_, "iscsi_start_all_without_lock.cpp", "ORLOiSCSIStartAllWithoutLock",
                       "Successfully started iSCSI service."));
    // The stored flag is left as it was: the next start tries again, and succeeds.
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
}

TEST_F(StartService, AModuleOrLunThatFailsEndsTheStartBeforeAnyTarget) {
    StoreConfiguration();
    if (HasFatalFailure()) return;
    // Without target_core_mod's file it is skipped, and the next module has nothing to
    // attach to.
    ASSERT_EQ(0, unlink(Real("/lib/modules/target_core_mod.ko").c_str()));
    EXPECT_EQ(18990030u, ORLOiSCSIStartAll());
    for (const char *line :
         {"ORLOiSCSILoadModulesWithoutLock(ISCSI_KERNEL_MODULES) failed, err=Failed to insmod kernel module",
          "ORLOiSCSIStartBasicWithoutLock() failed, err=Failed to insmod kernel module",
          "ORLOiSCSIStartAllWithoutLock() failed, err=Failed to insmod kernel module"})
        EXPECT_EQ(1u, Messages(log_, line).size()) << line << "\n" << log_.Dump();
    EXPECT_FALSE(InKernel("/target/iscsi"));
    EXPECT_EQ(0, PlainLines("Successfully started iSCSI service."));

    // A LUN whose data is missing fails the start after the backstores, before the
    // fabric: no target runs.
    WriteFile("/lib/modules/target_core_mod.ko", "");
    StoreLun(3, false);
    log_.Clear();
    EXPECT_NE(0u, ORLOiSCSIStartAll());
    EXPECT_EQ(1u, Messages(log_, "ORLOiSCSILunServiceStartAllWithoutLock() failed, err=").size()) << log_.Dump();
    EXPECT_TRUE(InKernel("/target/core/fileio_0/LUN_" + UuidOf(1)));
    EXPECT_TRUE(Ls("/target/iscsi").empty());
}

TEST_F(StartService, InUseCountsLunsAndTargetsButNoBackupObjects) {
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
    bool inUse = true;
    ASSERT_EQ(0u, ORLOiSCSIServiceIsInUse(&inUse)) << log_.Dump();
    EXPECT_FALSE(inUse);
    StoreTarget(5, false, true);
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSIServiceIsInUse(&inUse)) << log_.Dump();
    EXPECT_FALSE(inUse) << "a backup object alone";
    StoreTarget(6, false);
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSIServiceIsInUse(&inUse)) << log_.Dump();
    EXPECT_TRUE(inUse) << "a target without LUNs";

    // A target file that cannot be read: the query's failure is reported.
    ASSERT_EQ(0, unlink(Real("/usr/orlo/etc/iscsi_target.conf").c_str()));
    ASSERT_EQ(0, mkdir(Real("/usr/orlo/etc/iscsi_target.conf").c_str(), 0700));
    log_.Clear();
    EXPECT_EQ(18990724u, ORLOiSCSIServiceIsInUse(&inUse));
    const std::vector<std::string> lines = Messages(log_, "ORLOiSCSIConfGet(");
    ASSERT_EQ(1u, lines.size()) << log_.Dump();
    EXPECT_TRUE(std::regex_match(lines[0], std::regex("ORLOiSCSIConfGet\\(0x[0-9a-f]+, 0x[0-9a-f]+\\) failed, "
                                                      "err=Failed to load target config")))
        << lines[0];
}

TEST_F(StartService, TrashReleaseRunsInAGroupThatTheMiscStopEnds) {
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
    ASSERT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1")) << log_.Dump();
    // No trash anywhere: nothing is started or recorded.
    ASSERT_EQ(0u, ORLOiSCSILunUnmapTrashInBackground()) << log_.Dump();
    EXPECT_FALSE(Exists(orlo::service::unmap::kPidFile));
    EXPECT_EQ(0u, ORLOiSCSILunUnmapTrashStop());

    // A map file waits in the trash; the trash lock, held here, keeps the worker waiting.
    WriteFile("/volume1/@iSCSI/EP_unmap/" + UuidOf(9), "not released");
    int32_t lockFd = -1;
    ASSERT_EQ(0u, ORLOiSCSIEpTrashLock(&lockFd, "/volume1")) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSILunUnmapTrashInBackground()) << log_.Dump();
    std::vector<pid_t> groups;
    ASSERT_EQ(0u, orlo::service::unmap::ReadGroups(&groups));
    ASSERT_EQ(1u, groups.size());
    const pid_t group = groups[0];
    // Wait for the worker: a running process of the group other than its leader.
    bool worker = false;
    for (int i = 0; i < 250 && !worker; ++i) {
        for (const auto &m : GroupMembers(group))
            if (m.first != group && m.second != 'Z') worker = true;
        if (!worker) usleep(20000);
    }
    ASSERT_TRUE(worker);

    // killall finding no LUN-backup daemon exits 1, which is no failure.
    WriteFile("/bin/killall", "#!/bin/sh\necho \"$@\" >> \"$ORLO_SYSROOT/tmp/killall.calls\"\nexit 1\n", 0755);
    ASSERT_EQ(0u, ORLOiSCSIStopMiscService()) << log_.Dump();
    EXPECT_EQ("orlolunbkp\n", ReadFile("/tmp/killall.calls"));
    for (const auto &m : GroupMembers(group)) EXPECT_EQ('Z', m.second) << m.first;
    EXPECT_FALSE(Exists(orlo::service::unmap::kPidFile));
    EXPECT_EQ(0u, ORLOiSCSIEpTrashUnlock(lockFd));
    // The map file stays for the next run.
    EXPECT_EQ("not released", ReadFile("/volume1/@iSCSI/EP_unmap/" + UuidOf(9)));
    EXPECT_EQ(0u, ORLOiSCSILunUnmapTrashStop()) << "nothing left to stop";
}

}  // namespace
}  // namespace service_test
