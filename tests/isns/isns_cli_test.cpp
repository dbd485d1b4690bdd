// The iSNS client as an administrator drives it with orloiscsi: pointing at a server,
// turning iSNS on, the status, the iSNS state in target status, turning it off.
#include <string>
#include <vector>

#include "isns/isns_fixture.h"

namespace isns_test {
namespace {

class IsnsCliTest : public IsnsSimTest {
  protected:
    // orloiscsi with the sandbox root; exit status, and standard output and error.
    int Cli(const std::vector<std::string> &args, std::string *out, std::string *err = nullptr) {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string e;
        int rc = orlotest::RunProgram(argv, out, err != nullptr ? err : &e);
        return rc;
    }
    IsnsServer server_;
};

TEST_F(IsnsCliTest, PointTurnOnSeeTheTargetsAndTurnOff) {
    ASSERT_TRUE(server_.Start());
    std::string out, err;
    ASSERT_EQ(0, Cli({"service", "start"}, &out)) << out;
    ASSERT_EQ(0, Cli({"target", "create", "demo", "--iqn", IqnOf(1), "--portal", "127.0.0.1:3260"}, &out)) << out;

    // Off by default: the status says so and asks no server.
    ASSERT_EQ(0, Cli({"isns", "status"}, &out)) << out;
    EXPECT_EQ("iSNS:     off\nserver:   (not set)\nstate:    not asked (iSNS is off)\n", out);
    ASSERT_EQ(0, Cli({"target", "status", "demo"}, &out)) << out;
    EXPECT_NE(std::string::npos, out.find("  iSNS:       off\n")) << out;

    // A malformed server is a failure with its reason; enabling without a server too.
    EXPECT_EQ(1, Cli({"isns", "server", "300.1.2.3"}, &out, &err));
    EXPECT_EQ(0u, err.find("error: 18990203 Bad IP\n")) << err;
    EXPECT_EQ(1, Cli({"isns", "enable"}, &out, &err));
    EXPECT_EQ(0u, err.find("error: 18990203 Bad IP\n")) << err;
    EXPECT_NE(std::string::npos, err.find("isns_server is not set in /usr/orlo/etc/isns.conf")) << err;

    WriteFile(kIsnsConf, std::string("isns_entity=") + kEntity + "\n");
    ASSERT_EQ(0, Cli({"isns", "server", server_.address()}, &out)) << out;
    EXPECT_EQ("iSNS server: " + server_.address() + "\n", out);
    ASSERT_EQ(0, Cli({"isns", "enable"}, &out, &err)) << err;
    EXPECT_EQ("iSNS on: every running target registered\n", out);
    EXPECT_EQ((std::vector<std::string>{IqnOf(1)}), server_.Nodes());
    ASSERT_EQ(0, Cli({"--json", "isns", "status"}, &out)) << out;
    EXPECT_NE(std::string::npos, out.find("\"enabled\":true")) << out;
    EXPECT_NE(std::string::npos, out.find("\"registered\":1")) << out;
    EXPECT_NE(std::string::npos, out.find("\"error\":0")) << out;
    ASSERT_EQ(0, Cli({"target", "status", "demo"}, &out)) << out;
    EXPECT_NE(std::string::npos, out.find("  iSNS:       registered\n")) << out;

    ASSERT_EQ(0, Cli({"target", "disable", "demo"}, &out)) << out;
    ASSERT_EQ(0, Cli({"target", "status", "demo"}, &out)) << out;
    EXPECT_NE(std::string::npos, out.find("  iSNS:       not registered\n")) << out;
    ASSERT_EQ(0, Cli({"target", "enable", "demo"}, &out)) << out;
    ASSERT_EQ(0, Cli({"isns", "refresh"}, &out)) << out;
    EXPECT_EQ("registrations renewed\n", out);

    // The server gone: target status still works and says why it cannot tell.
    server_.Stop();
    ASSERT_EQ(0, Cli({"target", "status", "demo"}, &out)) << out;
    EXPECT_NE(std::string::npos, out.find("  iSNS:       unknown (18990211 Failed to send the request)\n")) << out;
    ASSERT_EQ(0, Cli({"isns", "status"}, &out)) << out;
    EXPECT_NE(std::string::npos, out.find("state:    unusable: 18990211 Failed to send the request\n")) << out;
    ASSERT_TRUE(server_.Start());

    ASSERT_EQ(0, Cli({"isns", "refresh"}, &out)) << out;
    EXPECT_EQ((std::vector<std::string>{IqnOf(1)}), server_.Nodes()) << "back after the refresh";
    ASSERT_EQ(0, Cli({"isns", "disable"}, &out)) << out;
    EXPECT_EQ("iSNS off\n", out);
    EXPECT_FALSE(server_.HasEntity());
    EXPECT_NE(std::string::npos, ReadFile(kIsnsConf).find("isns_enable=no\n"));
    ASSERT_EQ(0, Cli({"service", "stop"}, &out)) << out;
}

}  // namespace
}  // namespace isns_test
