// Storing a target record that has not changed leaves the target file as it is, CHAP
// secrets included (their stored form is kept, not enciphered anew), while any real
// change, a new secret among them, is written and reads back.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>

#include "olibc.h"
#include "target/target_fixture.h"

namespace {

using namespace target_test;

class TargetConfUnchangedTest : public TargetTest {
  protected:
    ino_t Inode() {
        struct stat st {};
        EXPECT_EQ(0, lstat(Real(kTargetConf).c_str(), &st));
        return st.st_ino;
    }
    ORLOiSCSITarget Stored(int tid) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        EXPECT_EQ(0u, ORLOiSCSITargetGetByTid(tid, 0, &t)) << log_.Dump();
        return t;
    }
};

TEST_F(TargetConfUnchangedTest, AnUnchangedRecordIsNotWrittenAgain) {
    ORLOiSCSITarget plain = MakeTarget(1);
    ORLOiSCSITarget chap = MakeTarget(2);
    chap.auth_type = ORLO_ISCSI_AUTH_MUTUAL_CHAP;
    snprintf(chap.user, sizeof(chap.user), "user");
    snprintf(chap.password, sizeof(chap.password), "secret-abcdef");
    snprintf(chap.mutual_user, sizeof(chap.mutual_user), "back");
    snprintf(chap.mutual_password, sizeof(chap.mutual_password), "other-secret1");
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&plain));
    ASSERT_EQ(0u, ORLOiSCSITargetConfAdd(&chap));
    const std::string before = ReadFile(kTargetConf);
    const ino_t inode = Inode();

    EXPECT_EQ(0u, ORLOiSCSITargetConfUpdate(&plain)) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSITargetConfUpdate(&chap)) << log_.Dump();
    EXPECT_EQ(0u, ORLOiSCSITargetConfAdd(&chap)) << log_.Dump();
    EXPECT_EQ(inode, Inode());
    EXPECT_EQ(before, ReadFile(kTargetConf));

    // A new secret is enciphered and stored; the other keeps its stored form.
    const std::string mutualLine = before.substr(before.find("\tmutual_password=~"));
    snprintf(chap.password, sizeof(chap.password), "secret-ABCDEF");
    EXPECT_EQ(0u, ORLOiSCSITargetConfUpdate(&chap)) << log_.Dump();
    EXPECT_NE(inode, Inode());
    const std::string after = ReadFile(kTargetConf);
    EXPECT_NE(before, after);
    EXPECT_EQ(mutualLine.substr(0, mutualLine.find('\n')),
              after.substr(after.find("\tmutual_password=~")).substr(0, mutualLine.find('\n')));
    ORLOiSCSITarget back = Stored(2);
    EXPECT_STREQ("secret-ABCDEF", back.password);
    EXPECT_STREQ("other-secret1", back.mutual_password);

    // A stored form that no longer deciphers is replaced, not kept.
    std::string broken = after;
    size_t at = broken.find("\tpassword=~") + 12;
    broken[at] = broken[at] == 'A' ? 'B' : 'A';
    WriteFile(kTargetConf, broken);
    EXPECT_EQ(0u, ORLOiSCSITargetConfUpdate(&chap)) << log_.Dump();
    EXPECT_STREQ("secret-ABCDEF", Stored(2).password);

    // Other fields: a change is written.
    const ino_t beforeRename = Inode();
    snprintf(plain.name, sizeof(plain.name), "Renamed");
    EXPECT_EQ(0u, ORLOiSCSITargetConfUpdate(&plain));
    EXPECT_NE(beforeRename, Inode());
    EXPECT_STREQ("Renamed", Stored(1).name);
}

}  // namespace
