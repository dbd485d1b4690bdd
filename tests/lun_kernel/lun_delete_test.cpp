// Unloading and deleting LUNs against the simulated kernel target: a backstore a target
// links to stays, deletion refuses mapped and busy LUNs and otherwise leaves nothing in
// the files, on the volume or in the kernel tree, and an advanced LUN's extents are given
// back by a background process that works under the volume's trash lock.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "lun_kernel/lun_kernel_fixture.h"
#include "orlo_storage.h"
#include "support/loop_volume.h"

namespace lun_kernel_test {
namespace {

const char kNode[] = "/target/iscsi/iqn.2000-01.com.orlo:t1";

class LunDeleteTest : public LunKernelTest {
  protected:
    // Maps the backstore in the kernel as a target's LUN entry would: lun/lun_<n> with a
    // link to it.  Returns the link's path inside the mount.
    std::string LinkFromTarget(const std::string &bs, int n) {
        for (const std::string &d : {std::string("/target/iscsi"), std::string(kNode), std::string(kNode) + "/tpgt_1",
                                     std::string(kNode) + "/tpgt_1/lun/lun_" + std::to_string(n)}) {
            if (mkdir(Cfg(d).c_str(), 0700) != 0 && errno != EEXIST) ADD_FAILURE() << d << ": " << strerror(errno);
        }
        std::string link = std::string(kNode) + "/tpgt_1/lun/lun_" + std::to_string(n) + "/lnk";
        EXPECT_EQ(0, symlink(Cfg(bs).c_str(), Cfg(link).c_str())) << strerror(errno);
        return link;
    }
    bool HasSection(const std::string &file, const ORLOiSCSILun &lun) {
        return ReadFile(file).find("[LUN_" + std::string(lun.uuid) + "]") != std::string::npos;
    }
    // Everything a stored and loaded LUN has is still there.
    void ExpectIntact(const ORLOiSCSILun &lun) {
        EXPECT_TRUE(Exists("/config" + Backstore(lun)));
        EXPECT_TRUE(Exists(DataPath(lun)));
        EXPECT_TRUE(HasSection(lun_test::kGlobalConf, lun));
        EXPECT_TRUE(HasSection(lun_test::kVolumeConf, lun));
        int locked = 1;
        EXPECT_EQ(0u, ORLOiSCSILunIsLocked(&lun, &locked));
        EXPECT_EQ(0, locked);
        EXPECT_FALSE(Exists("/tmp/iscsi/LUN_" + std::string(lun.uuid) + ".progress"));
    }
    // Nothing of the LUN is left but its type's directory.
    void ExpectGone(const ORLOiSCSILun &lun) {
        EXPECT_FALSE(Exists("/config" + Backstore(lun)));
        if (ORLO_ISCSI_LUN_IS_FILE_BACKED(lun.type)) {
            EXPECT_FALSE(Exists(LunDir(lun))) << LunDir(lun);
            EXPECT_FALSE(HasSection(lun_test::kVolumeConf, lun));
        }
        EXPECT_FALSE(HasSection(lun_test::kGlobalConf, lun));
        EXPECT_FALSE(Exists("/tmp/iscsi/LUN_" + std::string(lun.uuid) + ".progress"));
        EXPECT_FALSE(Exists("/tmp/iscsi/lun_lock/LUN_" + std::string(lun.uuid) + ".lock"));
    }
    // Waits until the trace holds line (at most 20 seconds).
    bool WaitForTraceLine(const std::string &line) {
        double end = Now() + 20;
        while (Now() < end) {
            for (const std::string &l : ChangeLines())
                if (l == line) return true;
            usleep(20000);
        }
        return false;
    }
};

TEST_F(LunDeleteTest, UnloadRefusesALinkedBackstoreAndRemovesAnUnlinkedOne) {
    ORLOiSCSILun lun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_FILE);
    ORLOiSCSILun other = MakeLun(2, ORLO_ISCSI_LUN_TYPE_THIN);
    Store(lun);
    Store(other);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&other)) << log_.Dump();
    const std::string bs = Backstore(lun);
    LinkFromTarget(Backstore(other), 0);  // another LUN's link does not count
    const std::string link = LinkFromTarget(bs, 1);

    ClearTrace();
    log_.Clear();
    EXPECT_EQ(18990534u, ORLOiSCSILunUnload(&lun));
    EXPECT_TRUE(log_.Contains("iscsi_lun_unload.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("LUN is mapped: /config" + link + " links to /config" + bs + ". lid: 1, name: LUN-1"))
        << log_.Dump();
    // The kernel's refusal to remove a linked directory is the check: nothing changed.
    EXPECT_EQ((std::vector<std::string>{"rmdir " + bs + " EBUSY"}), ChangeLines()) << TraceDump();
    EXPECT_TRUE(Exists("/config" + bs));

    ASSERT_EQ(0, unlink(Cfg(link).c_str()));
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILunUnload(&lun)) << log_.Dump();
    EXPECT_EQ((std::vector<std::string>{"rmdir " + bs + " 0"}), ChangeLines());
    int loaded = 1;
    ASSERT_EQ(0u, ORLOiSCSILunIsLoaded(&lun, &loaded));
    EXPECT_EQ(0, loaded);
    EXPECT_TRUE(Exists("/config" + Backstore(other)));

    // Not loaded: nothing to do.
    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSILunUnload(&lun));
    EXPECT_TRUE(ChangeLines().empty()) << TraceDump();
    EXPECT_EQ(18990003u, ORLOiSCSILunUnload(nullptr));

    // Something outside the fabrics' LUN entries that keeps the backstore busy.
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun));
    ASSERT_EQ(0, SetFault("rmdir", bs, "EBUSY"));
    log_.Clear();
    EXPECT_EQ(18990534u, ORLOiSCSILunUnload(&lun));
    EXPECT_TRUE(log_.Contains("rmdir(\"/config" + bs + "\") failed, err=Device or resource busy. lid: 1, name: LUN-1"))
        << log_.Dump();
    EXPECT_TRUE(Exists("/config" + bs));
}

