// What a failed creation leaves behind (nothing of its own, and an event-log entry), and
// creations racing from several processes.
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <set>
#include <string>
#include <vector>

#include "lun_create_fixture.h"
#include "orlo_storage.h"

namespace {

using lun_create_test::CreateTest;
using lun_create_test::kEventLog;
using lun_create_test::kGiB;
using lun_create_test::kGlobalConf;
using lun_create_test::kMiB;
using lun_create_test::kVolumeConf;
using lun_create_test::NewLun;
using orlotest::LoopVolume;

class LunCreateFailureTest : public CreateTest {
  protected:
    // Creates lun expecting code, then checks that nothing the call made is left: every
    // new path lies in the runtime, lock and log areas, or is the volume's @iSCSI base.
    void ExpectFailsLeavingNothing(ORLOiSCSILun *lun, uint32_t code) {
        const std::set<std::string> before = Tree();
        const std::string globalBefore = Exists(kGlobalConf) ? ReadFile(kGlobalConf) : "";
        const std::string volumeBefore = Exists(kVolumeConf) ? ReadFile(kVolumeConf) : "";
        log_.Clear();
        ASSERT_EQ(code, ORLOiSCSILunCreate(lun)) << log_.Dump();
        ASSERT_NE('\0', lun->uuid[0]);
        for (const std::string &p : Tree()) {
            if (before.count(p) != 0) continue;
            const bool allowed = p.rfind("/tmp/", 0) == 0 || p.rfind("/var", 0) == 0 || p.rfind("/plugin-", 0) == 0 ||
                                 p == "/volume1/@iSCSI" || p == "/volume1/@iSCSI/tmp" ||
                                 p == "/volume1/filler";  // the plug-in that fills the volume
            EXPECT_TRUE(allowed) << "left behind: " << p;
        }
        EXPECT_FALSE(Exists(std::string("/tmp/iscsi/LUN_") + lun->uuid + ".progress"));
        EXPECT_EQ(globalBefore, Exists(kGlobalConf) ? ReadFile(kGlobalConf) : "");
        EXPECT_EQ(volumeBefore, Exists(kVolumeConf) ? ReadFile(kVolumeConf) : "");
        const std::string entry =
            std::string("\t0x13000038\t") + lun->name + "\t" + ORLOiSCSILunTypeName(lun->type) + "\t/volume1\n";
        EXPECT_NE(std::string::npos, ReadFile(kEventLog).find(entry)) << ReadFile(kEventLog);
    }
};

// A vetoing plug-in fails the creation after the directory, the subvolume or the extent
// pool were made: all of them go again, and the post-step hears the result.
TEST_F(LunCreateFailureTest, AVetoingPluginLeavesNothingOnBtrfs) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 512 * kMiB));
    Plugin("50-veto", "cat > " + Real("/plugin-") + "$1.json\n[ \"$1\" = 4 ] && [ -e " + Real("/veto") +
                          " ] && exit 1\nexit 0\n");
    WriteFile("/veto", "");

    ORLOiSCSILun blun = NewLun("blun", ORLO_ISCSI_LUN_TYPE_BLUN, kGiB);
    ExpectFailsLeavingNothing(&blun, 18990313);
    EXPECT_TRUE(log_.Contains(std::string("Failed to execute lun_create plugin (PRE). UUID: ") + blun.uuid +
                              ", name: blun"))
        << log_.Dump();
    EXPECT_NE(std::string::npos, ReadFile("/plugin-5.json").find("\"result\":18990313"));

    // An advanced LUN on a volume without a pool: the pool made for it goes too.
    ORLOiSCSILun adv = NewLun("adv", ORLO_ISCSI_LUN_TYPE_ADV, kGiB);
    ExpectFailsLeavingNothing(&adv, 18990313);
    EXPECT_FALSE(Exists("/volume1/@iSCSI/EP"));

    // With a pool that was there before, the pool stays and only the LUN goes.
    unlink(Real("/veto").c_str());
    ORLOiSCSILun first = NewLun("adv-first", ORLO_ISCSI_LUN_TYPE_ADV, kGiB);
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&first)) << log_.Dump();
    WriteFile("/veto", "");
    ORLOiSCSILun second = NewLun("adv-second", ORLO_ISCSI_LUN_TYPE_ADV, kGiB);
    ExpectFailsLeavingNothing(&second, 18990313);
    EXPECT_TRUE(Exists("/volume1/@iSCSI/EP/EP_TBL"));
    EXPECT_TRUE(Exists(DataFile(first)));
    EXPECT_EQ(1u, Records(kGlobalConf).size());
    EXPECT_EQ(1u, Records(kVolumeConf).size());
}

