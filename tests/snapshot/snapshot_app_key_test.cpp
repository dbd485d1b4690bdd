// Application keys on a snapshot.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "olibc.h"
#include "snapshot_fixture.h"

namespace {

using snap_test::MakeSnap;
using snap_test::SnapshotTest;

class SnapshotAppKeyTest : public SnapshotTest {
  protected:
    static std::string KeyFile(const ORLOiSCSISnapshot &s) {
        return std::string("/tmp/iscsi/snapshot_app_lock/SN_") + s.uuid + ".app.lock";
    }
    // The keys listed, or the code of a failed listing as the only element.
    std::vector<std::string> Keys(const ORLOiSCSISnapshot &s, uint32_t *ret) {
        POLIBC_SZLIST list = OLIBCSzListAlloc(4);
        OLIBCSzListPush(&list, "kept");
        *ret = ORLOiSCSISnapshotLockedAppKeysGet(&s, &list);
        std::vector<std::string> out;
        EXPECT_STREQ("kept", OLIBCSzListGet(list, 0)) << "what the list held stays first";
        for (int i = 1; i < OLIBCSzListCount(list); ++i) out.push_back(OLIBCSzListGet(list, i));
        OLIBCSzListFree(list);
        return out;
    }
};

TEST_F(SnapshotAppKeyTest, KeysAreRegisteredOnceListedAndRemoved) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 1);
    bool held = true;
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLockedByApp(&snap, &held)) << log_.Dump();
    EXPECT_FALSE(held);
    EXPECT_FALSE(Exists(KeyFile(snap))) << "asking makes no key file";

    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&snap, "backup")) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&snap, "backup")) << log_.Dump();
    const std::string long127(127, 'k');
    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&snap, long127.c_str())) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&snap, "back")) << "a prefix is another key";
    EXPECT_EQ("backup\n" + long127 + "\nback\n", ReadFile(KeyFile(snap)));
    struct stat st;
    ASSERT_EQ(0, stat(Real(KeyFile(snap)).c_str(), &st));
    EXPECT_EQ(0600u, st.st_mode & 0777);

    uint32_t ret = 1;
    EXPECT_EQ((std::vector<std::string>{"backup", long127, "back"}), Keys(snap, &ret));
    EXPECT_EQ(0u, ret) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLockedByApp(&snap, &held));
    EXPECT_TRUE(held);

    ASSERT_EQ(0u, ORLOiSCSISnapshotUnlockByAppKey(&snap, "backup")) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnlockByAppKey(&snap, "backup")) << "a key not there is no error";
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnlockByAppKey(&snap, long127.c_str()));
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnlockByAppKey(&snap, "back"));
    EXPECT_EQ("", ReadFile(KeyFile(snap)));
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLockedByApp(&snap, &held));
    EXPECT_FALSE(held);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    // Another snapshot's keys are its own.
    ORLOiSCSISnapshot other = MakeSnap(3, 2);
    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&other, "replication"));
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLockedByApp(&snap, &held));
    EXPECT_FALSE(held);
}

TEST_F(SnapshotAppKeyTest, AKeyFileWithALineThatCannotBeAKeyIsRefusedWhole) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 1);
    const std::string line128(128, 'x');
    WriteFile(KeyFile(snap), "good\n" + line128 + "\n", 0600);
    uint32_t ret = 0;
    EXPECT_TRUE(Keys(snap, &ret).empty());
    EXPECT_EQ(18990008u, ret);
    EXPECT_TRUE(log_.Contains("iscsi_snapshot_locked_app_keys_get.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Bad string length. string: " + line128 + ", length: 128")) << log_.Dump();
    bool held = false;
    log_.Clear();
    EXPECT_EQ(18990008u, ORLOiSCSISnapshotIsLockedByApp(&snap, &held));
    EXPECT_TRUE(log_.Contains(std::string("Failed to get locked app key for snapshot: ") + snap.uuid + "."))
        << log_.Dump();

    WriteFile(KeyFile(snap), "good\n\nother\n", 0600);  // an empty line
    EXPECT_TRUE(Keys(snap, &ret).empty());
    EXPECT_EQ(18990008u, ret);
    // The last line may lack its newline.
    WriteFile(KeyFile(snap), "good\nother", 0600);
    EXPECT_EQ((std::vector<std::string>{"good", "other"}), Keys(snap, &ret));
    EXPECT_EQ(0u, ret);
    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&snap, "third"));
    EXPECT_EQ("good\nother\nthird\n", ReadFile(KeyFile(snap)));
}

TEST_F(SnapshotAppKeyTest, BadKeysAndKeyFilesThatAreNotFiles) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 1);
    const std::string long128(128, 'k');
    for (const char *key : {"", long128.c_str(), "a\nb", "a\r"}) {
        log_.Clear();
        EXPECT_EQ(18990524u, ORLOiSCSISnapshotLockByAppKey(&snap, key)) << key;
        EXPECT_EQ(18990524u, ORLOiSCSISnapshotUnlockByAppKey(&snap, key)) << key;
        EXPECT_EQ(2u, log_.Lines().size()) << log_.Dump();
        EXPECT_EQ(std::string::npos, log_.Dump().find("a\nb"));
    }
    EXPECT_FALSE(Exists(KeyFile(snap)));
    EXPECT_EQ(18990003u, ORLOiSCSISnapshotLockByAppKey(&snap, nullptr));
    EXPECT_EQ(18990003u, ORLOiSCSISnapshotLockByAppKey(nullptr, "k"));
    POLIBC_SZLIST none = nullptr;
    log_.Clear();
    EXPECT_EQ(18990003u, ORLOiSCSISnapshotLockedAppKeysGet(&snap, &none));
    EXPECT_TRUE(log_.Contains("BAD parameters")) << log_.Dump();

    // A symbolic link where the key file belongs is neither followed nor replaced.
    WriteFile("/tmp/elsewhere", "precious\n");
    ASSERT_EQ(0, symlink(Real("/tmp/elsewhere").c_str(), Real(KeyFile(snap)).c_str()));
    log_.Clear();
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotLockByAppKey(&snap, "k"));
    EXPECT_TRUE(log_.Contains("It is a symbolic link")) << log_.Dump();
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotUnlockByAppKey(&snap, "precious"));
    EXPECT_EQ("precious\n", ReadFile("/tmp/elsewhere"));
}

}  // namespace
