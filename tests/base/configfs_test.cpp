// Configfs primitives on plain files in a sandbox (the simulator tests cover the kernel's
// own rules): value sizes, integer and flag parsing, pipes, links and path builders.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "orloiscsi_configfs.h"
#include "service/lio_version.h"
#include "support/sandbox.h"

namespace {

class ConfigfsTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        orlo::LioReset();
        WriteFile("/config/target/core/fileio_0/lun1/control", "");
    }
    void TearDown() override {
        orlo::LioReset();
        SandboxTest::TearDown();
    }
    const char *kControl = "/config/target/core/fileio_0/lun1/control";
};

TEST_F(ConfigfsTest, WriteTakesUpTo4095BytesInOneWrite) {
    std::string max(4095, 'a');
    EXPECT_EQ(0u, ORLOiSCSIConfigfsWrite(kControl, max.c_str()));
    EXPECT_EQ(max, ReadFile(kControl));

    std::string over(4096, 'b');
    EXPECT_EQ(18990008u, ORLOiSCSIConfigfsWrite(kControl, over.c_str()));
    EXPECT_EQ(max, ReadFile(kControl)) << "a refused value must not reach the file";
    EXPECT_TRUE(log_.Contains("string length(4096) exceeded ConfgiFS buffer size: 4096")) << log_.Dump();

    // Configfs files are never created by a write.
    EXPECT_EQ(18990038u, ORLOiSCSIConfigfsWrite("/config/target/core/fileio_0/lun1/nothere", "1"));
    EXPECT_FALSE(Exists("/config/target/core/fileio_0/lun1/nothere"));
    EXPECT_TRUE(log_.Contains("open(\"/config/target/core/fileio_0/lun1/nothere\", O_WRONLY) failed, err="))
        << "the log names the appliance path, not the sandbox one:\n"
        << log_.Dump();
    EXPECT_FALSE(log_.Contains(root())) << log_.Dump();

    EXPECT_EQ(18990003u, ORLOiSCSIConfigfsWrite(nullptr, "1"));
    EXPECT_EQ(18990003u, ORLOiSCSIConfigfsWrite(kControl, nullptr));
}

TEST_F(ConfigfsTest, PrintfAndPutIntegerFormatTheValue) {
    EXPECT_EQ(0u, ORLOiSCSIConfigfsPrintf(kControl, "fd_dev_name=%s,fd_dev_size=%llu", "/volume1/x", 4096ULL));
    EXPECT_EQ("fd_dev_name=/volume1/x,fd_dev_size=4096", ReadFile(kControl));
    // A plain file keeps old bytes past a shorter write (configfs stores each write whole).
    WriteFile(kControl, "");
    EXPECT_EQ(0u, ORLOiSCSIConfigfsPutInteger(kControl, -17));
    EXPECT_EQ("-17", ReadFile(kControl));

    std::string big(4096, 'x');
    EXPECT_EQ(18990050u, ORLOiSCSIConfigfsPrintf(kControl, "%s", big.c_str()));
    EXPECT_TRUE(log_.Contains("vsnprintf() failed with buf size 4096")) << log_.Dump();
    EXPECT_EQ("-17", ReadFile(kControl));
}

TEST_F(ConfigfsTest, GetIntegerAndBoolParseWhatConfigfsHolds) {
    int v = 99;
    WriteFile(kControl, "42\n");
    EXPECT_EQ(0u, ORLOiSCSIConfigfsGetInteger(kControl, &v));
    EXPECT_EQ(42, v);
    WriteFile(kControl, "-3\n");
    EXPECT_EQ(0u, ORLOiSCSIConfigfsGetInteger(kControl, &v));
    EXPECT_EQ(-3, v);

    // A lone newline or an empty file holds no value; nor does text.
    for (const char *bad : {"\n", "", "x\n", "abc"}) {
        WriteFile(kControl, bad);
        v = 7;
        EXPECT_EQ(18990050u, ORLOiSCSIConfigfsGetInteger(kControl, &v)) << '"' << bad << '"';
        EXPECT_EQ(7, v) << "the output is untouched on failure";
    }
    WriteFile(kControl, "\n");
    log_.Clear();
    ORLOiSCSIConfigfsGetInteger(kControl, &v);
    EXPECT_TRUE(log_.Contains("Failed to read integer.")) << log_.Dump();

    bool b = false;
    WriteFile(kControl, "1\n");
    EXPECT_EQ(0u, ORLOiSCSIConfigfsGetBool(kControl, &b));
    EXPECT_TRUE(b);
    WriteFile(kControl, "0\n");
    EXPECT_EQ(0u, ORLOiSCSIConfigfsGetBool(kControl, &b));
    EXPECT_FALSE(b);
    WriteFile(kControl, "2\n");
    EXPECT_EQ(18990050u, ORLOiSCSIConfigfsGetBool(kControl, &b));
    EXPECT_TRUE(log_.Contains("Expected value to be zero or one: 2")) << log_.Dump();

    EXPECT_EQ(18990038u, ORLOiSCSIConfigfsGetInteger("/config/none", &v));
    EXPECT_EQ(18990003u, ORLOiSCSIConfigfsGetInteger(kControl, nullptr));
}

