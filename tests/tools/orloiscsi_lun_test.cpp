// An administrator's session with orloiscsi: LUNs of several types created on a real
// volume, seen in the files, loaded into the (simulated) kernel target, unloaded and
// deleted, with nothing left behind.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "support/configfs_sim_fixture.h"
#include "support/loop_volume.h"

namespace {

using orlotest::LoopVolume;
using orlotest::RunProgram;

class OrloiscsiLun : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        std::string why = LoopVolume::Unavailable(LoopVolume::Fs::kBtrfs);
        if (!why.empty()) GTEST_SKIP() << why;
        std::string err;
        ASSERT_TRUE(volume_.Create(LoopVolume::Fs::kBtrfs, 512ull << 20, Real("/volume1"), &err)) << err;
        WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
        ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    }
    void TearDown() override {
        volume_.Destroy();
        ConfigfsSimTest::TearDown();
    }
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string o, e;
        int rc = RunProgram(argv, &o, &e);
        if (out != nullptr) *out = o;
        if (err != nullptr) *err = e;
        return rc;
    }
    // The uuid of a LUN, from `lun show --json`.
    std::string UuidOf(const std::string &name) {
        std::string out;
        EXPECT_EQ(0, Cli({"--json", "lun", "show", name}, &out));
        size_t at = out.find("\"uuid\":\"");
        return at == std::string::npos ? std::string() : out.substr(at + 8, 36);
    }
    LoopVolume volume_;
};

TEST_F(OrloiscsiLun, CreateLoadUnloadDeleteLeavesNothingBehind) {
    std::string out, err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "data", "--type", "FILE", "--size", "8M", "--volume", "/volume1",
                      "--progress"},
                     &out, &err))
        << err;
    EXPECT_NE(std::string::npos, out.find("created LUN 1 'data' (FILE, 8.0 MiB) on /volume1")) << out;
    EXPECT_NE(std::string::npos, err.find("100%")) << "a zero-filled LUN shows its progress: " << err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "thin", "--type", "thin", "--size", "1G", "--volume", "/volume1"},
                     &out, &err))
        << err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "adv", "--type", "ADV", "--size", "64M", "--volume", "/volume1"},
                     &out, &err))
        << err;

    EXPECT_EQ(0, Cli({"lun", "list"}, &out));
    EXPECT_NE(std::string::npos, out.find("data")) << out;
    EXPECT_NE(std::string::npos, out.find("THIN")) << out;
    EXPECT_NE(std::string::npos, out.find("ADV")) << out;

    const std::string dataUuid = UuidOf("data"), advUuid = UuidOf("adv");
    ASSERT_EQ(36u, dataUuid.size());
    ASSERT_EQ(36u, advUuid.size());
    struct stat st;
    const std::string dataFile = "/volume1/@iSCSI/LUN/FILE/" + dataUuid + "/" + dataUuid + "_00000";
    ASSERT_EQ(0, stat(Real(dataFile).c_str(), &st));
    EXPECT_EQ(8 << 20, st.st_size);
    EXPECT_NE(std::string::npos, ReadFile("/usr/orlo/etc/iscsi_lun.conf").find("[LUN_" + dataUuid + "]"));
    EXPECT_NE(std::string::npos, ReadFile("/volume1/@iSCSI/LUN/iscsi_lun.conf").find("[LUN_" + advUuid + "]"));

    // Into the kernel and out again.
    ASSERT_EQ(0, Cli({"lun", "load", "data"}, &out, &err)) << err;
    ASSERT_EQ(0, Cli({"lun", "load", "--uuid", advUuid}, &out, &err)) << err;
    EXPECT_EQ("1\n", ReadFile("/config/target/core/fileio_0/LUN_" + dataUuid + "/enable"));
    EXPECT_EQ("1\n", ReadFile("/config/target/core/epio_0/LUN_" + advUuid + "/enable"));
    EXPECT_EQ(0, Cli({"--json", "lun", "show", "data"}, &out));
    EXPECT_NE(std::string::npos, out.find("\"loaded\":true")) << out;
    EXPECT_EQ(0, Cli({"lun", "lock-status", "data"}, &out));
    EXPECT_NE(std::string::npos, out.find("not locked")) << out;
    EXPECT_EQ(0, Cli({"ep", "info", "/volume1"}, &out, &err)) << err;
    EXPECT_NE(std::string::npos, out.find("extent size:")) << out;
    EXPECT_NE(std::string::npos, out.find("state:        on")) << out;
    const std::string mapFile = "/volume1/@iSCSI/LUN/ADV/" + advUuid + "/" + advUuid + "_00000";
    EXPECT_EQ(0, Cli({"ep", "header", mapFile}, &out, &err)) << err;
    EXPECT_NE(std::string::npos, out.find("file type:    4 (map)")) << out;

    ASSERT_EQ(0, Cli({"lun", "unload", "data"}, &out, &err)) << err;
    EXPECT_FALSE(Exists("/config/target/core/fileio_0/LUN_" + dataUuid));

    // Deleting takes a loaded LUN out of the kernel too.
    for (const char *name : {"data", "thin", "adv"}) ASSERT_EQ(0, Cli({"lun", "delete", name}, &out, &err)) << err;
    EXPECT_FALSE(Exists("/config/target/core/epio_0/LUN_" + advUuid));
    EXPECT_EQ(std::string::npos, ReadFile("/usr/orlo/etc/iscsi_lun.conf").find("[LUN_"));
    EXPECT_EQ(std::string::npos, ReadFile("/volume1/@iSCSI/LUN/iscsi_lun.conf").find("[LUN_"));
    EXPECT_FALSE(Exists("/volume1/@iSCSI/LUN/FILE/" + dataUuid));
    EXPECT_FALSE(Exists("/volume1/@iSCSI/LUN/ADV/" + advUuid));
    EXPECT_EQ(0, Cli({"--json", "lun", "list"}, &out));
    EXPECT_EQ("[]\n", out);
}

