// The pool's three locks: their files, that they keep another process out for as long
// as they are held, the clean-up forms of release, and the scope guards.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <stdexcept>
#include <string>

#include "ep_internal.h"
#include "olibc.h"
#include "orloiscsi_ep.h"
#include "support/sandbox.h"

namespace {

class EpLockTest : public orlotest::SandboxTest {
  protected:
    // Whether another process could take the lock file right now (without waiting).
    bool OtherProcessCanLock(const char *path) {
        pid_t pid = fork();
        if (pid == 0) {
            int h = -1;
            _exit(OLIBCFileLockTimeByFile(path, 1, 0, &h) == 1 ? 0 : 1);
        }
        int status = 0;
        waitpid(pid, &status, 0);
        return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    }
    int Mode(const std::string &logical) {
        struct stat st;
        return ::stat(Real(logical).c_str(), &st) == 0 ? static_cast<int>(st.st_mode & 07777) : -1;
    }
};

TEST_F(EpLockTest, EachLockHasItsFileAndKeepsOthersOut) {
    int32_t pool = -1, journal = -1, trash = -1;
    ASSERT_EQ(0u, ORLOiSCSIEpLock(&pool, 3));
    ASSERT_EQ(0u, ORLOiSCSIEpJournalLock(&journal));
    ASSERT_EQ(0u, ORLOiSCSIEpTrashLock(&trash, "/volume2"));
    EXPECT_GE(pool, 0);
    EXPECT_GE(journal, 0);
    EXPECT_GE(trash, 0);
    for (const char *f : {"/tmp/ep_pool_3_access.lock", "/tmp/ep_journal_access.lock",
                          "/tmp/ep_trash_volume2_unmap_all.lock"}) {
        EXPECT_EQ(0600, Mode(f)) << f;
        EXPECT_FALSE(OtherProcessCanLock(f)) << f << " is held";
    }
    EXPECT_TRUE(OtherProcessCanLock("/tmp/ep_pool_4_access.lock")) << "one lock per volume";

    EXPECT_EQ(0u, ORLOiSCSIEpUnlock(pool));
    EXPECT_EQ(0u, ORLOiSCSIEpJournalUnlock(journal));
    EXPECT_EQ(0u, ORLOiSCSIEpTrashUnlock(trash));
    for (const char *f : {"/tmp/ep_pool_3_access.lock", "/tmp/ep_journal_access.lock",
                          "/tmp/ep_trash_volume2_unmap_all.lock"})
        EXPECT_TRUE(OtherProcessCanLock(f)) << f << " is free again";

    // Nothing held: pool and journal release quietly, the trash release says so.
    EXPECT_EQ(0u, ORLOiSCSIEpUnlock(-1));
    EXPECT_EQ(0u, ORLOiSCSIEpJournalUnlock(-1));
    EXPECT_EQ(18990003u, ORLOiSCSIEpTrashUnlock(-1));
    // A descriptor that is no lock any more.
    EXPECT_EQ(18990016u, ORLOiSCSIEpJournalUnlock(journal));
}

TEST_F(EpLockTest, BadArgumentsAndUnlockableFiles) {
    int32_t fd = 5;
    EXPECT_EQ(18990003u, ORLOiSCSIEpLock(nullptr, 1));
    EXPECT_EQ(18990003u, ORLOiSCSIEpJournalLock(nullptr));
    for (const char *bad : {"volume2", "/", "/volume2/x", "/..", ""}) {
        EXPECT_EQ(18990004u, ORLOiSCSIEpTrashLock(&fd, bad)) << bad;
    }
    EXPECT_EQ(18990004u, ORLOiSCSIEpTrashLock(&fd, nullptr));
    EXPECT_EQ(18990004u, ORLOiSCSIEpTrashLock(nullptr, "/volume2"));

    // A lock file that cannot be opened: refused, logged with the path, fd left at -1.
    ASSERT_EQ(0, mkdir(Real("/tmp/ep_pool_7_access.lock").c_str(), 0700));
    log_.Clear();
    EXPECT_EQ(18990015u, ORLOiSCSIEpLock(&fd, 7));
    EXPECT_EQ(-1, fd);
    EXPECT_TRUE(log_.Contains("Failed to lock file: /tmp/ep_pool_7_access.lock.")) << log_.Dump();
}

TEST_F(EpLockTest, TrashCleanUnlockMayRunOnEveryWayOut) {
    int32_t fd = -1;
    ASSERT_EQ(0u, ORLOiSCSIEpTrashLock(&fd, "/volume1"));
    EXPECT_EQ(0u, ORLOiSCSIEpTrashCleanUnlock(&fd));
    EXPECT_EQ(-1, fd);
    EXPECT_TRUE(OtherProcessCanLock("/tmp/ep_trash_volume1_unmap_all.lock"));
    EXPECT_EQ(0u, ORLOiSCSIEpTrashCleanUnlock(&fd)) << "a second call does nothing";
    EXPECT_EQ(18990003u, ORLOiSCSIEpTrashCleanUnlock(nullptr));
}

TEST_F(EpLockTest, GuardsHoldForTheirScopeAndThrowWhenTheyCannotLock) {
    {
        ORLOiSCSIEpLockGuard byNumber(2);
        EXPECT_FALSE(OtherProcessCanLock("/tmp/ep_pool_2_access.lock"));
        ORLOiSCSIEpJournalLockGuard journal;
        EXPECT_FALSE(OtherProcessCanLock("/tmp/ep_journal_access.lock"));
    }
    EXPECT_TRUE(OtherProcessCanLock("/tmp/ep_pool_2_access.lock"));
    EXPECT_TRUE(OtherProcessCanLock("/tmp/ep_journal_access.lock"));
    {
        ORLOiSCSIEpLockGuard byPath("/volume1");
        EXPECT_FALSE(OtherProcessCanLock("/tmp/ep_pool_1_access.lock"));
    }
    EXPECT_TRUE(OtherProcessCanLock("/tmp/ep_pool_1_access.lock"));

    // Released also when the scope is left by an exception.
    try {
        ORLOiSCSIEpLockGuard g(5);
        throw 1;
    } catch (int) {
    }
    EXPECT_TRUE(OtherProcessCanLock("/tmp/ep_pool_5_access.lock"));

    try {
        ORLOiSCSIEpLockGuard g("/srv/data");
        ADD_FAILURE() << "a path on no volume has no pool lock";
    } catch (const std::runtime_error &e) {
        EXPECT_STREQ("ORLOiSCSIEpLockGuard()", e.what());
    }
    EXPECT_TRUE(log_.Contains("ORLOVolIDParse(\"/srv/data\") failed")) << log_.Dump();

    ASSERT_EQ(0, mkdir(Real("/tmp/ep_pool_6_access.lock").c_str(), 0700));
    try {
        ORLOiSCSIEpLockGuard g(6);
        ADD_FAILURE() << "the lock file cannot be opened";
    } catch (const std::runtime_error &e) {
        EXPECT_STREQ("ORLOiSCSIEpLockGuard()", e.what());
    }
    // The journal's lock file, made by the guard above, replaced by a directory.
    ASSERT_EQ(0, unlink(Real("/tmp/ep_journal_access.lock").c_str()));
    ASSERT_EQ(0, mkdir(Real("/tmp/ep_journal_access.lock").c_str(), 0700));
    try {
        ORLOiSCSIEpJournalLockGuard g;
        ADD_FAILURE() << "the lock file cannot be opened";
    } catch (const std::runtime_error &e) {
        EXPECT_STREQ("ORLOiSCSIEpJournalLockGuard()", e.what());
    }
}

}  // namespace
