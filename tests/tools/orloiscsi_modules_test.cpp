// orloiscsi modules and service version against the simulated kernel target.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <string>
#include <vector>

#include "support/configfs_sim_fixture.h"

namespace {

class OrloiscsiModules : public orlotest::ConfigfsSimTest {
  protected:
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        return orlotest::RunProgram(argv, out, err);
    }
    bool In(const std::string &module) {
        std::vector<std::string> m = Modules();
        return std::find(m.begin(), m.end(), module) != m.end();
    }
};

TEST_F(OrloiscsiModules, SetsGoInAndOutAndTheVersionIsShown) {
    std::string out, err;
    EXPECT_EQ(0, Cli({"service", "version"}, &out, &err)) << err;
    EXPECT_EQ("0 none\n", out) << "no defaults file: no iSCSI target";

    WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
    EXPECT_EQ(0, Cli({"--json", "service", "version"}, &out));
    EXPECT_EQ("{\"version\":4,\"name\":\"lio4x\"}\n", out);

    ASSERT_EQ(0, Cli({"modules", "load", "iscsi"}, &out, &err)) << err;
    EXPECT_TRUE(In("target_core_mod"));
    EXPECT_TRUE(In("iscsi_target_mod"));
    EXPECT_TRUE(Exists("/config/target/core/epio_0"));
    // Loading again keeps what is in.
    EXPECT_EQ(0, Cli({"modules", "load", "iscsi"}, &out, &err)) << err;

    ASSERT_EQ(0, Cli({"modules", "unload", "iscsi"}, &out, &err)) << err;
    EXPECT_FALSE(In("iscsi_target_mod"));
    EXPECT_TRUE(In("target_core_mod")) << "the iSCSI set leaves the target core in";
    ASSERT_EQ(0, Cli({"modules", "unload", "tcm"}, &out, &err)) << err;
    EXPECT_TRUE(Modules().empty());

    EXPECT_EQ(2, Cli({"modules", "load", "fc"}, &out, &err));
}

TEST_F(OrloiscsiModules, ServiceStopAndTotalStopEmptyTheKernel) {
    std::string out, err;
    WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
    ASSERT_EQ(0, Cli({"modules", "load", "iscsi"}, &out, &err)) << err;
    // A node no file knows, with a portal group: the stop walks the kernel's tree.
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0755));
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi/iqn.2000-01.com.example:stray").c_str(), 0755));
    ASSERT_EQ(0, mkdir(Cfg("/target/iscsi/iqn.2000-01.com.example:stray/tpgt_1").c_str(), 0755));
    EXPECT_EQ(0, Cli({"service", "in-use"}, &out, &err)) << err;
    EXPECT_EQ("not in use\n", out);
    ASSERT_EQ(0, Cli({"service", "stop"}, &out, &err)) << err;
    EXPECT_FALSE(Exists("/config/target/iscsi/iqn.2000-01.com.example:stray"));
    EXPECT_TRUE(In("iscsi_target_mod")) << "stop keeps the modules";
    ASSERT_EQ(0, Cli({"service", "total-stop"}, &out, &err)) << err;
    EXPECT_TRUE(Modules().empty());
}

}  // namespace
