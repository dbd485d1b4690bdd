// orloiscsi driven as an administrator would: decoding codes and editing section files
// of a sandbox root.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>

#include "support/sandbox.h"

namespace {

using orlotest::RunProgram;

class OrloiscsiCli : public orlotest::SandboxTest {
  protected:
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        return RunProgram(argv, out, err);
    }
};

TEST_F(OrloiscsiCli, ErrstrDecodesEveryKindOfCode) {
    std::string out, err;
    EXPECT_EQ(0, Cli({"errstr", "18990028", "-2", "18990612", "18991207"}, &out, &err)) << err;
    EXPECT_EQ(
        "18990028\tFailed to cerate directory\n"
        "-2\tNo such file or directory\n"
        "18990612\tUnknown error 18990612\n"
        "18991207\tBad lunbkp estimate size\n",
        out);
    EXPECT_EQ(0, Cli({"--json", "errstr", "18990004"}, &out));
    EXPECT_EQ("[{\"code\":18990004,\"signed\":18990004,\"message\":\"Bad parameter\"}]\n", out);
    EXPECT_EQ(2, Cli({"errstr", "12abc"}, &out, &err));
    EXPECT_NE(std::string::npos, err.find("not a result code"));
    EXPECT_EQ(2, Cli({"errstr"}, &out, &err));
}

TEST_F(OrloiscsiCli, HelpOnEveryLevel) {
    std::string out;
    EXPECT_EQ(0, Cli({"--help"}, &out));
    EXPECT_NE(std::string::npos, out.find("conf"));
    EXPECT_EQ(0, Cli({"conf", "--help"}, &out));
    EXPECT_NE(std::string::npos, out.find("sections FILE"));
    EXPECT_EQ(0, Cli({"conf", "put", "--help"}, &out));
    EXPECT_NE(std::string::npos, out.find("KEY=VALUE"));
    EXPECT_EQ(2, Cli({"nosuchobject"}));
    EXPECT_EQ(2, Cli({"conf", "nosuchaction"}));
}

TEST_F(OrloiscsiCli, ConfPutGetSectionsRemoveRoundTrip) {
    const std::string file = "/usr/orlo/etc/iscsi_target.conf";
    std::string out, err;
    EXPECT_EQ(0, Cli({"conf", "sections", file}, &out, &err)) << err;
    EXPECT_EQ("", out) << "a missing file has no sections";

    EXPECT_EQ(0, Cli({"conf", "put", file, "iSCSI_T1", "name=alpha", "iqn=iqn.2000-01.com.example:alpha"}, &out, &err))
        << err;
    EXPECT_EQ(0, Cli({"conf", "put", file, "iSCSI_T2", "name=beta"}, &out, &err)) << err;
    // Setting one key keeps the others.
    EXPECT_EQ(0, Cli({"conf", "put", file, "iSCSI_T1", "name=alpha2"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"conf", "get", file, "iSCSI_T1"}, &out, &err)) << err;
    EXPECT_NE(std::string::npos, out.find("name=alpha2\n")) << out;
    EXPECT_NE(std::string::npos, out.find("iqn=iqn.2000-01.com.example:alpha\n")) << out;
    EXPECT_EQ(0, Cli({"conf", "sections", file}, &out));
    EXPECT_EQ("iSCSI_T1\niSCSI_T2\n", out);
    EXPECT_NE(std::string::npos, ReadFile(file).find("[iSCSI_T2]\n\tname=beta\n")) << ReadFile(file);
    // The file's lock file was used.
    EXPECT_TRUE(Exists("/tmp/iscsi/iscsi_target.conf.lock"));

    EXPECT_EQ(0, Cli({"conf", "put", "--replace", file, "iSCSI_T1", "name=gamma"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"--json", "conf", "get", file, "iSCSI_T1"}, &out));
    EXPECT_EQ("{\"name\":\"gamma\"}\n", out);

    EXPECT_EQ(0, Cli({"conf", "remove", file, "iSCSI_T1"}, &out, &err)) << err;
    EXPECT_EQ(0, Cli({"--json", "conf", "sections", file}, &out));
    EXPECT_EQ("[\"iSCSI_T2\"]\n", out);
    EXPECT_EQ(1, Cli({"conf", "get", file, "iSCSI_T1"}, &out, &err));
    EXPECT_NE(std::string::npos, err.find("error: 18990303 Failed to get section")) << err;
}

TEST_F(OrloiscsiCli, ConfRefusesValuesThatWouldBreakTheFile) {
    const std::string file = "/usr/orlo/etc/iscsi_acl.conf";
    std::string out, err;
    ASSERT_EQ(0, Cli({"conf", "put", file, "iSCSI_ACL_T1_x", "k=v"}, &out, &err)) << err;
    std::string before = ReadFile(file);
    EXPECT_EQ(1, Cli({"conf", "put", file, "bad]name", "k=v"}, &out, &err));
    EXPECT_NE(std::string::npos, err.find("error: 18990004 Bad parameter")) << err;
    EXPECT_EQ(1, Cli({"conf", "put", file, "iSCSI_ACL_T1_x", "k=line\nbreak"}, &out, &err));
    EXPECT_EQ(1, Cli({"conf", "put", file, "new\nsection", "k=v"}, &out, &err));
    EXPECT_EQ(before, ReadFile(file)) << "a refused change leaves the file as it was";
    EXPECT_EQ(2, Cli({"conf", "put", file, "s", "novalue"}, &out, &err));
}

}  // namespace