// A volume that fills up while a thick LUN is being grown, and section writes that fail
// in the global file or in the volume's copy after the global one was written.
TEST_F(LunCreateFailureTest, LaterFailuresLeaveNothingOnExt4) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kExt4);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kExt4, 256 * kMiB));
    ORLOiSCSILun kept = NewLun("kept", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    ASSERT_EQ(0u, ORLOiSCSILunCreate(&kept)) << log_.Dump();

    // The space check passes, then a plug-in takes most of the space before the growth.
    ORLO_SPACE_INFO info;
    ASSERT_EQ(1, ORLOSpaceInfoGet("/volume1", &info));
    ORLOiSCSILun thick = NewLun("thick", ORLO_ISCSI_LUN_TYPE_FILE, 128 * kMiB);
    Plugin("10-fill", "[ \"$1\" = 4 ] && exec /usr/bin/fallocate -l " + std::to_string(info.freeBytes - 64 * kMiB) +
                          " " + Real("/volume1/filler") + "\nexit 0\n");
    ExpectFailsLeavingNothing(&thick, 18990002);
    EXPECT_TRUE(log_.Contains("Failed to TRUNC /volume1/@iSCSI/LUN/FILE/" + std::string(thick.uuid) + "/" +
                              thick.uuid + "_00000, request size 134217728, final size: 0"))
        << log_.Dump();
    unlink(Real(std::string(lun_create_test::kPluginDir) + "/10-fill").c_str());
    unlink(Real("/volume1/filler").c_str());

    // The volume's copy cannot be written: the global section written just before goes.
    mkdir(Real("/volume1/@iSCSI/LUN/iscsi_lun.conf.blocked").c_str(), 0700);
    rename(Real(kVolumeConf).c_str(), Real("/volume1/@iSCSI/LUN/iscsi_lun.conf.saved").c_str());
    rename(Real("/volume1/@iSCSI/LUN/iscsi_lun.conf.blocked").c_str(), Real(kVolumeConf).c_str());
    ORLOiSCSILun copyFails = NewLun("copy-fails", ORLO_ISCSI_LUN_TYPE_FILE, 16 * kMiB);
    ExpectFailsLeavingNothing(&copyFails, 18990303);
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunConfSet(")) << log_.Dump();
    rmdir(Real(kVolumeConf).c_str());
    rename(Real("/volume1/@iSCSI/LUN/iscsi_lun.conf.saved").c_str(), Real(kVolumeConf).c_str());

    // The global file is replaced by a directory while the plug-ins run.
    Plugin("10-break", "[ \"$1\" = 4 ] && mv " + Real(kGlobalConf) + " " + Real("/plugin-saved") + " && mkdir " +
                           Real(kGlobalConf) + "\nexit 0\n");
    ORLOiSCSILun globalFails = NewLun("global-fails", ORLO_ISCSI_LUN_TYPE_THIN, kGiB);
    const std::string globalText = ReadFile(kGlobalConf);
    log_.Clear();
    EXPECT_EQ(18990303u, ORLOiSCSILunCreate(&globalFails)) << log_.Dump();
    EXPECT_FALSE(Exists(LunDir(globalFails)));
    EXPECT_NE(std::string::npos, ReadFile(kEventLog).find("\tglobal-fails\tTHIN\t/volume1\n"));
    rmdir(Real(kGlobalConf).c_str());
    rename(Real("/plugin-saved").c_str(), Real(kGlobalConf).c_str());
    EXPECT_EQ(globalText, ReadFile(kGlobalConf));

    // The LUN made first is whole in both files and on disk.
    const auto global = Records(kGlobalConf);
    const auto volume = Records(kVolumeConf);
    ASSERT_EQ(1u, global.size());
    ASSERT_EQ(1u, volume.size());
    EXPECT_STREQ("kept", global[0].name);
    EXPECT_STREQ("kept", volume[0].name);
    EXPECT_TRUE(Exists(DataFile(kept)));
}

// Four processes create 50 LUNs each at once: the creation lock makes them take turns,
// so every LUN gets its own lid, name and uuid, in both files.
TEST_F(LunCreateFailureTest, ConcurrentCreatorsGetDistinctIdentities) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
    ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 512 * kMiB));
    constexpr int kProcs = 4;
    constexpr int kEach = 50;
    std::vector<pid_t> pids;
    for (int p = 0; p < kProcs; ++p) {
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            int failures = 0;
            for (int i = 0; i < kEach; ++i) {
                ORLOiSCSILun lun = NewLun("p" + std::to_string(p) + "-" + std::to_string(i),
                                          ORLO_ISCSI_LUN_TYPE_THIN, 16 * kMiB);
                if (ORLOiSCSILunCreate(&lun) != 0) ++failures;
            }
            _exit(failures > 255 ? 255 : failures);
        }
        pids.push_back(pid);
    }
    for (pid_t pid : pids) {
        int status = 0;
        ASSERT_EQ(pid, waitpid(pid, &status, 0));
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status << "\n" << log_.Dump();
    }
    for (const char *file : {kGlobalConf, kVolumeConf}) {
        SCOPED_TRACE(file);
        const auto records = Records(file);
        ASSERT_EQ(static_cast<size_t>(kProcs * kEach), records.size());
        std::set<int> lids;
        std::set<std::string> names, uuids;
        for (const ORLOiSCSILun &lun : records) {
            lids.insert(lun.lid);
            names.insert(lun.name);
            uuids.insert(lun.uuid);
            EXPECT_TRUE(Exists(DataFile(lun))) << lun.name;
        }
        EXPECT_EQ(records.size(), lids.size());
        EXPECT_EQ(1, *lids.begin());
        EXPECT_EQ(kProcs * kEach, *lids.rbegin());
        EXPECT_EQ(records.size(), names.size());
        EXPECT_EQ(records.size(), uuids.size());
    }
}

}  // namespace
