// What a server that cannot be used does to the service: isns.conf values that cannot
// be used, servers that refuse, drop packets, never answer, answer nonsense or hang up.
// Each leaves the service starting and stopping as without iSNS, bounded by the
// documented time, with one log line for the whole start.
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "isns/isns_fixture.h"

namespace isns_test {
namespace {

using Strings = std::vector<std::string>;

class IsnsFailureTest : public IsnsSimTest {
  protected:
    // Starts the service with one enabled target and returns how long the start took;
    // the target must run whatever iSNS did.
    double StartWithOneTarget() {
        StoreTarget(1, true, "127.0.0.1:3260");
        double start = Now();
        EXPECT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
        double took = Now() - start;
        EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr)) << log_.Dump();
        return took;
    }
    // The messages (after the "iSCSI:file:line:func " head) of the iSNS lines.
    Strings IsnsMessages() const {
        Strings out;
        for (const std::string &l : IsnsLines()) {
            size_t sp = l.find(' ');
            out.push_back(sp == std::string::npos ? l : l.substr(sp + 1));
        }
        return out;
    }
};

TEST_F(IsnsFailureTest, UnusableSettingsAreLoggedOnceAndTheServiceRunsWithoutIsns) {
    const struct {
        std::string lines;
        uint32_t code;
        std::string message;
    } cases[] = {
        {"isns_enable=yes\n", 18990203,
         "isns_server is not set in /usr/orlo/etc/isns.conf, err=Bad IP"},
        {"isns_enable=yes\nisns_server=300.1.2.3\n", 18990203,
         "Bad isns_server in /usr/orlo/etc/isns.conf: \"300.1.2.3\", err=Bad IP"},
        {"isns_enable=yes\nisns_server=[::1\n", 18990203,
         "Bad isns_server in /usr/orlo/etc/isns.conf: \"[::1\", err=Bad IP"},
        {"isns_enable=yes\nisns_server=isns..example\n", 18990203,
         "Bad isns_server in /usr/orlo/etc/isns.conf: \"isns..example\", err=Bad IP"},
        {"isns_enable=yes\nisns_server=127.0.0.1:70000\n", 18990428,
         "Bad isns_server in /usr/orlo/etc/isns.conf: \"127.0.0.1:70000\", err=Bad port"},
        {"isns_enable=yes\nisns_server=isns.example:\n", 18990428,
         "Bad isns_server in /usr/orlo/etc/isns.conf: \"isns.example:\", err=Bad port"},
        {"isns_enable=yes\nisns_server=127.0.0.1\nisns_timeout=0\n", 18990004,
         "Bad isns_timeout in /usr/orlo/etc/isns.conf: \"0\" (seconds, 1 to 60), err=Bad parameter"},
        {"isns_enable=yes\nisns_server=127.0.0.1\nisns_registration_period=5m\n", 18990004,
         "Bad isns_registration_period in /usr/orlo/etc/isns.conf: \"5m\" (seconds, 60 to 2147483647), "
         "err=Bad parameter"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.lines);
        orlo::isns::Reset();
        WriteFile(kIsnsConf, c.lines);
        log_.Clear();
        EXPECT_EQ(c.code, ORLOiSCSIiSNSConnect());
        EXPECT_EQ(Strings{c.message}, IsnsMessages()) << log_.Dump();
        EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
        ORLOiSCSIiSNSStatus st;
        ASSERT_EQ(0u, ORLOiSCSIiSNSStatusGet(&st));
        EXPECT_TRUE(st.enabled);
        EXPECT_EQ(c.code, st.error);
        EXPECT_EQ(1u, IsnsMessages().size()) << "asked again soon: not logged again\n" << log_.Dump();
    }
    // Enabling refuses settings that cannot work and writes nothing.
    WriteFile(kIsnsConf, "isns_enable=no\nisns_server=300.1.2.3\n");
    log_.Clear();
    EXPECT_EQ(18990203u, ORLOiSCSIiSNSEnable());
    EXPECT_EQ("isns_enable=no\nisns_server=300.1.2.3\n", ReadFile(kIsnsConf));
    // So does pointing at a malformed server.
    for (const char *bad : {"300.1.2.3", "[fe80::1", "host:0", "a b", "-lead.example"}) {
        SCOPED_TRACE(bad);
        log_.Clear();
        EXPECT_NE(0u, ORLOiSCSIiSNSServerSet(bad));
        EXPECT_EQ(1u, IsnsMessages().size()) << log_.Dump();
        EXPECT_EQ("isns_enable=no\nisns_server=300.1.2.3\n", ReadFile(kIsnsConf));
    }

    // The service with unusable settings: one line for the whole start, target running.
    orlo::isns::Reset();
    WriteFile(kIsnsConf, "isns_enable=yes\nisns_server=300.1.2.3\n");
    log_.Clear();
    StartWithOneTarget();
    EXPECT_EQ(Strings{"Bad isns_server in /usr/orlo/etc/isns.conf: \"300.1.2.3\", err=Bad IP"}, IsnsMessages())
        << log_.Dump();
}