TEST_F(OrloiscsiLun, BadInputIsRefusedWithItsCodeAndNothingIsMade) {
    std::string out, err;
    EXPECT_EQ(1, Cli({"lun", "create", "--name", "a]b", "--type", "FILE", "--size", "1M", "--volume", "/volume1"},
                     &out, &err));
    EXPECT_NE(std::string::npos, err.find("error: 18990503 Bad LUN name")) << err;
    EXPECT_EQ(1, Cli({"lun", "create", "--name", "x", "--type", "FILE", "--size", "1000", "--volume", "/volume1"},
                     &out, &err));
    EXPECT_NE(std::string::npos, err.find("error: 18990502 Bad LUN size")) << err;
    EXPECT_EQ(1, Cli({"lun", "create", "--name", "x", "--type", "DISK", "--size", "1M", "--volume", "/volume1"},
                     &out, &err));
    EXPECT_NE(std::string::npos, err.find("error: 18990500 Bad LUN type")) << err;
    EXPECT_EQ(1, Cli({"lun", "create", "--name", "x", "--type", "FILE", "--size", "1M", "--volume", "/srv"}, &out,
                     &err));
    EXPECT_FALSE(Exists("/usr/orlo/etc/iscsi_lun.conf") &&
                 ReadFile("/usr/orlo/etc/iscsi_lun.conf").find("[LUN_") != std::string::npos);
    EXPECT_EQ(2, Cli({"lun", "create", "--name", "x"}, &out, &err));
    EXPECT_EQ(1, Cli({"lun", "show", "nosuch"}, &out, &err));
    EXPECT_NE(std::string::npos, err.find("error: 18990531 No such LUN")) << err;
    EXPECT_EQ(2, Cli({"lun", "show", "--lid", "2000"}, &out, &err));
}

}  // namespace
