// The library's configfs primitives against the simulated kernel target: the values
// they write arrive as the kernel takes them, the kernel's refusals come back as the
// library's codes, and links are made idempotently.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "orloiscsi_base.h"
#include "orloiscsi_configfs.h"
#include "support/configfs_sim_fixture.h"

namespace orlotest {
namespace {

const char kNode[] = "/config/target/iscsi/iqn.2000-01.com.orlo:prim";
const char kTpg[] = "/config/target/iscsi/iqn.2000-01.com.orlo:prim/tpgt_1";

class SimPrimitives : public ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
        for (const char *d : {"/config/target/iscsi", kNode, kTpg}) ASSERT_EQ(0, mkdir(Real(d).c_str(), 0700)) << d;
    }
    std::string P(const std::string &suffix) { return std::string(kTpg) + suffix; }
    std::string Last(const char *op) {
        std::vector<SimOp> t = Trace();
        for (auto it = t.rbegin(); it != t.rend(); ++it)
            if (it->op == op) return it->value + " " + it->result;
        return "";
    }
};

TEST_F(SimPrimitives, WriteAndPrintfDeliverOneValueAndReportTheKernelsRefusal) {
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsWrite(P("/param/TargetAlias").c_str(), "Orlo Target"));
    EXPECT_EQ("Orlo Target 0", Last("write"));
    EXPECT_EQ("Orlo Target\n", ReadFile(P("/param/TargetAlias")));
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsPrintf(P("/param/MaxRecvDataSegmentLength").c_str(), "%d", 65536));
    EXPECT_EQ("65536\n", ReadFile(P("/param/MaxRecvDataSegmentLength")));
    // The kernel's EINVAL is a failed write; a missing attribute a failed open.
    EXPECT_EQ(ORLO_ERR_WRITE_FILE, ORLOiSCSIConfigfsPrintf(P("/param/MaxRecvDataSegmentLength").c_str(), "%d", 511));
    EXPECT_EQ("511 EINVAL", Last("write"));
    EXPECT_EQ(ORLO_ERR_WRITE_FILE, ORLOiSCSIConfigfsWrite(P("/param/DataDigest").c_str(), "MD5"));
    EXPECT_EQ(ORLO_ERR_OPEN_FILE, ORLOiSCSIConfigfsWrite(P("/param/NoSuchKey").c_str(), "1"));
    EXPECT_EQ(ORLO_ERR_OPEN_FILE, ORLOiSCSIConfigfsWrite(P("/dynamic_sessions").c_str(), "1"));  // read-only
    // 4095 bytes go in one write; 4096 are refused before anything is written.
    ASSERT_EQ(0, mkdir(Real("/config/target/core/fileio_0/LUN_big").c_str(), 0700));
    const std::string lba = "/config/target/core/fileio_0/LUN_big/lba_map";
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsWrite(lba.c_str(), std::string(4095, 'm').c_str()));
    EXPECT_EQ(std::string(4095, 'm') + "\n", ReadFile(lba));
    ClearTrace();
    EXPECT_EQ(ORLO_ERR_BAD_STRING_LENGTH, ORLOiSCSIConfigfsWrite(lba.c_str(), std::string(4096, 'm').c_str()));
    EXPECT_EQ("", Last("write"));
    // A fault injected into the write comes back the same way.
    ASSERT_EQ(0, SetFault("write", "*/attrib/authentication", "EIO"));
    EXPECT_EQ(ORLO_ERR_WRITE_FILE, ORLOiSCSIConfigfsPutInteger(P("/attrib/authentication").c_str(), 0));
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsPutInteger(P("/attrib/authentication").c_str(), 0));
    EXPECT_EQ("0 0", Last("write"));
}

