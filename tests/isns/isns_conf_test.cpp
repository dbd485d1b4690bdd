// isns.conf: iSNS off unless it says so (and then nothing is sent, logged or written),
// the forms of isns_server, the defaults of the other keys, and the writes of the
// enable, disable and server calls.
#include <unistd.h>

#include <climits>
#include <cstring>
#include <string>

#include "isns/isns_fixture.h"

namespace isns_test {
namespace {

class IsnsConfTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        orlo::isns::Reset();
        SandboxTest::SetUp();
    }
    void TearDown() override {
        orlo::isns::Reset();
        SandboxTest::TearDown();
    }
};

TEST_F(IsnsConfTest, OffUnlessTurnedOnAndThenEveryCallIsANoOp) {
    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    t.tid = 1;
    snprintf(t.iqn, sizeof(t.iqn), "iqn.2000-01.com.orlo-nas:off");
    for (const char *conf : {"", "isns_enable=no\nisns_server=300.1.2.3\n", "isns_server=127.0.0.1\n",
                             "isns_enable=true\nisns_server=127.0.0.1\n"}) {
        SCOPED_TRACE(conf);
        if (conf[0] != '\0') WriteFile(kIsnsConf, conf);
        EXPECT_FALSE(ORLOiSCSIiSNSIsEnabled());
        EXPECT_EQ(0u, ORLOiSCSIiSNSConnect());
        EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
        EXPECT_EQ(0u, ORLOiSCSITargetiSNSRegister(&t));
        EXPECT_EQ(0u, ORLOiSCSITargetiSNSDeregister(&t));
        EXPECT_EQ(0u, ORLOiSCSIiSNSRefresh());
        EXPECT_EQ(0u, ORLOiSCSIiSNSDisconnect());
        bool registered = true;
        EXPECT_EQ(0u, ORLOiSCSITargetiSNSIsRegistered(&t, &registered));
        EXPECT_FALSE(registered);
        EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    }
    EXPECT_FALSE(Exists("/usr/orlo/etc/isns.conf.tmp"));
    EXPECT_EQ("isns_enable=true\nisns_server=127.0.0.1\n", ReadFile(kIsnsConf)) << "nothing written";

    // "yes" in any case and quoted turns it on.
    WriteFile(kIsnsConf, "isns_enable=\"YES\"\n");
    EXPECT_TRUE(ORLOiSCSIiSNSIsEnabled());

    // Null arguments.
    EXPECT_EQ(18990003u, ORLOiSCSITargetiSNSRegister(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSITargetiSNSDeregister(nullptr));
    bool registered;
    EXPECT_EQ(18990003u, ORLOiSCSITargetiSNSIsRegistered(nullptr, &registered));
    EXPECT_EQ(18990003u, ORLOiSCSITargetiSNSIsRegistered(&t, nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSIiSNSStatusGet(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSIiSNSServerSet(nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSIiSNSServerSet(""));
}

TEST_F(IsnsConfTest, ServerFormsAndDefaults) {
    const struct {
        const char *text;
        uint32_t code;
        const char *host;
        int port;
    } cases[] = {
        {"isns.example.com", 0, "isns.example.com", 3205},
        {"isns.example.com.", 0, "isns.example.com.", 3205},
        {"isns:3206", 0, "isns", 3206},
        {"192.0.2.7", 0, "192.0.2.7", 3205},
        {"192.0.2.7:65535", 0, "192.0.2.7", 65535},
        {"[2001:db8::7]", 0, "2001:db8::7", 3205},
        {"[2001:db8::7]:3206", 0, "2001:db8::7", 3206},
        {"2001:db8::7", 0, "2001:db8::7", 3205},
        {"", 18990203, "", 3205},
        {"192.0.2.300", 18990203, "", 3205},
        {"1.2.3", 18990203, "", 3205},
        {"isns_server", 18990203, "", 3205},
        {"-isns", 18990203, "", 3205},
        {"isns..example", 18990203, "", 3205},
        {"[2001:db8::7", 18990203, "", 3205},
        {"[isns]:3205", 18990203, "", 3205},
        {"2001:db8::zz", 18990203, "", 3205},
        {"isns:0", 18990428, "", 3205},
        {"isns:65536", 18990428, "", 3205},
        {"isns:32o5", 18990428, "", 3205},
        {"isns:+3205", 18990428, "", 3205},
        {"[2001:db8::7]3205", 18990428, "", 3205},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text);
        std::string host;
        int port = 0;
        EXPECT_EQ(c.code, orlo::isns::ParseServer(c.text, &host, &port));
        if (c.code == 0) {
            EXPECT_EQ(c.host, host);
            EXPECT_EQ(c.port, port);
        }
    }

    // Defaults: the entity is the host name, the period an hour, the time-out 5 s.
    WriteFile(kIsnsConf, "isns_enable=yes\nisns_server=192.0.2.7\n");
    orlo::isns::Settings s;
    ASSERT_EQ(0u, orlo::isns::LoadSettings(&s));
    char host[HOST_NAME_MAX + 1] = "";
    ASSERT_EQ(0, gethostname(host, sizeof(host)));
    EXPECT_EQ(host, s.entity);
    EXPECT_EQ(3600, s.period);
    EXPECT_EQ(5, s.timeout);
    EXPECT_EQ(3205, s.port);
    WriteFile(kIsnsConf, "isns_enable=yes\nisns_server=192.0.2.7:3206\nisns_entity=Box 1\n"
                         "isns_registration_period=60\nisns_timeout=60\n");
    ASSERT_EQ(0u, orlo::isns::LoadSettings(&s));
    EXPECT_EQ("Box 1", s.entity);
    EXPECT_EQ(60, s.period);
    EXPECT_EQ(60, s.timeout);
    EXPECT_EQ(3206, s.port);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(IsnsConfTest, EnableDisableAndServerWriteTheirKeyAndKeepTheRest) {
    // Pointing at a server while iSNS is off only writes the address.
    WriteFile(kIsnsConf, "# iSNS\nisns_entity=box\n");
    ASSERT_EQ(0u, ORLOiSCSIiSNSServerSet("[2001:db8::7]:3206"));
    EXPECT_EQ("# iSNS\nisns_entity=box\nisns_server=[2001:db8::7]:3206\n", ReadFile(kIsnsConf));
    ASSERT_EQ(0u, ORLOiSCSIiSNSServerSet("192.0.2.8"));
    EXPECT_EQ("# iSNS\nisns_entity=box\nisns_server=192.0.2.8\n", ReadFile(kIsnsConf));
    // Disabling a disabled client writes the key and sends nothing.
    ASSERT_EQ(0u, ORLOiSCSIiSNSDisable());
    EXPECT_EQ("# iSNS\nisns_entity=box\nisns_server=192.0.2.8\nisns_enable=no\n", ReadFile(kIsnsConf));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    // Enabling with no server set is refused before anything is written.
    WriteFile(kIsnsConf, "isns_enable=no\n");
    EXPECT_EQ(18990203u, ORLOiSCSIiSNSEnable());
    EXPECT_EQ("isns_enable=no\n", ReadFile(kIsnsConf));
}

}  // namespace
}  // namespace isns_test
