// The EP journal: where it lives, its size and head as the settings ask, what happens to
// a journal that is already there, and moving it to a new root.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>

#include "ep/ep_test_util.h"
#include "ep_internal.h"
#include "olibc.h"
#include "orloiscsi_ep.h"
#include "support/sandbox.h"

namespace {

using eptest::BlockCrc;
using eptest::Le32;
using eptest::Le64;
using eptest::ReadAt;

const char kJnl[] = "/var/db/iscsi/EP_JNL";

int gStops = 0;
uint32_t gStopResult = 0;
uint32_t CountingStop() {
    ++gStops;
    return gStopResult;
}

class EpJournalTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        WriteFile("/bin/mkdir", eptest::MkdirScript(), 0755);
        gStops = 0;
        gStopResult = 0;
    }
    void TearDown() override {
        orlo::ep::SetTotallyStopHook(nullptr);
        SandboxTest::TearDown();
    }
    std::string Uuid(const char *path) {
        char u[37] = "";
        EXPECT_EQ(0u, ORLOiSCSIEpFileUuidGet(path, u));
        return u;
    }
};

TEST_F(EpJournalTest, RootPathComesFromTheSettingOrTheDefault) {
    char buf[128];
    ASSERT_EQ(0, ORLOiSCSIEpJournalRootPathGet(buf, sizeof(buf), false));
    EXPECT_STREQ("/var/db/iscsi", buf) << "no /etc/orloinfo.conf";
    WriteFile("/etc/orloinfo.conf", "company=\"x\"\n");
    ASSERT_EQ(0, ORLOiSCSIEpJournalRootPathGet(buf, sizeof(buf), false));
    EXPECT_STREQ("/var/db/iscsi", buf) << "no key";
    WriteFile("/etc/orloinfo.conf", "vaai_journal_rootpath=\"/volume1/@jnl/\"\n");
    ASSERT_EQ(0, ORLOiSCSIEpJournalRootPathGet(buf, sizeof(buf), false));
    EXPECT_STREQ("/volume1/@jnl", buf);
    ASSERT_EQ(0, ORLOiSCSIEpJournalRootPathGet(buf, sizeof(buf), true));
    EXPECT_STREQ("/var/db/iscsi", buf) << "forced default";
    WriteFile("/etc/orloinfo.conf", "vaai_journal_rootpath=relative\n");
    ASSERT_EQ(0, ORLOiSCSIEpJournalRootPathGet(buf, sizeof(buf), false));
    EXPECT_STREQ("/var/db/iscsi", buf);
    // A value or default that does not fit is refused, not cut.
    WriteFile("/etc/orloinfo.conf", "vaai_journal_rootpath=/volume1/a/very/long/journal/root\n");
    EXPECT_EQ(-1, ORLOiSCSIEpJournalRootPathGet(buf, 10, false));
    EXPECT_TRUE(log_.Contains("failed to get journal root path")) << log_.Dump();
    EXPECT_STREQ("", buf);
}

TEST_F(EpJournalTest, A128MiBSettingMakesA129MiBJournal) {
    WriteFile("/etc.defaults/orloinfo.conf", "vaai_journal_size_in_megabyte=\"128\"\nvaai_journal_compression=\"2\"\n");
    WriteFile("/etc/orloinfo.conf", "vaai_journal_compression=\"1\"\n");
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate()) << log_.Dump();
    EXPECT_EQ(129 << 20, eptest::SizeOf(Real(kJnl)));
    auto head = ReadAt(Real(kJnl), 0, 128);
    EXPECT_EQ(5u, Le32(&head[16]));
    EXPECT_EQ(BlockCrc(&head[0]), Le32(&head[0]));
    EXPECT_EQ(BlockCrc(&head[64]), Le32(&head[64]));
    EXPECT_EQ(262144u, Le64(&head[68])) << "journal area in 512-byte sectors";
    auto var0 = ReadAt(Real(kJnl), 4096, 64);
    EXPECT_EQ(BlockCrc(var0.data()), Le32(&var0[0]));
    EXPECT_EQ(1u, Le32(&var0[4])) << "/etc/orloinfo.conf before the defaults";
    EXPECT_TRUE(OLIBCFileExist("/tmp/ep_journal_access.lock"));
}