TEST_F(LunDeleteTest, DeletingEachKindLeavesNothingBehind) {
    ORLOiSCSILun neighbour = MakeLun(20, ORLO_ISCSI_LUN_TYPE_FILE);
    Store(neighbour);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&neighbour));
    for (uint32_t type : {ORLO_ISCSI_LUN_TYPE_FILE, ORLO_ISCSI_LUN_TYPE_THIN, ORLO_ISCSI_LUN_TYPE_BLUN,
                          ORLO_ISCSI_LUN_TYPE_VDISK_BLUN, ORLO_ISCSI_LUN_TYPE_BLOCK}) {
        SCOPED_TRACE(ORLOiSCSILunTypeName(type));
        ORLOiSCSILun lun = MakeLun(static_cast<int>(type % 64) + 1, type,
                                   type == ORLO_ISCSI_LUN_TYPE_BLOCK ? "/dev/orlo-no-such-disk" : "/volume1");
        Store(lun);
        std::vector<std::string> want;
        if (type != ORLO_ISCSI_LUN_TYPE_BLOCK) {
            ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();
            want.push_back("rmdir " + Backstore(lun) + " 0");
        }
        ClearTrace();
        ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
        EXPECT_EQ(want, ChangeLines());
        EXPECT_EQ(-1, lun.lockHandle);
        ExpectGone(lun);
    }
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    ExpectIntact(neighbour);
    EXPECT_TRUE(Ls("/volume1/@iSCSI/EP_unmap").empty());
}

