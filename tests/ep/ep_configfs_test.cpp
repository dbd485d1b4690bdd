// What the pool tells the kernel, against the simulated kernel target: clone, mirror and
// promote commands in order, the clone status read from the kernel and the map file,
// switching pools on and off (and back on failure), and the start-up unmap buffer walk.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "ep/ep_test_util.h"
#include "ep_internal.h"
#include "orloiscsi_ep.h"
#include "support/configfs_sim_fixture.h"

namespace {

class EpConfigfsTest : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0, InsertModuleSet(kTcmModules, 4));
    }
    // A pool on /volume<n> with a map file for each name ("/volume1/@iSCSI/LUN/ADV/<n>").
    std::string MapFile(const std::string &name, uint64_t bytes, int volume = 1) {
        std::string vol = "/volume" + std::to_string(volume);
        mkdir(Real(vol).c_str(), 0755);
        mkdir(Real(vol + "/@iSCSI").c_str(), 0700);
        EXPECT_EQ(0u, ORLOiSCSIEpMetaFilesCreate(vol.c_str(), 1u << 20));
        std::string path = vol + "/@iSCSI/" + name;
        EXPECT_EQ(0u, ORLOiSCSIEpMapFileMetaInit(path.c_str(), vol.c_str(), bytes)) << log_.Dump();
        return path;
    }
    std::string Backstore(const std::string &name) {
        EXPECT_EQ(0, mkdir(Cfg("/target/core/epio_0/" + name).c_str(), 0700)) << strerror(errno);
        return "/config/target/core/epio_0/" + name;
    }
    void Synced(const std::string &map, uint64_t synced) {
        unsigned char b[64] = {};
        eptest::Put64(b + 4, synced);
        ASSERT_EQ(0u, ORLOiSCSIEpFileMapSetVar2(map.c_str(), b));
    }
    std::vector<orlotest::SimOp> Changes() {
        std::vector<orlotest::SimOp> out;
        for (const orlotest::SimOp &op : Trace())
            if (op.op != "read") out.push_back(op);
        return out;
    }
};

TEST_F(EpConfigfsTest, CloneStartWritesTheParentNameThenItsUuidAndStatusFollowsTheKernel) {
    std::string parent = MapFile("p_00000", 12 << 20);
    std::string child = MapFile("c_00000", 12 << 20);
    std::string parentDir = Backstore("LUN_p"), childDir = Backstore("LUN_c");
    char uuid[37];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(parent.c_str(), uuid));

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileCloneStart(parent.c_str(), (parentDir + "/").c_str(), childDir.c_str()))
        << log_.Dump();
    auto ops = Changes();
    ASSERT_EQ(2u, ops.size()) << TraceDump();
    EXPECT_EQ("write", ops[0].op);
    EXPECT_EQ("/target/core/epio_0/LUN_c/control", ops[0].path);
    EXPECT_EQ("ep_parent_name=LUN_p", ops[0].value);
    EXPECT_EQ("0", ops[0].result);
    EXPECT_EQ("ep_clone_parent=" + std::string(uuid), ops[1].value);
    EXPECT_EQ("0", ops[1].result);

    // Running while the kernel says so, whatever the counts.
    Synced(child, 3);
    EXPECT_EQ(1, ORLOiSCSIEpMapFileCloneStatus(child.c_str(), childDir.c_str()));
    // Stopped: short of the total is a failure, at the total it is done.
    ASSERT_EQ(0, SimControl("clone", "stop /target/core/epio_0/LUN_c"));
    Synced(child, 10);
    EXPECT_EQ(-1, ORLOiSCSIEpMapFileCloneStatus(child.c_str(), childDir.c_str()));
    Synced(child, 12);
    EXPECT_EQ(0, ORLOiSCSIEpMapFileCloneStatus(child.c_str(), childDir.c_str()));
    bool done = false;
    ASSERT_EQ(0u, ORLOiSCSIEpIsCloneDone(child.c_str(), &done));
    EXPECT_TRUE(done);
    // The backstore gone, the map file still answers.
    EXPECT_EQ(0, ORLOiSCSIEpMapFileCloneStatus(child.c_str(), "/config/target/core/epio_0/LUN_gone"));
    log_.Clear();
    EXPECT_EQ(-1, ORLOiSCSIEpMapFileCloneStatus("/volume1/none", childDir.c_str()));
    EXPECT_TRUE(log_.Contains("ORLOiSCSIEpIsCloneDone(\"/volume1/none\", ")) << log_.Dump();
    EXPECT_EQ(-1, ORLOiSCSIEpMapFileCloneStatus(nullptr, childDir.c_str()));

    // A refused first command stops the start there.
    std::string other = Backstore("LUN_o");
    ASSERT_EQ(0, SetFault("write", "/target/core/epio_0/LUN_o/control", "EINVAL"));
    ClearTrace();
    log_.Clear();
    EXPECT_EQ(18990040u, ORLOiSCSIEpMapFileCloneStart(parent.c_str(), parentDir.c_str(), other.c_str()));
    ops = Changes();
    ASSERT_EQ(1u, ops.size()) << TraceDump();
    EXPECT_EQ("EINVAL", ops[0].result);
    EXPECT_TRUE(log_.Contains("ORLOiSCSIConfigfsPrintf(\"/config/target/core/epio_0/LUN_o/control\", "
                              "\"ep_parent_name=%s\", \"LUN_p\") failed, err=Failed to write file"))
        << log_.Dump();
}