TEST_F(ConfigfsTest, GetStringKeepsTheNewlineAndRefusesACutValue) {
    WriteFile(kControl, "Status: ACTIVATED\n");
    char buf[64];
    EXPECT_EQ(0u, ORLOiSCSIConfigfsGetString(kControl, buf, sizeof(buf)));
    EXPECT_STREQ("Status: ACTIVATED\n", buf);

    // Exactly as long as the buffer, no room for the NUL: may have been cut.
    char small[18];
    EXPECT_EQ(18990039u, ORLOiSCSIConfigfsGetString(kControl, small, sizeof(small)));
    EXPECT_TRUE(log_.Contains("Read buffer is not big enough.")) << log_.Dump();
    char fits[19];
    EXPECT_EQ(0u, ORLOiSCSIConfigfsGetString(kControl, fits, sizeof(fits)));
    EXPECT_STREQ("Status: ACTIVATED\n", fits);

    EXPECT_EQ(18990004u, ORLOiSCSIConfigfsGetString(kControl, buf, 0));
    EXPECT_EQ(18990004u, ORLOiSCSIConfigfsGetString(nullptr, buf, sizeof(buf)));
}

TEST_F(ConfigfsTest, PipeWritesAWholeShortOutputAndRefusesALongOne) {
    // The command runs without a shell: its words arrive as they are.
    WriteFile("/bin/say", "#!/bin/sh\nprintf '%s|' \"$@\"\n", 0755);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsPipe("/bin/say a $HOME;x", kControl));
    EXPECT_EQ("a|$HOME;x|", ReadFile(kControl));

    WriteFile(kControl, "before");
    WriteFile("/bin/long", "#!/bin/sh\nhead -c 1024 /dev/zero | tr '\\0' 'y'\n", 0755);
    EXPECT_EQ(18990000u, ORLOiSCSIConfigfsPipe("/bin/long", kControl));
    EXPECT_EQ("before", ReadFile(kControl)) << "nothing is written from a value that is too long";
    WriteFile("/bin/almost", "#!/bin/sh\nhead -c 1023 /dev/zero | tr '\\0' 'z'\n", 0755);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsPipe("/bin/almost", kControl));
    EXPECT_EQ(std::string(1023, 'z'), ReadFile(kControl));

    EXPECT_EQ(18990038u, ORLOiSCSIConfigfsPipe("/bin/missing", kControl));
}

TEST_F(ConfigfsTest, SymlinkAcceptsTheSameObjectAgainAndRefusesAnother) {
    WriteFile("/config/target/core/iblock_0/a/enable", "1\n");
    WriteFile("/config/target/core/iblock_0/b/enable", "1\n");
    WriteFile("/config/target/iscsi/t/tpgt_1/lun/lun_0/.keep", "");
    const char *link = "/config/target/iscsi/t/tpgt_1/lun/lun_0/a";
    EXPECT_EQ(0u, ORLOiSCSIConfigfsSymlink("/config/target/core/iblock_0/a", link));
    char target[4096];
    ssize_t n = readlink(Real(link).c_str(), target, sizeof(target) - 1);
    ASSERT_GT(n, 0);
    target[n] = '\0';
    EXPECT_EQ(Real("/config/target/core/iblock_0/a"), target) << "the link leads into the sandbox";

    EXPECT_EQ(0u, ORLOiSCSIConfigfsSymlink("/config/target/core/iblock_0/a", link));
    EXPECT_EQ(18990036u, ORLOiSCSIConfigfsSymlink("/config/target/core/iblock_0/b", link));
    EXPECT_TRUE(log_.Contains("symlink(\"/config/target/core/iblock_0/b\", \"" + std::string(link) +
                              "\") failed, err=File exists"))
        << log_.Dump();
    // A link to something missing, in a directory that does not exist.
    EXPECT_EQ(18990036u, ORLOiSCSIConfigfsSymlink("/config/x", "/config/no/such/dir/l"));
}