TEST_F(SimPrimitives, IntegersAndBooleansReadBackAsTheKernelShowsThem) {
    int v = 0;
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsGetInteger(P("/attrib/default_cmdsn_depth").c_str(), &v));
    EXPECT_EQ(64, v);  // the kernel's default
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsPutInteger(P("/attrib/default_cmdsn_depth").c_str(), 16));
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsGetInteger(P("/attrib/default_cmdsn_depth").c_str(), &v));
    EXPECT_EQ(16, v);
    EXPECT_EQ(ORLO_ERR_WRITE_FILE, ORLOiSCSIConfigfsPutInteger(P("/attrib/default_cmdsn_depth").c_str(), 0));
    EXPECT_EQ(ORLO_ERR_WRITE_FILE, ORLOiSCSIConfigfsPutInteger(P("/attrib/default_cmdsn_depth").c_str(), -1));

    bool b = true;
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsGetBool(P("/enable").c_str(), &b));
    EXPECT_FALSE(b);
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsPutInteger(P("/enable").c_str(), 1));
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsGetBool(P("/enable").c_str(), &b));
    EXPECT_TRUE(b);
    // Not a boolean, not a number, nothing at all.
    EXPECT_EQ(ORLO_ERR_PARSE_STRING, ORLOiSCSIConfigfsGetBool(P("/max_session").c_str(), &b));
    EXPECT_EQ(ORLO_ERR_PARSE_STRING, ORLOiSCSIConfigfsGetInteger(P("/param/HeaderDigest").c_str(), &v));
    ASSERT_EQ(0, mkdir(Real("/config/target/core/iblock_0/LUN_u").c_str(), 0700));
    EXPECT_EQ(ORLO_ERR_PARSE_STRING,
              ORLOiSCSIConfigfsGetInteger("/config/target/core/iblock_0/LUN_u/udev_path", &v));  // unset: empty
    EXPECT_EQ(ORLO_ERR_OPEN_FILE, ORLOiSCSIConfigfsGetInteger(P("/nothing").c_str(), &v));
    ASSERT_EQ(0, SetFault("read", "*/tpgt_1/enable", "EIO"));
    EXPECT_EQ(ORLO_ERR_READ_FILE, ORLOiSCSIConfigfsGetBool(P("/enable").c_str(), &b));

    char buf[64];
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsGetString(P("/param/HeaderDigest").c_str(), buf, sizeof(buf)));
    EXPECT_STREQ("CRC32C,None\n", buf);  // the newline is kept
    char small[4];
    EXPECT_EQ(ORLO_ERR_READ_FILE, ORLOiSCSIConfigfsGetString(P("/param/HeaderDigest").c_str(), small, sizeof(small)));
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsGetString("/config/target/core/iblock_0/LUN_u/attrib/hba_type", buf,
                                                  sizeof(buf)));
    EXPECT_STREQ("iblock\n", buf);
}

TEST_F(SimPrimitives, PipeWritesACommandsWholeOutputOrNothing) {
    WriteFile("/bin/alias", "#!/bin/sh\necho 'Piped Alias'\n", 0755);
    WriteFile("/bin/long", "#!/bin/sh\ni=0\nwhile [ $i -lt 40 ]; do echo 'xxxxxxxxxxxxxxxxxxxxxxxxx'; i=$((i+1)); done\n",
              0755);
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsPipe("/bin/alias", P("/param/TargetAlias").c_str()));
    EXPECT_EQ("Piped Alias\n", ReadFile(P("/param/TargetAlias")));
    EXPECT_EQ("Piped Alias\n 0", Last("write"));
    ClearTrace();
    EXPECT_EQ(ORLO_ERR_DEFAULT, ORLOiSCSIConfigfsPipe("/bin/long", P("/param/TargetAlias").c_str()));
    EXPECT_EQ("", Last("write")) << "nothing reached the kernel";
    EXPECT_EQ("Piped Alias\n", ReadFile(P("/param/TargetAlias")));
}

TEST_F(SimPrimitives, SymlinkAcceptsTheSameLinkAgainAndRefusesAnother) {
    const std::string core = "/config/target/core/fileio_0/";
    for (const char *name : {"LUN_a", "LUN_b"}) {
        WriteFile(std::string("/volume1/") + name, "");
        ASSERT_EQ(0, mkdir(Real(core + name).c_str(), 0700));
        ASSERT_EQ(ORLO_OK, ORLOiSCSIConfigfsWrite((core + name + "/control").c_str(),
                                                  (std::string("fd_dev_name=/volume1/") + name + ",fd_dev_size=4096")
                                                      .c_str()));
        ASSERT_EQ(ORLO_OK, ORLOiSCSIConfigfsWrite((core + name + "/enable").c_str(), "1"));
    }
    ASSERT_EQ(0, mkdir(Real(P("/lun/lun_0")).c_str(), 0700));
    const std::string link = P("/lun/lun_0/LUN_a");
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsSymlink((core + "LUN_a").c_str(), link.c_str()));
    EXPECT_EQ(ORLO_OK, ORLOiSCSIConfigfsSymlink((core + "LUN_a").c_str(), link.c_str()));
    EXPECT_EQ(ORLO_ERR_LINK_FILE, ORLOiSCSIConfigfsSymlink((core + "LUN_b").c_str(), link.c_str()));
    // The kernel's own refusals: a second backstore (EEXIST for a name that is not there,
    // so the library's look at the existing link fails) and one that is not enabled.
    EXPECT_NE(ORLO_OK, ORLOiSCSIConfigfsSymlink((core + "LUN_b").c_str(), P("/lun/lun_0/LUN_b").c_str()));
    EXPECT_EQ("EEXIST", Trace().back().result);
    ASSERT_EQ(0, mkdir(Real(core + "LUN_off").c_str(), 0700));
    ASSERT_EQ(0, mkdir(Real(P("/lun/lun_1")).c_str(), 0700));
    EXPECT_EQ(ORLO_ERR_LINK_FILE, ORLOiSCSIConfigfsSymlink((core + "LUN_off").c_str(), P("/lun/lun_1/LUN_off").c_str()));
    std::vector<SimOp> t = Trace();
    ASSERT_FALSE(t.empty());
    EXPECT_EQ("symlink", t.back().op);
    EXPECT_EQ("ENODEV", t.back().result);
    int links = 0;
    for (const SimOp &o : t)
        if (o.op == "symlink" && o.result == "0") ++links;
    EXPECT_EQ(1, links) << TraceDump();
}

}  // namespace
}  // namespace orlotest