TEST_F(EpJournalTest, DefaultSizeKeepingReplacingAndSwitchingOff) {
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate()) << log_.Dump();
    EXPECT_EQ(65 << 20, eptest::SizeOf(Real(kJnl))) << "64 MiB of journal and the head";
    EXPECT_EQ(131072u, Le64(ReadAt(Real(kJnl), 68, 8).data()));
    EXPECT_EQ(0u, Le32(ReadAt(Real(kJnl), 4100, 4).data())) << "no compression setting anywhere";
    std::string first = Uuid(kJnl);

    // A whole journal of the right size is kept: the kernel may still need its contents.
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate());
    EXPECT_EQ(first, Uuid(kJnl));
    EXPECT_FALSE(log_.Contains("not workable")) << log_.Dump();

    // A damaged head, or a size the setting no longer asks for, makes a new one.
    unsigned char x = 0x42;
    ASSERT_TRUE(eptest::WriteAt(Real(kJnl), 70, &x, 1));
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate());
    EXPECT_TRUE(log_.Contains("EP journal file '/var/db/iscsi/EP_JNL' is not workable, remove it")) << log_.Dump();
    std::string second = Uuid(kJnl);
    EXPECT_NE(first, second);
    WriteFile("/etc.defaults/orloinfo.conf", "vaai_journal_size_in_megabyte=1\n");
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate());
    EXPECT_EQ(2 << 20, eptest::SizeOf(Real(kJnl)));
    EXPECT_EQ(2048u, Le64(ReadAt(Real(kJnl), 68, 8).data()));
    EXPECT_NE(second, Uuid(kJnl));

    // 0 switches the journal off: nothing is made.
    ASSERT_EQ(0, unlink(Real(kJnl).c_str()));
    WriteFile("/etc.defaults/orloinfo.conf", "vaai_journal_size_in_megabyte=0\n");
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate());
    EXPECT_FALSE(Exists(kJnl));
    WriteFile("/etc.defaults/orloinfo.conf", "vaai_journal_size_in_megabyte=lots\n");
    EXPECT_EQ(18990416u, ORLOiSCSIEpJournalFileCreate());
    EXPECT_FALSE(Exists(kJnl));
}

TEST_F(EpJournalTest, NoMkdirProgramNoJournal) {
    ASSERT_EQ(0, unlink(Real("/bin/mkdir").c_str()));
    EXPECT_EQ(18990029u, ORLOiSCSIEpJournalFileCreate());
    EXPECT_TRUE(log_.Contains("Failed to do command 'mkdir -p /var/db/iscsi', ret=")) << log_.Dump();
    EXPECT_FALSE(Exists("/var/db/iscsi"));
    int fd = -1;
    EXPECT_EQ(1, OLIBCFileLockTimeByFile("/tmp/ep_journal_access.lock", 1, 0, &fd)) << "released on failure";
    OLIBCFileUnlockByFile(fd);
}

TEST_F(EpJournalTest, RootMoveStopsTheServiceCopiesStoresAndRemoves) {
    WriteFile("/etc.defaults/orloinfo.conf", "vaai_journal_size_in_megabyte=1\n");
    ASSERT_EQ(0u, ORLOiSCSIEpJournalFileCreate());
    auto original = ReadAt(Real(kJnl), 0, 8192);

    // Without the service's stop installed nothing can move.
    EXPECT_EQ(18990046u, ORLOiSCSIEpJournalRootPathChange("/volume1/jnl"));
    EXPECT_TRUE(log_.Contains("ORLOiSCSITotallyStopAndUnload() failed, err=Failed to stop service")) << log_.Dump();
    EXPECT_TRUE(Exists(kJnl));
    EXPECT_FALSE(Exists("/volume1/jnl"));

    orlo::ep::SetTotallyStopHook(CountingStop);
    gStopResult = 18990000;
    EXPECT_EQ(18990046u, ORLOiSCSIEpJournalRootPathChange("/volume1/jnl"));
    EXPECT_EQ(1, gStops);
    EXPECT_FALSE(Exists("/volume1/jnl"));

    gStopResult = 0;
    ASSERT_EQ(0u, ORLOiSCSIEpJournalRootPathChange("/volume1/jnl/")) << log_.Dump();
    EXPECT_EQ(2, gStops);
    EXPECT_FALSE(Exists(kJnl));
    EXPECT_EQ(original, ReadAt(Real("/volume1/jnl/EP_JNL"), 0, 8192));
    EXPECT_EQ(2 << 20, eptest::SizeOf(Real("/volume1/jnl/EP_JNL")));
    char buf[128];
    ASSERT_EQ(0, ORLOiSCSIEpJournalRootPathGet(buf, sizeof(buf), false));
    EXPECT_STREQ("/volume1/jnl", buf);

    // Already there: no stop.
    EXPECT_EQ(0u, ORLOiSCSIEpJournalRootPathChange("/volume1/jnl"));
    EXPECT_EQ(2, gStops);
    EXPECT_EQ(18990004u, ORLOiSCSIEpJournalRootPathChange("volume1"));
    EXPECT_EQ(18990003u, ORLOiSCSIEpJournalRootPathChange(""));
}

}  // namespace