TEST_F(LunDeleteTest, AdvancedLunExtentsAreGivenBackInTheBackground) {
    ORLOiSCSILun lun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_ADV);
    Store(lun);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();
    const std::string uuid = lun.uuid;
    const std::string trashed = "/volume1/@iSCSI/EP_unmap/" + uuid;
    char mapUuid[37];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(DataPath(lun).c_str(), mapUuid));

    // While another release holds the trash, deletion does not wait for it.
    int32_t trashLock = -1;
    ASSERT_EQ(0u, ORLOiSCSIEpTrashLock(&trashLock, "/volume1"));
    double start = Now();
    ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
    EXPECT_LT(Now() - start, 3.0);
    ExpectGone(lun);
    EXPECT_TRUE(Exists(trashed)) << "the map file waits in the trash";
    char stillUuid[37];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(trashed.c_str(), stillUuid));
    EXPECT_STREQ(mapUuid, stillUuid);
    usleep(300000);
    EXPECT_TRUE(Exists(trashed)) << "the release waits for the trash lock";

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIEpTrashUnlock(trashLock));
    ASSERT_TRUE(WaitForTrash("/volume1")) << TraceDump();
    const std::string bs = "/target/core/epio_1/UNMAP_LUN_" + uuid;
    EXPECT_EQ((std::vector<std::string>{
                  "mkdir " + bs + " 0",
                  "write " + bs + "/control ep_map_table=1,ep_dev_name=" + trashed + " 0",
                  "write " + bs + "/wwn/vpd_unit_serial " + uuid + " 0",
                  "write " + bs + "/attrib/uuid " + uuid + " 0",
                  "write " + bs + "/attrib/lun_name UNMAP_LUN_" + uuid + " 0",
                  "write " + bs + "/attrib/is_skip_resource_monitor 0 0",
                  "write " + bs + "/attrib/emulate_sync_cache 0 0",
                  "write " + bs + "/alua/default_tg_pt_gp/alua_access_type 1 0",
                  "write " + bs + "/enable 1 0",
                  "rmdir " + bs + " 0",
              }),
              ChangeLines());
    EXPECT_TRUE(Backstores("epio_1").empty());
    EXPECT_TRUE(Backstores("epio_0").empty());

    // A release the kernel refuses keeps the map file for the next run.
    ORLOiSCSILun second = MakeLun(2, ORLO_ISCSI_LUN_TYPE_VDISK_ADV);
    Store(second);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&second)) << log_.Dump();
    const std::string bs2 = "/target/core/epio_1/UNMAP_LUN_" + std::string(second.uuid);
    ASSERT_EQ(0, SetFault("write", bs2 + "/enable", "EIO"));
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILunDelete(&second)) << log_.Dump();
    ASSERT_TRUE(WaitForTraceLine("rmdir " + bs2 + " 0")) << TraceDump();
    ASSERT_EQ(0u, ORLOiSCSIEpTrashLock(&trashLock, "/volume1"));
    ASSERT_EQ(0u, ORLOiSCSIEpTrashUnlock(trashLock));
    EXPECT_EQ((std::vector<std::string>{second.uuid}), Ls("/volume1/@iSCSI/EP_unmap"));
    EXPECT_TRUE(Backstores("epio_1").empty());
    ExpectGone(second);
    ASSERT_EQ(0u, ORLOiSCSILunUnmapALUNInBackground("/volume1"));
    ASSERT_TRUE(WaitForTrash("/volume1")) << TraceDump();

    EXPECT_EQ(18990004u, ORLOiSCSILunUnmapALUNInBackground(nullptr));
    EXPECT_EQ(18990004u, ORLOiSCSILunUnmapALUNInBackground("/volume1/@iSCSI"));
    EXPECT_EQ(18990311u, ORLOiSCSILunUnmapALUNInBackground("/srv"));
}

