// Snapshots of an advanced LUN against the simulated kernel target: the snapshot's
// backstore is made under the extent pool's host with the name its flags give, the kernel
// clones the LUN's map file into it, and a background process finishes the record when
// the clone ends (or leaves it "Unhealthy" when it fails or is killed), releasing both
// locks; deletion moves the map file into the extent-pool trash, which empties in the
// background.  Tests here wait for the background process's three-second poll.
#include <gtest/gtest.h>
#include <dirent.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "lun_kernel/lun_kernel_fixture.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_snapshot.h"

namespace {

class AdvSnapshotTest : public lun_kernel_test::LunKernelTest {
  protected:
    void SetUp() override {
        LunKernelTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        lun_ = lun_kernel_test::MakeLun(1, ORLO_ISCSI_LUN_TYPE_ADV);
        Store(lun_);
    }
    ORLOiSCSISnapshot Request(const std::string &name) {
        ORLOiSCSISnapshot s;
        memset(&s, 0, sizeof(s));
        s.lock_fd = -1;
        snprintf(s.name, sizeof(s.name), "%s", name.c_str());
        snprintf(s.taken_by, sizeof(s.taken_by), "test");
        return s;
    }
    std::string SnapBackstore(const ORLOiSCSISnapshot &s) {
        return std::string("/target/core/epio_0/LUN_") + lun_.uuid + "_SN_" + s.uuid;
    }
    std::string MapOf(const ORLOiSCSISnapshot &s) {
        return std::string("/volume1/@iSCSI/Snapshot/ADV/") + lun_.uuid + "/" + s.uuid + "/" + s.uuid + "_00000";
    }
    ORLOiSCSISnapshot Stored(const ORLOiSCSISnapshot &s) {
        ORLOiSCSISnapshot out;
        memset(&out, 0, sizeof(out));
        EXPECT_EQ(0u, ORLOiSCSISnapshotConfInVolumeLoadByUuid(lun_.rootPath, lun_.uuid, s.uuid, &out));
        return out;
    }
    bool LunLocked() {
        int locked = -1;
        EXPECT_EQ(0u, ORLOiSCSILunIsLocked(&lun_, &locked));
        return locked != 0;
    }
    // The process that holds a lock file open (the background finisher), or -1.
    pid_t Holder(const std::string &logical) {
        const std::string target = Real(logical);
        DIR *proc = opendir("/proc");
        pid_t found = -1;
        while (struct dirent *p = readdir(proc)) {
            pid_t pid = atoi(p->d_name);
            if (pid <= 0 || pid == getpid()) continue;
            std::string fds = std::string("/proc/") + p->d_name + "/fd";
            DIR *d = opendir(fds.c_str());
            if (d == nullptr) continue;
            while (struct dirent *f = readdir(d)) {
                char link[4096];
                ssize_t n = readlink((fds + "/" + f->d_name).c_str(), link, sizeof(link) - 1);
                if (n > 0 && std::string(link, static_cast<size_t>(n)) == target) found = pid;
            }
            closedir(d);
        }
        closedir(proc);
        return found;
    }

