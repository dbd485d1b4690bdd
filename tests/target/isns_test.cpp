// The iSNS client while the protocol is not there: off by default, and honest when on.
#include <gtest/gtest.h>

#include <cstring>

#include "orloiscsi_target.h"
#include "support/sandbox.h"

namespace {

using IsnsTest = orlotest::SandboxTest;

TEST_F(IsnsTest, OffByDefaultDoesNothingAndOnSaysTheClientIsMissing) {
    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    t.tid = 1;

    EXPECT_FALSE(ORLOiSCSIiSNSIsEnabled()) << "no isns.conf: iSNS is off";
    EXPECT_EQ(0u, ORLOiSCSIiSNSConnect());
    EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSRegister(&t));
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSDeregister(&t));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    WriteFile("/usr/orlo/etc/isns.conf", "isns_enable=no\nisns_server=192.0.2.1\n");
    EXPECT_FALSE(ORLOiSCSIiSNSIsEnabled());
    EXPECT_EQ(0u, ORLOiSCSIiSNSConnect());

    WriteFile("/usr/orlo/etc/isns.conf", "isns_enable=\"YES\"\nisns_server=192.0.2.1\n");
    EXPECT_TRUE(ORLOiSCSIiSNSIsEnabled());
    EXPECT_EQ(18990213u, ORLOiSCSIiSNSConnect());
    EXPECT_FALSE(ORLOiSCSIiSNSIsConnected());
    EXPECT_TRUE(log_.Contains("iSNS is enabled in /usr/orlo/etc/isns.conf, but the iSNS client is not available, "
                              "err=Not implemented yet"))
        << log_.Dump();
    // Registration is best effort: without a connection there is nobody to tell.
    EXPECT_EQ(0u, ORLOiSCSITargetiSNSRegister(&t));
    EXPECT_EQ(18990003u, ORLOiSCSITargetiSNSRegister(nullptr));
    EXPECT_EQ(0u, ORLOiSCSIiSNSDisconnect());
}

}  // namespace
