// Plug-ins around operations, the storage behind a path, disabled storage objects and
// the event log.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>

#include "olibc.h"
#include "orlo_storage.h"
#include "support/sandbox.h"

namespace {

class PluginTest : public orlotest::SandboxTest {
  protected:
    const std::string dir = "/usr/orlo/plugins/lun/lun_create";
    // A plug-in that records its arguments and input in /tmp/calls, then exits with code.
    void AddPlugin(const std::string &name, int code) {
        WriteFile(dir + "/" + name,
                  "#!/bin/sh\nprintf '%s %s %s ' \"" + name + "\" \"$1\" \"$2\" >> \"$ORLO_SYSROOT/tmp/calls\"\n"
                  "cat >> \"$ORLO_SYSROOT/tmp/calls\"\necho >> \"$ORLO_SYSROOT/tmp/calls\"\nexit " +
                      std::to_string(code) + "\n",
                  0755);
    }
};

TEST_F(PluginTest, PluginsRunInNameOrderWithTheEventAndJson) {
    AddPlugin("20-second", 0);
    AddPlugin("10-first", 0);
    WriteFile(dir + "/30-not-executable", "#!/bin/sh\nexit 1\n", 0644);
    WriteFile(dir + "/.hidden", "#!/bin/sh\nexit 1\n", 0755);
    POLIB_PLUGIN h = nullptr;
    ASSERT_EQ(0, OLIBPluginSDKInit("lun", "lun_create", &h));
    EXPECT_EQ(1, OLIBPluginHasInit(h));
    EXPECT_EQ(2, OLIBPluginCount(h));
    EXPECT_EQ(0, OLIBPluginRun(h, OLIB_PLUGIN_EVENT_PRE, "{\"name\":\"a b\"}"));
    OLIBPluginExit(h);
    EXPECT_EQ("10-first 4 lun_create {\"name\":\"a b\"}\n20-second 4 lun_create {\"name\":\"a b\"}\n",
              ReadFile("/tmp/calls"));
}

TEST_F(PluginTest, AFailingPreStepStopsButThePostStepRunsEveryPlugin) {
    AddPlugin("1-veto", 3);
    AddPlugin("2-after", 0);
    POLIB_PLUGIN h = nullptr;
    ASSERT_EQ(0, OLIBPluginSDKInit("lun", "lun_create", &h));
    EXPECT_EQ(-1, OLIBPluginRun(h, OLIB_PLUGIN_EVENT_PRE, "{}"));
    EXPECT_EQ(OLIBC_ERR_EXEC, OLIBCErrGet());
    EXPECT_EQ("1-veto 4 lun_create {}\n", ReadFile("/tmp/calls"));
    EXPECT_EQ(-1, OLIBPluginRun(h, OLIB_PLUGIN_EVENT_POST, "{}"));
    EXPECT_EQ("1-veto 4 lun_create {}\n1-veto 5 lun_create {}\n2-after 5 lun_create {}\n", ReadFile("/tmp/calls"));
    OLIBPluginExit(h);

    // A plug-in that never reads its input does not hurt the caller (no SIGPIPE).
    WriteFile(dir + "/0-deaf", "#!/bin/sh\nexit 0\n", 0755);
    ASSERT_EQ(0, OLIBPluginSDKInit("lun", "lun_create", &h));
    std::string big(1 << 20, 'x');
    EXPECT_EQ(-1, OLIBPluginRun(h, OLIB_PLUGIN_EVENT_PRE, big.c_str())) << "1-veto still says no";
    OLIBPluginExit(h);
}

TEST_F(PluginTest, NoDirectoryMeansNoPluginsAndBadNamesAreRefused) {
    POLIB_PLUGIN h = nullptr;
    ASSERT_EQ(0, OLIBPluginSDKInit("lun", "lun_delete", &h));
    EXPECT_EQ(0, OLIBPluginCount(h));
    EXPECT_EQ(0, OLIBPluginRun(h, OLIB_PLUGIN_EVENT_PRE, "{}"));
    OLIBPluginExit(h);
    EXPECT_EQ(-1, OLIBPluginSDKInit("../etc", "x", &h));
    EXPECT_EQ(-1, OLIBPluginSDKInit("lun", "", &h));
    EXPECT_EQ(0, OLIBPluginHasInit(nullptr));
    EXPECT_EQ(-1, OLIBPluginRun(nullptr, OLIB_PLUGIN_EVENT_PRE, "{}"));
}

using SpaceTest = orlotest::SandboxTest;

TEST_F(SpaceTest, SpaceInfoFindsTheMountBehindAPath) {
    ORLO_SPACE_INFO info;
    ASSERT_EQ(1, ORLOSpaceInfoGet("/volume1", &info));
    EXPECT_NE('\0', info.szDevice[0]);
    EXPECT_EQ('/', info.szMountPoint[0]);
    EXPECT_GT(info.totalBytes, 0u);
    EXPECT_LE(info.freeBytes, info.totalBytes);
    EXPECT_EQ(-1, ORLOSpaceInfoGet("/volume9/none", &info));
    EXPECT_EQ(-1, ORLOSpaceInfoGet("relative", &info));
    // Devices are the machine's own: /dev/null exists but is no block device.
    ASSERT_EQ(1, ORLOSpaceInfoGet("/dev/null", &info));
    EXPECT_STREQ("/dev/null", info.szDevice);
    EXPECT_EQ(0, info.isBlockDevice);
    // Nothing to tune on a volume that is not on an md array.
    EXPECT_EQ(0, ORLORAIDStripeCacheTune("/volume1"));
    EXPECT_EQ(3, ORLOVolIDParse("/volume3/@iSCSI/LUN"));
    EXPECT_LT(ORLOVolIDParse("/volumeUSB1/x"), 0);
}

TEST_F(SpaceTest, DisabledSpacesAndTheEventLog) {
    EXPECT_EQ(1, ORLOSpaceCanEnable("lun-a"));
    WriteFile("/usr/orlo/etc/space_disabled.conf", "lun-b\nlun-a \n");
    EXPECT_EQ(0, ORLOSpaceCanEnable("lun-a"));
    EXPECT_EQ(1, ORLOSpaceCanEnable("lun-c"));
    EXPECT_EQ(-1, ORLOSpaceCanEnable(""));

    ASSERT_EQ(0, ORLOLogSet1(0x13000038, "lun\nname", "FILE", "/volume1"));
    ASSERT_EQ(0, ORLOLogSet1(0x13000001, nullptr, nullptr, nullptr));
    std::string log = ReadFile("/var/log/orlo/event.log");
    EXPECT_NE(std::string::npos, log.find("\t0x13000038\tlun name\tFILE\t/volume1\n")) << log;
    EXPECT_NE(std::string::npos, log.find("\t0x13000001\n")) << log;
}

}  // namespace
