// The LUN lock across processes and the progress file it publishes.
#include <gtest/gtest.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "lun_fixture.h"

namespace {

using lun_test::LockHolder;
using lun_test::LunTest;
using lun_test::MakeLun;
using lun_test::UuidOf;

double Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

class LunLockTest : public LunTest {
  protected:
    std::string ProgressPath(int lid) const { return "/tmp/iscsi/LUN_" + UuidOf(lid) + ".progress"; }
};

TEST_F(LunLockTest, LockPublishesTheProgressFileAndUnlockRemovesIt) {
    ORLOiSCSILun lun = MakeLun(5, ORLO_ISCSI_LUN_TYPE_THIN);
    ASSERT_EQ(0u, ORLOiSCSILunLock(&lun, 7)) << log_.Dump();
    EXPECT_GT(lun.lockHandle, 0);
    EXPECT_TRUE(Exists("/tmp/iscsi/lun_lock/LUN_" + UuidOf(5) + ".lock"));
    EXPECT_EQ("lid=5\npid=" + std::to_string(getpid()) +
                  "\nstep=7\ntotal_bytes=5368709120\norg_path=/volume1\nnew_path=/volume1\nname=LUN-5\n",
              ReadFile(ProgressPath(5)));

    // Another record of the same LUN (another holder, as far as the lock is concerned)
    // sees the operation.
    ORLOiSCSILun other = lun;
    other.lockHandle = -1;
    ORLOiSCSILunProgress progress;
    ASSERT_EQ(0u, ORLOiSCSILunProgressGet(&other, &progress)) << log_.Dump();
    EXPECT_EQ(1, progress.isLocked);
    EXPECT_EQ(1, progress.hasProgress);
    EXPECT_EQ(5, progress.lid);
    EXPECT_EQ(getpid(), progress.pid);
    EXPECT_EQ(7, progress.step);
    EXPECT_EQ(5368709120ull, progress.totalBytes);
    EXPECT_STREQ("/volume1", progress.orgPath);
    EXPECT_STREQ("/volume1", progress.newPath);
    EXPECT_STREQ("LUN-5", progress.name);
    int locked = 0;
    ASSERT_EQ(0u, ORLOiSCSILunIsLocked(&other, &locked));
    EXPECT_EQ(1, locked);

    ASSERT_EQ(0u, ORLOiSCSILunUnlock(&lun)) << log_.Dump();
    EXPECT_EQ(-1, lun.lockHandle);
    EXPECT_FALSE(Exists(ProgressPath(5)));
    ASSERT_EQ(0u, ORLOiSCSILunProgressGet(&other, &progress));
    EXPECT_EQ(0, progress.isLocked);
    EXPECT_EQ(0, progress.hasProgress);
    EXPECT_FALSE(Exists(ProgressPath(5))) << "reading makes no progress file";
    ASSERT_EQ(0u, ORLOiSCSILunIsLocked(&other, &locked));
    EXPECT_EQ(0, locked);

    // Unlocking a record that holds nothing is logged and succeeds.
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSILunUnlock(&lun));
    EXPECT_TRUE(log_.Contains("iscsi_lun_unlock.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("LUN is not locked. lid: 5, name: LUN-5")) << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSILunLock(nullptr, 3));
}

TEST_F(LunLockTest, TheByteTotalDependsOnTypeAndStep) {
    ORLOiSCSILun adv = MakeLun(6, ORLO_ISCSI_LUN_TYPE_ADV);
    for (int step : {3, 5, 6}) {
        ASSERT_EQ(0u, ORLOiSCSILunLock(&adv, step)) << log_.Dump();
        EXPECT_NE(std::string::npos, ReadFile(ProgressPath(6)).find("\ntotal_bytes=0\n")) << "step " << step;
        ASSERT_EQ(0u, ORLOiSCSILunUnlock(&adv));
    }

    // Other steps of an advanced LUN ask the extent pool what its map file maps; when that
    // fails the lock is given back and no progress file is left.
    log_.Clear();
    EXPECT_EQ(18990414u, ORLOiSCSILunLock(&adv, 8));
    EXPECT_EQ(-1, adv.lockHandle);
    const std::string mapPath = "/volume1/@iSCSI/LUN/ADV/" + UuidOf(6) + "/" + UuidOf(6) + "_00000";
    EXPECT_TRUE(log_.Contains("ORLOiSCSIEpMapFileMappedSizeGet(\"" + mapPath + "\", \"/volume1\", ")) << log_.Dump();
    EXPECT_FALSE(Exists(ProgressPath(6)));
    ORLOiSCSILun again = adv;
    ASSERT_EQ(0u, ORLOiSCSILunLock(&again, 3)) << "the failed lock was released";
    ASSERT_EQ(0u, ORLOiSCSILunUnlock(&again));
}

TEST_F(LunLockTest, UnsynchronisedLunUsesItsOwnLockAndNoProgressFile) {
    ORLOiSCSILun lun = MakeLun(9, ORLO_ISCSI_LUN_TYPE_FILE);
    lun.stateFlags = ORLO_ISCSI_LUN_STATE_UNSYNC;
    LockHolder holder;
    ASSERT_TRUE(holder.Start(lun, 3));
    EXPECT_TRUE(Exists("/tmp/iscsi/lun_unsync/LUN_" + UuidOf(9) + "_unsync.lock"));
    EXPECT_FALSE(Exists("/tmp/iscsi/lun_lock/LUN_" + UuidOf(9) + ".lock"));
    EXPECT_FALSE(Exists(ProgressPath(9)));
    int locked = 0;
    ASSERT_EQ(0u, ORLOiSCSILunIsLocked(&lun, &locked));
    EXPECT_EQ(1, locked);
    // The same LUN in sync is another lock.
    ORLOiSCSILun synced = lun;
    synced.stateFlags = 0;
    ASSERT_EQ(0u, ORLOiSCSILunIsLocked(&synced, &locked));
    EXPECT_EQ(0, locked);
    EXPECT_EQ(0, holder.Finish('u'));
    EXPECT_FALSE(Exists(ProgressPath(9)));
    ASSERT_EQ(0u, ORLOiSCSILunIsLocked(&lun, &locked));
    EXPECT_EQ(0, locked);
}

TEST_F(LunLockTest, ProgressFileOfADeadHolderIsStaleNotLocked) {
    ORLOiSCSILun lun = MakeLun(10, ORLO_ISCSI_LUN_TYPE_FILE);
    LockHolder holder;
    ASSERT_TRUE(holder.Start(lun, 3));
    pid_t child = holder.pid();
    EXPECT_EQ(0, holder.Finish('d'));  // exits without unlocking
    ORLOiSCSILunProgress progress;
    ASSERT_EQ(0u, ORLOiSCSILunProgressGet(&lun, &progress)) << log_.Dump();
    EXPECT_EQ(1, progress.hasProgress);
    EXPECT_EQ(child, progress.pid);
    EXPECT_EQ(0, progress.isLocked) << "the kernel dropped the dead holder's lock";
    // The next lock overwrites the stale file.
    ASSERT_EQ(0u, ORLOiSCSILunLock(&lun, 4));
    ASSERT_EQ(0u, ORLOiSCSILunProgressGet(&lun, &progress));
    EXPECT_EQ(getpid(), progress.pid);
    EXPECT_EQ(4, progress.step);
    ASSERT_EQ(0u, ORLOiSCSILunUnlock(&lun));
}

TEST_F(LunLockTest, WaitUntilUnlockReturnsWhenTheOtherProcessUnlocksOrAfterItsRealTimeout) {
    ORLOiSCSILun lun = MakeLun(11, ORLO_ISCSI_LUN_TYPE_FILE);
    EXPECT_EQ(0u, ORLOiSCSILunWaitUntilUnlock(&lun, 1)) << "a LUN never locked is not waited for";
    LockHolder holder;
    ASSERT_TRUE(holder.Start(lun, 3));
    log_.Clear();
    EXPECT_EQ(18990010u, ORLOiSCSILunWaitUntilUnlock(&lun, 1));
    EXPECT_TRUE(log_.Contains("LUN is still locked after 1 seconds. lid: 11, name: LUN-11")) << log_.Dump();

    holder.FinishLater();  // unlocks 1.5 seconds from now
    double start = Now();
    EXPECT_EQ(0u, ORLOiSCSILunWaitUntilUnlock(&lun, 0)) << log_.Dump();
    double waited = Now() - start;
    EXPECT_GE(waited, 1.0);
    EXPECT_LT(waited, 5.0);
    EXPECT_EQ(0, holder.Join());
    EXPECT_FALSE(Exists(ProgressPath(11)));
    EXPECT_EQ(18990201u, ORLOiSCSILunWaitUntilUnlock(nullptr, 0));
}

TEST_F(LunLockTest, BusyLockFailsAfterTheRealFiveSecondTimeoutExceptForStep5) {
    ORLOiSCSILun lun = MakeLun(12, ORLO_ISCSI_LUN_TYPE_FILE);
    LockHolder holder;
    ASSERT_TRUE(holder.Start(lun, 3));
    const std::string held = ReadFile(ProgressPath(12));

    double start = Now();
    EXPECT_EQ(18990535u, ORLOiSCSILunLock(&lun, 3));
    double waited = Now() - start;
    EXPECT_GE(waited, 4.9);
    EXPECT_LT(waited, 8.0);
    EXPECT_EQ(-1, lun.lockHandle);
    EXPECT_TRUE(log_.Contains("Failed to lock file: /tmp/iscsi/lun_lock/LUN_" + UuidOf(12) + ".lock.")) << log_.Dump();

    // Step 5 goes on without the lock, leaving the holder's progress alone.
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSILunLock(&lun, 5));
    EXPECT_EQ(-1, lun.lockHandle);
    EXPECT_EQ(held, ReadFile(ProgressPath(12)));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
    EXPECT_EQ(0, holder.Finish('u'));
}

}  // namespace