TEST_F(ConfigfsTest, PathBuildersFollowTheTargetVersion) {
    char buf[320];
    EXPECT_EQ(0u, ORLOiSCSIConfigfsBlockControlPath("lun7", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/iblock_0/lun7/control", buf);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsFileInfoPath("lun7", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/fileio_0/lun7/info", buf);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsBlockLunHbaPath("lun7", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/iblock_0/lun7", buf);

    // No defaults file: not the version-4 generation, so extent-pool LUNs use fileio.
    EXPECT_EQ(0u, ORLOiSCSIGetLioVersion());
    EXPECT_EQ(0u, ORLOiSCSIConfigfsEpEnablePath("e", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/fileio_0/e/enable", buf);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsTrashLunHbaPath("e", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/fileio_1/e", buf);

    WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
    orlo::LioReset();
    EXPECT_EQ(4u, ORLOiSCSIGetLioVersion());
    EXPECT_EQ(6u, orlo::getTcmModuleSet().size());
    EXPECT_EQ(0u, ORLOiSCSIConfigfsEpControlPath("e", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/epio_0/e/control", buf);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsTrashInfoPath("e", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/epio_1/e/info", buf);
    EXPECT_EQ(0u, ORLOiSCSIConfigfsVdiskHbaPath("v", buf, sizeof(buf)));
    EXPECT_STREQ("/config/target/core/epio_0/v", buf);

    // An unknown generation falls back to 2, and says so once.
    WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio5\"\n");
    orlo::LioReset();
    log_.Clear();
    EXPECT_EQ(2u, ORLOiSCSIGetLioVersion());
    EXPECT_TRUE(log_.Contains("suspicious lio version, default to lio40")) << log_.Dump();
    EXPECT_EQ(std::vector<std::string>({"iscsi_target_mod_4_0"}), orlo::getiSCSIModuleSet());

    // A path that does not fit is refused, never cut.
    char tiny[40];
    EXPECT_EQ(18990050u, ORLOiSCSIConfigfsFileControlPath("lun7", tiny, sizeof(tiny)));
    EXPECT_STREQ("", tiny);
    EXPECT_EQ(18990004u, ORLOiSCSIConfigfsFileControlPath(nullptr, buf, sizeof(buf)));
    EXPECT_EQ(18990004u, ORLOiSCSIConfigfsFileControlPath("x", nullptr, sizeof(buf)));
}

}  // namespace

namespace {

TEST_F(ConfigfsTest, AFailedWriteOfACHAPSecretNeverLogsTheSecret) {
    // A write that fails: the attribute leads to /dev/full.
    WriteFile("/config/target/iscsi/t/tpgt_1/acls/i/auth/.keep", "");
    ASSERT_EQ(0, symlink("/dev/full", Real("/config/target/iscsi/t/tpgt_1/acls/i/auth/password").c_str()));
    ASSERT_EQ(0, symlink("/dev/full", Real("/config/target/iscsi/t/tpgt_1/acls/i/auth/userid").c_str()));
    EXPECT_EQ(18990040u, ORLOiSCSIConfigfsWrite("/config/target/iscsi/t/tpgt_1/acls/i/auth/password", "s3cretchap12"));
    EXPECT_EQ(18990040u, ORLOiSCSIConfigfsPrintf("/config/target/iscsi/t/tpgt_1/acls/i/auth/password", "%s", "s3cretchap12"));
    EXPECT_FALSE(log_.Contains("s3cretchap12")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("\"********\"")) << log_.Dump();
    // Other attributes are shown as they are.
    EXPECT_EQ(18990040u, ORLOiSCSIConfigfsWrite("/config/target/iscsi/t/tpgt_1/acls/i/auth/userid", "alice"));
    EXPECT_TRUE(log_.Contains("\"alice\"")) << log_.Dump();
}

}  // namespace