TEST_F(EpConfigfsTest, MirrorStartAndPromote) {
    std::string parent = MapFile("p_00000", 4 << 20);
    std::string child = MapFile("m_00000", 4 << 20);
    std::string parentDir = Backstore("LUN_p"), childDir = Backstore("LUN_m");
    char uuid[37];
    ASSERT_EQ(0u, ORLOiSCSIEpFileUuidGet(parent.c_str(), uuid));

    // Promoting what is no mirror: the kernel refuses, the log keeps its old spelling.
    EXPECT_EQ(18990040u, ORLOiSCSIEpMapFileMirrorPromote(child.c_str(), childDir.c_str()));
    EXPECT_TRUE(log_.Contains("ORLOiSCSIConfigfsWrite(\"/config/target/core/epio_0/LUN_m/control\", "
                              "\"ep_relation_proamote=1\") failed"))
        << log_.Dump();

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileMirrorStart(parent.c_str(), parentDir.c_str(), childDir.c_str()));
    ASSERT_EQ(0u, ORLOiSCSIEpMapFileMirrorPromote(child.c_str(), childDir.c_str()));
    auto ops = Changes();
    ASSERT_EQ(3u, ops.size()) << TraceDump();
    EXPECT_EQ("ep_parent_name=LUN_p", ops[0].value);
    EXPECT_EQ("ep_mirror_parent=" + std::string(uuid), ops[1].value);
    EXPECT_EQ("ep_relation_promote=1", ops[2].value);
    for (const auto &op : ops) EXPECT_EQ("0", op.result) << op.value;
    EXPECT_NE(std::string::npos, ReadFile("/config/target/core/epio_0/LUN_m/info/extent/child").find("promoted=1"));
    // A mirror is no clone: the status comes from the counts.
    EXPECT_EQ(-1, ORLOiSCSIEpMapFileCloneStatus(child.c_str(), childDir.c_str()));
}

TEST_F(EpConfigfsTest, PoolEnableTwiceIsOnceAndDisableTakesItDown) {
    EXPECT_EQ(18990418u, ORLOiSCSIEpEnable(1)) << "no pool files on the volume";
    EXPECT_FALSE(Exists("/config/pool/EP_1"));
    EXPECT_EQ(18990004u, ORLOiSCSIEpEnable(0));

    MapFile("x_00000", 1 << 20);
    WriteFile("/volume1/@iSCSI/EP/EP_BUF", "");
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIEpEnable(1)) << log_.Dump() << TraceDump();
    auto ops = Changes();
    ASSERT_EQ(3u, ops.size()) << TraceDump();
    EXPECT_EQ("mkdir", ops[0].op);
    EXPECT_EQ("/pool/EP_1", ops[0].path);
    EXPECT_EQ("/pool/EP_1/unmap_path", ops[1].path);
    EXPECT_EQ("/volume1/@iSCSI/EP/EP_BUF", ops[1].value);
    EXPECT_EQ("/pool/EP_1/unmap_enable", ops[2].path);
    EXPECT_EQ("1", ops[2].value);
    EXPECT_EQ("1\n", ReadFile("/config/pool/EP_1/unmap_enable"));
    EXPECT_EQ("0\n", ReadFile("/config/pool/EP_1/rod_enable")) << "no EP_ROD, no offloaded copy";

    ClearTrace();
    EXPECT_EQ(0u, ORLOiSCSIEpEnable(1)) << "on already";
    EXPECT_TRUE(Changes().empty()) << TraceDump();
    bool on = false;
    ASSERT_EQ(0u, ORLOiSCSIEpIsEnabled(1, &on));
    EXPECT_TRUE(on);
    ORLOiSCSIEpInfo info;
    ASSERT_EQ(0u, ORLOiSCSIEpInfoGet("/volume1", &info));
    EXPECT_TRUE(info.enabled);
    EXPECT_TRUE(info.unmapEnabled);
    EXPECT_FALSE(info.rodEnabled);

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIEpDisable(1));
    ops = Changes();
    ASSERT_EQ(2u, ops.size()) << TraceDump();
    EXPECT_EQ("/pool/EP_1/unmap_enable", ops[0].path);
    EXPECT_EQ("0", ops[0].value);
    EXPECT_EQ("rmdir", ops[1].op);
    ASSERT_EQ(0u, ORLOiSCSIEpIsEnabled(1, &on));
    EXPECT_FALSE(on);
    EXPECT_EQ(0u, ORLOiSCSIEpDisable(1)) << "off already";

    // The offloaded-copy file too; and a refused switch takes the half-made pool down.
    WriteFile("/volume1/@iSCSI/EP/EP_ROD", "");
    ASSERT_EQ(0, SetFault("write", "/pool/EP_1/unmap_enable", "EIO"));
    ClearTrace();
    log_.Clear();
    EXPECT_EQ(18990418u, ORLOiSCSIEpEnable(1));
    EXPECT_FALSE(Exists("/config/pool/EP_1")) << TraceDump();
    ops = Changes();
    ASSERT_FALSE(ops.empty());
    EXPECT_EQ("rmdir", ops.back().op) << TraceDump();
    EXPECT_TRUE(log_.Contains("ORLOiSCSIConfigfsPutInteger(\"/config/pool/EP_1/unmap_enable\", 1) failed")) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSIEpEnable(1));
    EXPECT_EQ("1\n", ReadFile("/config/pool/EP_1/rod_enable"));
    EXPECT_EQ("/volume1/@iSCSI/EP/EP_ROD\n", ReadFile("/config/pool/EP_1/rod_path"));
}