TEST_F(IsnsFailureTest, ANameThatDoesNotResolveIsOneLine) {
    Configure(true, "isns.invalid");
    EXPECT_EQ(18990051u, ORLOiSCSIiSNSConnect());
    Strings msgs = IsnsMessages();
    ASSERT_EQ(1u, msgs.size()) << log_.Dump();
    EXPECT_EQ(0u, msgs[0].find("getaddrinfo(\"isns.invalid\", \"3205\") failed, err=")) << msgs[0];
}

TEST_F(IsnsFailureTest, ARefusingServerFailsAtOnceAndTheStartAndStopGoOnWithOneLine) {
    int port = FreePort();
    Configure(true, "127.0.0.1:" + std::to_string(port));
    double took = StartWithOneTarget();
    EXPECT_LT(took, 2.0) << "a refused connection is known at once";
    EXPECT_EQ((Strings{"connect(\"127.0.0.1:" + std::to_string(port) + "\") failed, err=Connection refused"}),
              IsnsMessages())
        << log_.Dump();
    EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    // The stop right after has nothing to withdraw from a server just found unreachable.
    EXPECT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    EXPECT_EQ(1u, IsnsMessages().size()) << log_.Dump();
    // An explicit connection attempt always tries again.
    EXPECT_EQ(18990211u, ORLOiSCSIiSNSConnect());
    EXPECT_EQ(2u, IsnsMessages().size()) << log_.Dump();
}

TEST_F(IsnsFailureTest, AServerThatDropsPacketsCostsTheStartOneTimeoutOfOneSecond) {
    BadServer full("full");
    Configure(true, full.address(), "isns_timeout=1\n");
    double took = StartWithOneTarget();
    EXPECT_GE(took, 1.0) << "the connection attempt waited";
    EXPECT_LT(took, 3.0) << "and gave up after isns_timeout";
    EXPECT_EQ((Strings{"connect(\"" + full.address() + "\") failed after 1 s, err=Timeout"}), IsnsMessages())
        << log_.Dump();
    // More target transitions in the same process do not wait again.
    ORLOiSCSITarget t;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByTid(1, 0, &t));
    double start = Now();
    ASSERT_EQ(0u, ORLOiSCSITargetDisable(&t)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSITargetEnable(&t)) << log_.Dump();
    EXPECT_LT(Now() - start, 1.0);
    EXPECT_EQ(1u, IsnsMessages().size()) << log_.Dump();
}

TEST_F(IsnsFailureTest, AServerThatNeverAnswersTimesOutAfterOneSecond) {
    BadServer silent("silent");
    Configure(true, silent.address(), "isns_timeout=1\n");
    double took = StartWithOneTarget();
    EXPECT_GE(took, 1.0);
    EXPECT_LT(took, 3.0);
    // The first request of the start withdraws the stored target that does not run yet.
    EXPECT_EQ((Strings{"isns_simple_call(DevDereg \"" + IqnOf(1) + "\") to " + silent.address() +
                       " failed after 1 s, err=Timeout"}),
              IsnsMessages())
        << log_.Dump();
    EXPECT_GE(silent.accepted(), 1);
}

TEST_F(IsnsFailureTest, AServerThatAnswersNonsenseOrHangsUpLeavesTheCallerRunning) {
    // Each stand-in answers any request with these bytes: text, a reply header for
    // another exchange, a reply whose attribute runs past the end of the message.
    const std::string header = std::string("\x00\x01\x80\x02\x00\x0c\xfc\x00\x00\x01\x00\x00", 12);
    const struct {
        std::string mode, reply;
    } servers[] = {
        {"garbage", "HTTP/1.0 400 Bad Request\r\n\r\n"},
        {"garbage", header + std::string("\x00\x00\x00\x00\x00\x00\x00\x01\x00\x00\x10\x00", 12)},
        {"garbage", std::string(4096, '\xff')},
        {"close", ""},
    };
    for (const auto &s : servers) {
        SCOPED_TRACE(s.mode + " " + std::to_string(s.reply.size()));
        // No stored target: the connection asks one harmless question.
        orlo::isns::Reset();
        BadServer bad(s.mode, s.reply);
        Configure(true, bad.address(), "isns_timeout=1\n");
        log_.Clear();
        double start = Now();
        uint32_t ret = ORLOiSCSIiSNSConnect();
        EXPECT_TRUE(ret == 18990010u || ret == 18990204u || ret == 18990211u) << ret;
        EXPECT_LT(Now() - start, 3.0);
        EXPECT_EQ(1u, IsnsMessages().size()) << log_.Dump();
        EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    }
}

}  // namespace
}  // namespace isns_test