    ORLOiSCSILun lun_;
};

TEST_F(AdvSnapshotTest, TheCloneIsFinishedInTheBackgroundAfterTheThreeSecondPoll) {
    ORLOiSCSISnapshot s = Request("nightly");
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun_, &s)) << log_.Dump();
    // Back at once: recorded "Unhealthy", the clone running in the kernel.
    EXPECT_STREQ("Unhealthy", Stored(s).status);
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_TYPE_ADV, s.type);
    const std::string bs = SnapBackstore(s);
    std::vector<std::string> changes = ChangeLines();
    char lunMap[4096];
    ASSERT_EQ(0u, ORLOiSCSILunMapPathGet(&lun_, lunMap, sizeof(lunMap)));
    char lunMapUuid[64];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(lunMap, lunMapUuid));
    const std::vector<std::string> wanted = {
        "mkdir " + bs + " 0",
        "write " + bs + "/control ep_map_table=1,ep_dev_name=" + MapOf(s) + " 0",
        "write " + bs + "/control ep_parent_name=LUN_" + std::string(lun_.uuid) + " 0",
        "write " + bs + "/control ep_clone_parent=" + lunMapUuid + " 0",
    };
    for (const std::string &w : wanted)
        EXPECT_NE(changes.end(), std::find(changes.begin(), changes.end(), w)) << w << "\n" << TraceDump();
    EXPECT_TRUE(LunLocked()) << "the background process holds the LUN";
    bool locked = false;
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&s, &locked));
    EXPECT_TRUE(locked);

    // Still running after a poll: nothing changes.
    ASSERT_EQ(0, SetCloneProgress(bs, 40));
    sleep(4);
    EXPECT_STREQ("Unhealthy", Stored(s).status);

    // The kernel's clone ends: "Healthy" with the version and mapped size the map file
    // says, the backstore out of the kernel, both locks free.
    ASSERT_EQ(0, SetCloneProgress(bs, 100));
    ASSERT_EQ(0u, ORLOiSCSISnapshotWaitUntilUnlock(&s, 10)) << log_.Dump();
    ORLOiSCSISnapshot done = Stored(s);
    EXPECT_STREQ("Healthy", done.status);
    char version[64];
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileBaseVersionGet(MapOf(s).c_str(), version));
    EXPECT_STREQ(version, done.version);
    EXPECT_STREQ(lunMapUuid, done.version) << "the version names the LUN data it holds";
    EXPECT_FALSE(Exists("/config" + bs));
    EXPECT_FALSE(LunLocked());
    ORLOiSCSISnapshot cached;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &cached));
    EXPECT_STREQ("Healthy", cached.status);

    // Deleting it: the map file into the trash, given back in the background, and the
    // LUN's snapshot directory goes with its last snapshot.
    ASSERT_EQ(0u, ORLOiSCSISnapshotDelete(&done, "test")) << log_.Dump();
    EXPECT_FALSE(Exists(MapOf(s)));
    EXPECT_TRUE(WaitForTrash(lun_.rootPath));
    EXPECT_FALSE(Exists(std::string("/volume1/@iSCSI/Snapshot/ADV/") + lun_.uuid));
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &cached));
}

TEST_F(AdvSnapshotTest, AFailedOrKilledCloneLeavesAnUnhealthyRecordAndFreeLocksAfterThePoll) {
    // The kernel gives the clone up.
    ORLOiSCSISnapshot failed = Request("failed");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun_, &failed)) << log_.Dump();
    ASSERT_EQ(0, SimControl("clone", "stop " + SnapBackstore(failed) + "\n"));
    ASSERT_EQ(0u, ORLOiSCSISnapshotWaitUntilUnlock(&failed, 10));
    EXPECT_STREQ("Unhealthy", Stored(failed).status);
    EXPECT_FALSE(LunLocked());
    EXPECT_FALSE(Exists("/config" + SnapBackstore(failed)));

    // The background process is killed: its locks go with it, the record says "Unhealthy".
    ORLOiSCSISnapshot killed = Request("killed");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun_, &killed)) << log_.Dump();
    pid_t finisher = Holder(std::string("/tmp/iscsi/snapshot_lock/SN_") + killed.uuid + ".lock");
    ASSERT_GT(finisher, 0);
    ASSERT_EQ(0, kill(finisher, SIGKILL));
    for (int i = 0; i < 100 && kill(finisher, 0) == 0; ++i) usleep(20000);
    ASSERT_EQ(0u, ORLOiSCSISnapshotWaitUntilUnlock(&killed, 2));
    EXPECT_STREQ("Unhealthy", Stored(killed).status);
    EXPECT_FALSE(LunLocked());

    // Both can be deleted, and nothing of them stays.
    ORLOiSCSISnapshot a = Stored(failed), b = Stored(killed);
    EXPECT_EQ(0u, ORLOiSCSISnapshotDelete(&a, nullptr)) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSISnapshotDelete(&b, nullptr)) << log_.Dump();
    EXPECT_TRUE(WaitForTrash(lun_.rootPath));
    EXPECT_TRUE(Backstores("epio_0").empty() || Backstores("epio_0") == std::vector<std::string>{std::string("LUN_") + lun_.uuid});
}

}  // namespace