TEST_F(LunDeleteTest, MappedLunsAreRefusedAndKeepEverything) {
    ORLOiSCSILun lun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_FILE);
    Store(lun);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun));
    int mapped = -1;
    ASSERT_EQ(0u, ORLOiSCSILunIsMapped(&lun, &mapped));
    EXPECT_EQ(0, mapped) << "no mapping file";

    // Mappings of other lids do not count.
    WriteFile("/usr/orlo/etc/iscsi_mapping.conf",
              "[iSCSI_MAP_T1_L17]\n\ttid=1\n\tlid=17\n\tlun=0\n[iSCSI_MAP_T1_L1x]\n\ttid=1\n\tlid=1\n\tlun=1\n"
              "[iSCSI_MAP_T11_L11]\n\ttid=11\n\tlid=11\n\tlun=0\n");
    ASSERT_EQ(0u, ORLOiSCSILunIsMapped(&lun, &mapped));
    EXPECT_EQ(0, mapped);
    WriteFile("/usr/orlo/etc/iscsi_mapping.conf",
              "[iSCSI_MAP_T1_L17]\n\ttid=1\n\tlid=17\n\tlun=0\n[iSCSI_MAP_T2_L1]\n\ttid=2\n\tlid=1\n\tlun=3\n");
    ASSERT_EQ(0u, ORLOiSCSILunIsMapped(&lun, &mapped));
    EXPECT_EQ(1, mapped);

    ClearTrace();
    log_.Clear();
    EXPECT_EQ(18990534u, ORLOiSCSILunDelete(&lun));
    EXPECT_TRUE(log_.Contains("iscsi_lun_delete.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("LUN is mapped. lid: 1, name: LUN-1")) << log_.Dump();
    EXPECT_TRUE(ChangeLines().empty()) << TraceDump();
    ExpectIntact(lun);

    // Linked in the kernel without a stored mapping: the unload refuses, nothing goes.
    unlink(Real("/usr/orlo/etc/iscsi_mapping.conf").c_str());
    const std::string link = LinkFromTarget(Backstore(lun), 0);
    log_.Clear();
    EXPECT_EQ(18990534u, ORLOiSCSILunDelete(&lun));
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunUnload(")) << log_.Dump();
    ExpectIntact(lun);
    EXPECT_EQ(-1, lun.lockHandle);

    ASSERT_EQ(0, unlink(Cfg(link).c_str()));
    ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
    ExpectGone(lun);
    EXPECT_EQ(18990003u, ORLOiSCSILunDelete(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSILunIsMapped(nullptr, &mapped));
}

TEST_F(LunDeleteTest, ALockedLunIsRefusedAfterFiveSeconds) {
    ORLOiSCSILun lun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_THIN);
    Store(lun);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun));
    lun_test::LockHolder holder;
    ASSERT_TRUE(holder.Start(lun, 7));
    ClearTrace();
    log_.Clear();
    double start = Now();
    EXPECT_EQ(18990535u, ORLOiSCSILunDelete(&lun));
    EXPECT_GE(Now() - start, 4.5);
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunLock(")) << log_.Dump();
    EXPECT_TRUE(ChangeLines().empty()) << TraceDump();
    EXPECT_TRUE(Exists("/config" + Backstore(lun)));
    EXPECT_TRUE(Exists(DataPath(lun)));
    EXPECT_TRUE(Exists("/tmp/iscsi/LUN_" + std::string(lun.uuid) + ".progress")) << "the holder's progress stays";
    EXPECT_EQ(0, holder.Finish());
    ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
    ExpectGone(lun);
}

TEST_F(LunDeleteTest, AFailureAfterTheUnloadDoesNotStopTheRest) {
    ORLOiSCSILun lun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_FILE);
    Store(lun);
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun));
    const std::string dir = LunDir(lun);
    WriteFile(dir + "/stray/file", "x");

    log_.Clear();
    EXPECT_EQ(18990029u, ORLOiSCSILunDelete(&lun));
    EXPECT_TRUE(log_.Contains("ORLOiSCSIRmdir(\"" + dir + "/stray\") failed, err=Failed to remove directory"))
        << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to remove the files of LUN. lid: 1, name: LUN-1, err=Failed to remove directory"))
        << log_.Dump();
    // The rest went all the same; the directory stays with what could not be removed.
    EXPECT_FALSE(Exists("/config" + Backstore(lun)));
    EXPECT_FALSE(Exists(DataPath(lun)));
    EXPECT_FALSE(HasSection(lun_test::kGlobalConf, lun));
    EXPECT_FALSE(HasSection(lun_test::kVolumeConf, lun));
    EXPECT_TRUE(Exists(dir + "/stray/file"));
    int locked = 1;
    ASSERT_EQ(0u, ORLOiSCSILunIsLocked(&lun, &locked));
    EXPECT_EQ(0, locked);

    // Deleting again once the stray file is gone finishes the job.
    ASSERT_EQ(0, unlink(Real(dir + "/stray/file").c_str()));
    ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
    ExpectGone(lun);
}

TEST_F(LunDeleteTest, BlunSubvolumeOnBtrfsGoesAsAWhole) {
    ORLO_SKIP_UNLESS_LOOP_VOLUME(orlotest::LoopVolume::Fs::kBtrfs);
    orlotest::LoopVolume vol;
    std::string err;
    ASSERT_TRUE(vol.Create(orlotest::LoopVolume::Fs::kBtrfs, 160ull << 20, Real("/volume1"), &err)) << err;
    for (uint32_t type : {ORLO_ISCSI_LUN_TYPE_BLUN, ORLO_ISCSI_LUN_TYPE_VDISK_BLUN}) {
        SCOPED_TRACE(ORLOiSCSILunTypeName(type));
        ORLOiSCSILun lun = MakeLun(static_cast<int>(type % 64), type);
        Store(lun);
        ASSERT_EQ(1, ORLOBtrfsIsSubVol(LunDir(lun).c_str())) << LunDir(lun);
        WriteFile(LunDir(lun) + "/nested/extra", "x");
        ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
        ExpectGone(lun);
    }
    EXPECT_TRUE(vol.Destroy());
}

}  // namespace
}  // namespace lun_kernel_test
