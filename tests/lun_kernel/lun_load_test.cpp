// Loading LUNs into the simulated kernel target: the exact control string and attribute
// writes of every kind in order, the pool switched on first for advanced LUNs, a loaded
// LUN left alone, refusals before anything is made, and a failure at any step leaving
// no backstore behind.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "lun_kernel/lun_kernel_fixture.h"
#include "support/loop_volume.h"

namespace lun_kernel_test {
namespace {

class LunLoadTest : public LunKernelTest {
  protected:
    // The writes a load makes after the mkdir, in order, each succeeding.
    static std::vector<std::string> LoadLines(const std::string &bs, const std::string &control, const ORLOiSCSILun &lun,
                                              int virtualDisk) {
        const std::string v = std::to_string(virtualDisk);
        return {
            "mkdir " + bs + " 0",
            "write " + bs + "/control " + control + " 0",
            "write " + bs + "/wwn/vpd_unit_serial " + lun.vpdUnitSerial + " 0",
            "write " + bs + "/attrib/uuid " + lun.uuid + " 0",
            "write " + bs + "/attrib/lun_name " + lun.name + " 0",
            "write " + bs + "/attrib/is_skip_resource_monitor " + v + " 0",
            "write " + bs + "/attrib/emulate_sync_cache " + v + " 0",
            "write " + bs + "/alua/default_tg_pt_gp/alua_access_type 1 0",
            "write " + bs + "/enable 1 0",
        };
    }
};

TEST_F(LunLoadTest, EveryKindGetsItsControlStringAndAttributesInOrder) {
    struct Case {
        int lid;
        uint32_t type;
        const char *host;
        const char *control;  // with %1$s the data path and %2$s the uuid
        int virtualDisk;
    };
    const Case cases[] = {
        {1, ORLO_ISCSI_LUN_TYPE_FILE, "fileio_0",
         "fd_dev_name=%1$s,fd_dev_size=1073741824,thin_provision=0,block_size=512,enable_sink=%2$s,fd_dio=0", 0},
        {2, ORLO_ISCSI_LUN_TYPE_THIN, "fileio_0",
         "fd_dev_name=%1$s,fd_dev_size=2147483648,thin_provision=1,block_size=4096,enable_sink=%2$s,fd_dio=0", 0},
        {3, ORLO_ISCSI_LUN_TYPE_ADV, "epio_0", "ep_map_table=1,ep_dev_name=%1$s", 0},
        {4, ORLO_ISCSI_LUN_TYPE_VDISK_ADV, "epio_0", "ep_map_table=1,ep_dev_name=%1$s", 1},
        {5, ORLO_ISCSI_LUN_TYPE_BLUN, "fileio_0",
         "fd_dev_name=%1$s,fd_dev_size=5368709120,thin_provision=1,block_size=512,enable_sink=%2$s,fd_dio=0", 0},
        {6, ORLO_ISCSI_LUN_TYPE_VDISK_BLUN, "fileio_0",
         "fd_dev_name=%1$s,fd_dev_size=6442450944,thin_provision=1,block_size=512,enable_sink=%2$s,fd_dio=1", 1},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(ORLOiSCSILunTypeName(c.type));
        ORLOiSCSILun lun = MakeLun(c.lid, c.type);
        if (c.lid == 2) lun.blockSize = 4096;
        Store(lun);
        char control[640];
        snprintf(control, sizeof(control), c.control, DataPath(lun).c_str(), lun.uuid);
        const std::string bs = std::string("/target/core/") + c.host + "/LUN_" + lun.uuid;
        EXPECT_EQ(bs, Backstore(lun));
        std::vector<std::string> want = LoadLines(bs, control, lun, c.virtualDisk);
        // The first advanced LUN switches its volume's pool on before its backstore.
        if (c.type == ORLO_ISCSI_LUN_TYPE_ADV) want.insert(want.begin(), "mkdir /pool/EP_1 0");

        int loaded = -1;
        ASSERT_EQ(0u, ORLOiSCSILunIsLoaded(&lun, &loaded));
        EXPECT_EQ(0, loaded);
        ClearTrace();
        ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump() << TraceDump();
        EXPECT_EQ(want, ChangeLines());
        EXPECT_EQ("1\n", ReadFile("/config" + bs + "/enable"));
        ASSERT_EQ(0u, ORLOiSCSILunIsLoaded(&lun, &loaded));
        EXPECT_EQ(1, loaded);

        // Loaded already: nothing is written (the existing directory answers the mkdir).
        ClearTrace();
        EXPECT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump();
        for (const std::string &l : ChangeLines()) EXPECT_EQ("mkdir " + bs + " EEXIST", l);
    }
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(LunLoadTest, ControlStringsFollowStateFlagsAndRefuseWhatDoesNotFit) {
    ORLOiSCSILun lun = MakeLun(7, ORLO_ISCSI_LUN_TYPE_FILE);
    const std::string uuid = lun.uuid;
    char buf[640];
    lun.stateFlags = ORLO_ISCSI_LUN_STATE_TMP;
    ASSERT_EQ(0u, ORLOiSCSIConfigfsPrepareControlInitString(&lun, buf, sizeof(buf)));
    EXPECT_EQ("fd_dev_name=/volume1/@iSCSI/tmp/" + uuid + "/" + uuid +
                  "_00000,fd_dev_size=7516192768,thin_provision=0,block_size=512,enable_sink=" + uuid + ",fd_dio=0",
              std::string(buf));
    lun.type = ORLO_ISCSI_LUN_TYPE_ADV;
    lun.stateFlags = ORLO_ISCSI_LUN_STATE_EP_UNMAP | ORLO_ISCSI_LUN_STATE_TMP;
    ASSERT_EQ(0u, ORLOiSCSIConfigfsPrepareControlInitString(&lun, buf, sizeof(buf)));
    EXPECT_EQ("ep_map_table=1,ep_dev_name=/volume1/@iSCSI/EP_unmap/" + uuid, std::string(buf));

    // Too small a buffer: refused, never cut.
    log_.Clear();
    EXPECT_EQ(18990050u, ORLOiSCSIConfigfsPrepareControlInitString(&lun, buf, 20));
    EXPECT_STREQ("", buf);
    EXPECT_TRUE(log_.Contains("iscsi_configfs_ep_control_init_string.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("snprintf() failed with buffer size 20")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to get TCM epio control init string. lid: 7, name: LUN-7")) << log_.Dump();

    // A map file must lie on a volume; a data path over 320 characters is refused.
    log_.Clear();
    lun.stateFlags = 0;
    snprintf(lun.rootPath, sizeof(lun.rootPath), "/srv");
    EXPECT_EQ(18990311u, ORLOiSCSIConfigfsPrepareControlInitString(&lun, buf, sizeof(buf)));
    EXPECT_TRUE(log_.Contains("ORLOVolIDParse(\"/srv/@iSCSI/LUN/ADV/" + uuid + "/" + uuid + "_00000\") failed"))
        << log_.Dump();
    log_.Clear();
    lun.type = ORLO_ISCSI_LUN_TYPE_THIN;
    snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1/%0300d", 0);
    EXPECT_EQ(18990050u, ORLOiSCSIConfigfsPrepareControlInitString(&lun, buf, sizeof(buf)));
    EXPECT_TRUE(log_.Contains("snprintf() failed with buffer size 320")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to get TCM fileio control init string. lid: 7, name: LUN-7")) << log_.Dump();

    // A type with no backstore kind.
    log_.Clear();
    lun.type = 5;
    EXPECT_EQ(18990500u, ORLOiSCSIConfigfsPrepareControlInitString(&lun, buf, sizeof(buf)));
    EXPECT_TRUE(log_.Contains("Failed to add lun, Unknow lun type, lid:7 name:LUN-7")) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSIConfigfsPrepareControlInitString(nullptr, buf, sizeof(buf)));
}

TEST_F(LunLoadTest, BackstoreDirectoryFollowsKindStateAndGeneration) {
    ORLOiSCSILun lun = MakeLun(8, ORLO_ISCSI_LUN_TYPE_FILE);
    const std::string uuid = lun.uuid;
    auto dir = [&](uint32_t type, uint32_t state) {
        lun.type = type;
        lun.stateFlags = state;
        char buf[320];
        uint32_t ret = ORLOiSCSILunConfigfsDirPath(&lun, buf, sizeof(buf));
        return ret == 0 ? std::string(buf) : "error " + std::to_string(ret);
    };
    EXPECT_EQ("/config/target/core/fileio_0/LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_FILE, 0));
    EXPECT_EQ("/config/target/core/fileio_0/UNSYNC_LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_THIN, 0x4));
    EXPECT_EQ("/config/target/core/epio_0/LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_SINK, 0));
    EXPECT_EQ("/config/target/core/epio_1/UNMAP_LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_ADV, 0x1 | 0x4));
    EXPECT_EQ("/config/target/core/epio_1/UNMAP_LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_FILE, 0x1));
    EXPECT_EQ("/config/target/core/iblock_0/LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_BLOCK, 0));
    log_.Clear();
    EXPECT_EQ("error 18990500", dir(5, 0));
    EXPECT_TRUE(log_.Contains("iscsi_lun_configfs_dir_path.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Unknown lun type: 5 (UNKNOWN)")) << log_.Dump();
    char small[40];
    lun.type = ORLO_ISCSI_LUN_TYPE_FILE;
    EXPECT_EQ(18990050u, ORLOiSCSILunConfigfsDirPath(&lun, small, sizeof(small)));
    EXPECT_EQ(18990004u, ORLOiSCSILunConfigfsDirPath(nullptr, small, sizeof(small)));
    snprintf(lun.uuid, sizeof(lun.uuid), "../../x");
    EXPECT_EQ("error 18990004", dir(ORLO_ISCSI_LUN_TYPE_FILE, 0)) << "a uuid cannot leave the host directory";

    // The older generation keeps extent-pool LUNs and the trash in the file hosts.
    WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio\"\n");
    orlo::LioReset();
    snprintf(lun.uuid, sizeof(lun.uuid), "%s", uuid.c_str());
    EXPECT_EQ("/config/target/core/fileio_0/LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_ADV, 0));
    EXPECT_EQ("/config/target/core/fileio_1/UNMAP_LUN_" + uuid, dir(ORLO_ISCSI_LUN_TYPE_ADV, 0x1));
}

TEST_F(LunLoadTest, RefusalsComeBeforeAnythingIsMade) {
    ORLOiSCSILun lun = MakeLun(3, ORLO_ISCSI_LUN_TYPE_FILE);
    Store(lun);

    // A root path on no volume.
    ORLOiSCSILun off = lun;
    snprintf(off.rootPath, sizeof(off.rootPath), "/srv");
    ClearTrace();
    EXPECT_EQ(18990311u, ORLOiSCSILunLoad(&off));
    EXPECT_TRUE(log_.Contains("iscsi_lun_load.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunLoad ORLOVolIDParse(\"/srv\") failed")) << log_.Dump();

    // A storage object the administrator disabled.
    WriteFile("/usr/orlo/etc/space_disabled.conf", "LUN-3\n");
    log_.Clear();
    EXPECT_EQ(18990000u, ORLOiSCSILunLoad(&lun));
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunLoad LUN-3 can not enable")) << log_.Dump();
    unlink(Real("/usr/orlo/etc/space_disabled.conf").c_str());

    // An advanced LUN whose volume has no pool.
    ORLOiSCSILun adv = MakeLun(4, ORLO_ISCSI_LUN_TYPE_ADV);
    log_.Clear();
    EXPECT_EQ(18990418u, ORLOiSCSILunLoad(&adv));
    EXPECT_TRUE(log_.Contains("ORLOiSCSIEpEnable(1) failed, err=Failed to enable extent pool")) << log_.Dump();

    // A type with no backstore kind.
    ORLOiSCSILun odd = lun;
    odd.type = 5;
    log_.Clear();
    EXPECT_EQ(18990050u, ORLOiSCSILunLoad(&odd));
    EXPECT_TRUE(log_.Contains("ORLOiSCSILunConfigfsDirPath(")) << log_.Dump();
    EXPECT_TRUE(log_.Contains(") failed, err=Bad LUN type")) << log_.Dump();

    EXPECT_EQ(18990003u, ORLOiSCSILunLoad(nullptr));
    EXPECT_TRUE(ChangeLines().empty()) << TraceDump();
    EXPECT_TRUE(Backstores("fileio_0").empty());
}

TEST_F(LunLoadTest, AFailureAtAnyStepLeavesNoBackstore) {
    ORLOiSCSILun lun = MakeLun(1, ORLO_ISCSI_LUN_TYPE_THIN);
    Store(lun);
    const std::string bs = Backstore(lun);
    const std::string cfg = "/config" + bs;
    struct Step {
        const char *op;
        const char *leaf;
        uint32_t code;
        std::string logged;
    };
    const Step steps[] = {
        {"write", "control", 18990040u, "ORLOiSCSILunConfigfsControl("},
        {"open", "control", 18990038u, "ORLOiSCSILunConfigfsControl("},
        {"write", "wwn/vpd_unit_serial", 18990040u,
         "ORLOiSCSIConfigfsWrite(\"" + cfg + "/wwn/vpd_unit_serial\", \"serial-1\") failed, err=Failed to write file"},
        {"write", "attrib/uuid", 18990040u,
         "ORLOiSCSIConfigfsWrite(\"" + cfg + "/attrib/uuid\", \"" + lun.uuid + "\") failed, err=Failed to write file"},
        {"write", "attrib/lun_name", 18990040u,
         "ORLOiSCSIConfigfsWrite(\"" + cfg + "/attrib/lun_name\", \"LUN-1\") failed, err=Failed to write file"},
        {"write", "attrib/is_skip_resource_monitor", 18990040u,
         "ORLOiSCSIConfigfsPutInteger(\"" + cfg + "/attrib/is_skip_resource_monitor\", 0) failed, err=Failed to write file"},
        {"open", "attrib/emulate_sync_cache", 18990040u,
         "ORLOiSCSIConfigfsPutInteger(\"" + cfg + "/attrib/emulate_sync_cache\", 0) failed, err=Failed to open file"},
        {"write", "alua/default_tg_pt_gp/alua_access_type", 18990040u,
         "ORLOiSCSIConfigfsPutInteger(\"" + cfg +
             "/alua/default_tg_pt_gp/alua_access_type\", 1) failed, err=Failed to write file"},
        {"write", "enable", 18990040u, ", true) failed, err=Failed to write file"},
    };
    for (const Step &s : steps) {
        SCOPED_TRACE(std::string(s.op) + " " + s.leaf);
        ASSERT_EQ(0, SetFault(s.op, bs + "/" + s.leaf, "EIO"));
        ClearTrace();
        log_.Clear();
        EXPECT_EQ(s.code, ORLOiSCSILunLoad(&lun));
        EXPECT_TRUE(log_.Contains(s.logged)) << log_.Dump();
        EXPECT_TRUE(log_.Contains("iscsi_lun_load.cpp:")) << log_.Dump();
        EXPECT_FALSE(Exists(cfg));
        std::vector<orlotest::SimOp> ops = Changes();
        ASSERT_GE(ops.size(), 2u) << TraceDump();
        EXPECT_EQ("mkdir " + bs + " 0", Line(ops.front()));
        EXPECT_EQ("rmdir " + bs + " 0", Line(ops.back()));
        // Nothing after the failed step but the removal.
        if (std::string(s.op) == "write") {
            EXPECT_EQ("EIO", ops[ops.size() - 2].result) << TraceDump();
            EXPECT_EQ(bs + "/" + s.leaf, ops[ops.size() - 2].path);
        }
    }

    // The directory cannot be made.
    ASSERT_EQ(0, SetFault("mkdir", bs, "ENOSPC"));
    log_.Clear();
    EXPECT_EQ(18990028u, ORLOiSCSILunLoad(&lun));
    EXPECT_TRUE(log_.Contains("mkdir(\"" + cfg + "\", S_IRWXU) failed, err=No space left on device")) << log_.Dump();

    // The data file is missing: the kernel refuses the switch.
    unlink(Real(DataPath(lun)).c_str());
    ClearTrace();
    EXPECT_EQ(18990040u, ORLOiSCSILunLoad(&lun));
    EXPECT_FALSE(Exists(cfg));
    EXPECT_EQ("write " + bs + "/enable 1 ENOENT", Line(Changes()[Changes().size() - 2]));

    // A failed removal is logged and leaves the result alone.
    ASSERT_EQ(0, SetFault("rmdir", bs, "EIO"));
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSILunLoad(&lun));
    EXPECT_TRUE(log_.Contains("rmdir(\"" + cfg + "\") failed, err=Input/output error")) << log_.Dump();
    EXPECT_TRUE(Exists(cfg));
    EXPECT_EQ(0, rmdir(Cfg(bs).c_str())) << strerror(errno);
}

TEST_F(LunLoadTest, BlockLunLoadsItsDeviceAndRefusesAnythingElse) {
    // A root path that is no block device: the backstore is made and taken down again.
    ORLOiSCSILun lun = MakeLun(9, ORLO_ISCSI_LUN_TYPE_BLOCK, "/volume1");
    const std::string bs = Backstore(lun);
    for (const char *root : {"/volume1", "/dev/null"}) {
        snprintf(lun.rootPath, sizeof(lun.rootPath), "%s", root);
        ClearTrace();
        log_.Clear();
        EXPECT_EQ(18990050u, ORLOiSCSILunLoad(&lun)) << root;
        EXPECT_TRUE(log_.Contains("iscsi_configfs_block_control_init_string.cpp:")) << log_.Dump();
        EXPECT_TRUE(log_.Contains("lid:9 name:LUN-9 szRootPath:" + std::string(root) +
                                  " IBLOCK: Please reference a valid /dev/ block_device"))
            << log_.Dump();
        EXPECT_TRUE(log_.Contains("Failed to get TCM iBlock control init string. lid: 9, name: LUN-9")) << log_.Dump();
        EXPECT_EQ((std::vector<std::string>{"mkdir " + bs + " 0", "rmdir " + bs + " 0"}), ChangeLines());
    }

    ORLO_SKIP_UNLESS_LOOP_VOLUME(orlotest::LoopVolume::Fs::kExt4);
    orlotest::LoopVolume vol;
    std::string err;
    ASSERT_TRUE(vol.Create(orlotest::LoopVolume::Fs::kExt4, 64ull << 20, Real("/volume2"), &err)) << err;
    const std::string dev = vol.device();
    snprintf(lun.rootPath, sizeof(lun.rootPath), "%s", dev.c_str());
    ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSILunLoad(&lun)) << log_.Dump() << TraceDump();
    std::vector<std::string> want = LoadLines(bs, "udev_path=" + dev, lun, 0);
    want.insert(want.begin() + 1, "write " + bs + "/udev_path " + dev + " 0");
    EXPECT_EQ(want, ChangeLines());
    EXPECT_EQ(dev + "\n", ReadFile("/config" + bs + "/udev_path"));
    ASSERT_EQ(0u, ORLOiSCSILunUnload(&lun));
    EXPECT_FALSE(Exists("/config" + bs));
}

}  // namespace
}  // namespace lun_kernel_test