TEST_F(EpConfigfsTest, UnmapBufferWalkEnablesOnlyVolumesWithABuffer) {
    MapFile("a_00000", 1 << 20, 1);
    MapFile("b_00000", 1 << 20, 2);
    MapFile("c_00000", 1 << 20, 3);
    WriteFile("/volume1/@iSCSI/EP/EP_BUF", "");
    WriteFile("/volume3/@iSCSI/EP/EP_BUF", "");
    // Volume 3's pool is on already, brought up without its buffer.
    ASSERT_EQ(0, mkdir(Cfg("/pool/EP_3").c_str(), 0700));
    mkdir(Real("/volumeUSB1").c_str(), 0755);

    ASSERT_EQ(0u, ORLOiSCSIEpUnmapBufferCheckAndEnable()) << log_.Dump() << TraceDump();
    EXPECT_EQ("1\n", ReadFile("/config/pool/EP_1/unmap_enable"));
    EXPECT_FALSE(Exists("/config/pool/EP_2"));
    EXPECT_EQ("1\n", ReadFile("/config/pool/EP_3/unmap_enable"));
    EXPECT_EQ("/volume3/@iSCSI/EP/EP_BUF\n", ReadFile("/config/pool/EP_3/unmap_path"));

    // Run again at the next start: nothing to change.
    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIEpUnmapBufferCheckAndEnable());
    EXPECT_TRUE(Changes().empty()) << TraceDump();

    // One volume failing does not stop the others.
    ASSERT_EQ(0u, ORLOiSCSIEpDisable(1));
    ASSERT_EQ(0u, ORLOiSCSIEpDisable(3));
    ASSERT_EQ(0, SetFault("mkdir", "/pool/EP_1", "ENOMEM"));
    EXPECT_EQ(18990418u, ORLOiSCSIEpUnmapBufferCheckAndEnable());
    EXPECT_FALSE(Exists("/config/pool/EP_1"));
    EXPECT_EQ("1\n", ReadFile("/config/pool/EP_3/unmap_enable"));
}

TEST_F(EpConfigfsTest, JournalInUseIsReadFromTheKernelAndBlocksAMove) {
    bool used = true;
    ASSERT_EQ(0u, ORLOiSCSIEpIsJournalEnabled(&used));
    EXPECT_FALSE(used);
    int fd = open(Cfg("/pool/ext_jnl_enable").c_str(), O_WRONLY);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(1, write(fd, "1", 1));
    close(fd);
    ASSERT_EQ(0u, ORLOiSCSIEpIsJournalEnabled(&used));
    EXPECT_TRUE(used);
    EXPECT_EQ(18990013u, ORLOiSCSIEpJournalRootPathChange("/volume1/jnl"));
    EXPECT_TRUE(log_.Contains("Fail to change EP journal root path, journal is used")) << log_.Dump();
    EXPECT_FALSE(Exists("/volume1/jnl"));
}

}  // namespace
