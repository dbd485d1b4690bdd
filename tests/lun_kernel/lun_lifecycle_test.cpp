// The whole life of a LUN of every file-backed type, as an administrator drives it, on a
// real Btrfs and a real ext4 volume: created, loaded into the kernel target with the
// exact control string and identity writes in order, unloaded and deleted, after which
// neither the files, nor the volume, nor the kernel tree holds anything of it.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "lun_kernel_fixture.h"
#include "support/loop_volume.h"

namespace {

using orlotest::LoopVolume;

class LunLifecycleTest : public lun_kernel_test::LunKernelTest,
                         public ::testing::WithParamInterface<LoopVolume::Fs> {
  protected:
    void SetUp() override {
        LunKernelTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        std::string why = LoopVolume::Unavailable(GetParam());
        if (!why.empty()) GTEST_SKIP() << why;
        std::string err;
        ASSERT_TRUE(volume_.Create(GetParam(), 768ull << 20, Real("/volume1"), &err)) << err;
    }
    void TearDown() override {
        volume_.Destroy();
        LunKernelTest::TearDown();
    }

    // What the kernel must be told about the LUN, in order, inside its backstore.
    std::vector<std::string> ExpectedLoad(const ORLOiSCSILun &lun) {
        const std::string bs = Backstore(lun);
        std::string control;
        if (ORLO_ISCSI_LUN_IS_ADV(lun.type)) {
            control = "ep_map_table=1,ep_dev_name=" + DataPath(lun);
        } else {
            char buf[1024];
            snprintf(buf, sizeof(buf), "fd_dev_name=%s,fd_dev_size=%llu,thin_provision=%d,block_size=%u,enable_sink=%s,fd_dio=%d",
                     DataPath(lun).c_str(), static_cast<unsigned long long>(lun.size),
                     ORLO_ISCSI_LUN_TYPE_HAS(lun.type, 0x7u) ? 1 : 0, lun.blockSize, lun.uuid,
                     lun.type == ORLO_ISCSI_LUN_TYPE_VDISK_BLUN ? 1 : 0);
            control = buf;
        }
        const std::string vdisk = ORLO_ISCSI_LUN_TYPE_HAS(lun.type, 0x27u) ? "1" : "0";
        return {"mkdir " + bs + " 0",
                "write " + bs + "/control " + control + " 0",
                "write " + bs + "/wwn/vpd_unit_serial " + lun.vpdUnitSerial + " 0",
                "write " + bs + "/attrib/uuid " + lun.uuid + " 0",
                "write " + bs + "/attrib/lun_name " + lun.name + " 0",
                "write " + bs + "/attrib/is_skip_resource_monitor " + vdisk + " 0",
                "write " + bs + "/attrib/emulate_sync_cache " + vdisk + " 0",
                "write " + bs + "/alua/default_tg_pt_gp/alua_access_type 1 0",
                "write " + bs + "/enable 1 0"};
    }
    // The changes the library made inside the LUN's backstore.
    std::vector<std::string> BackstoreChanges(const ORLOiSCSILun &lun) {
        std::vector<std::string> out;
        const std::string bs = Backstore(lun);
        for (const std::string &l : ChangeLines())
            if (l.find(" " + bs) != std::string::npos) out.push_back(l);
        return out;
    }

    LoopVolume volume_;
};

TEST_P(LunLifecycleTest, EveryTypeIsCreatedLoadedUnloadedAndDeletedWithoutTrace) {
    const uint32_t types[] = {ORLO_ISCSI_LUN_TYPE_FILE,     ORLO_ISCSI_LUN_TYPE_THIN,     ORLO_ISCSI_LUN_TYPE_ADV,
                              ORLO_ISCSI_LUN_TYPE_SINK,     ORLO_ISCSI_LUN_TYPE_VDISK_ADV, ORLO_ISCSI_LUN_TYPE_BKP_THIN,
                              ORLO_ISCSI_LUN_TYPE_BKP_ADV,  ORLO_ISCSI_LUN_TYPE_CINDER,   ORLO_ISCSI_LUN_TYPE_BLUN,
                              ORLO_ISCSI_LUN_TYPE_VDISK_BLUN};
    for (uint32_t type : types) {
        SCOPED_TRACE(ORLOiSCSILunTypeName(type));
        ORLOiSCSILun lun;
        memset(&lun, 0, sizeof(lun));
        lun.lockHandle = -1;
        lun.type = type;
        lun.blockSize = 512;
        lun.size = 16ull << 20;
        snprintf(lun.name, sizeof(lun.name), "lun-%s", ORLOiSCSILunTypeName(type));
        snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
        ASSERT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
        ASSERT_TRUE(Exists(DataPath(lun))) << DataPath(lun);

        ClearTrace();
        ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();
        EXPECT_EQ(ExpectedLoad(lun), BackstoreChanges(lun)) << TraceDump();
        int loaded = 0;
        ASSERT_EQ(0u, ORLOiSCSILunIsLoaded(&lun, &loaded));
        EXPECT_EQ(1, loaded);

        ASSERT_EQ(0u, ORLOiSCSILunUnload(&lun)) << log_.Dump();
        EXPECT_FALSE(Exists("/config" + Backstore(lun)));
        ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();  // deleting takes it out again

        const std::string dir = LunDir(lun);
        ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
        if (ORLO_ISCSI_LUN_IS_ADV(type)) {
            ASSERT_TRUE(WaitForTrash("/volume1"));
        }
        EXPECT_FALSE(Exists(dir)) << dir;
        EXPECT_FALSE(Exists("/config" + Backstore(lun)));
        EXPECT_EQ(std::string::npos, ReadFile("/usr/orlo/etc/iscsi_lun.conf").find(lun.uuid));
        EXPECT_EQ(std::string::npos, ReadFile("/volume1/@iSCSI/LUN/iscsi_lun.conf").find(lun.uuid));
    }
    // Nothing of any LUN is left in the kernel tree, in the trash or in the type folders.
    for (const char *host : {"fileio_0", "fileio_1", "epio_0", "epio_1", "iblock_0"})
        EXPECT_TRUE(Backstores(host).empty()) << host;
    EXPECT_TRUE(Ls("/volume1/@iSCSI/EP_unmap").empty());
    for (const std::string &typeDir : Ls("/volume1/@iSCSI/LUN")) {
        if (typeDir == "iscsi_lun.conf") continue;
        EXPECT_TRUE(Ls("/volume1/@iSCSI/LUN/" + typeDir).empty()) << typeDir;
    }
}

INSTANTIATE_TEST_SUITE_P(Volumes, LunLifecycleTest, ::testing::Values(LoopVolume::Fs::kBtrfs, LoopVolume::Fs::kExt4),
                         [](const ::testing::TestParamInfo<LoopVolume::Fs> &info) {
                             return std::string(LoopVolume::FsName(info.param));
                         });

}  // namespace
