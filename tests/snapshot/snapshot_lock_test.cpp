// The snapshot operation lock across processes and the progress file it publishes.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "snapshot_fixture.h"

namespace {

using snap_test::MakeSnap;
using snap_test::SnapLockHolder;
using snap_test::SnapshotTest;

double Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

class SnapshotLockTest : public SnapshotTest {
  protected:
    static std::string ProgressPath(const ORLOiSCSISnapshot &s) {
        return std::string("/tmp/iscsi/SN_") + s.uuid + ".progress";
    }
    static std::string LockPath(const ORLOiSCSISnapshot &s) {
        return std::string("/tmp/iscsi/snapshot_lock/SN_") + s.uuid + ".lock";
    }
};

TEST_F(SnapshotLockTest, LockPublishesTheStepAndUnlockTakesItBack) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 7);
    ASSERT_EQ(0u, ORLOiSCSISnapshotLock(&snap, ORLO_ISCSI_SNAPSHOT_STEP_CREATE)) << log_.Dump();
    EXPECT_GT(snap.lock_fd, 0);
    EXPECT_TRUE(Exists(LockPath(snap)));
    EXPECT_EQ("lid=3\nsid=7\nstep=0\nname=SnapShot-7\ntotalBytes=10737418247\n", ReadFile(ProgressPath(snap)));

    // Another record of the same snapshot sees the operation.
    ORLOiSCSISnapshot other = snap;
    other.lock_fd = -1;
    ORLOiSCSISnapshotProgress progress;
    ASSERT_EQ(0u, ORLOiSCSISnapshotProgressGet(&other, &progress)) << log_.Dump();
    EXPECT_EQ(1, progress.isLocked);
    EXPECT_EQ(1, progress.hasProgress);
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_STEP_CREATE, progress.step);
    EXPECT_EQ(3, progress.lid);
    EXPECT_EQ(7, progress.sid);
    EXPECT_EQ(10737418247ull, progress.totalBytes);
    EXPECT_STREQ("SnapShot-7", progress.name);
    bool locked = false;
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&other, &locked));
    EXPECT_TRUE(locked);

    ASSERT_EQ(0u, ORLOiSCSISnapshotUnlock(&snap)) << log_.Dump();
    EXPECT_EQ(-1, snap.lock_fd);
    EXPECT_FALSE(Exists(ProgressPath(snap)));
    ASSERT_EQ(0u, ORLOiSCSISnapshotProgressGet(&other, &progress));
    EXPECT_EQ(0, progress.isLocked);
    EXPECT_EQ(0, progress.hasProgress);
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_STEP_IDLE, progress.step);
    EXPECT_FALSE(Exists(ProgressPath(snap))) << "reading makes no progress file";
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&other, &locked));
    EXPECT_FALSE(locked);
    EXPECT_EQ(0u, ORLOiSCSISnapshotWaitUntilUnlock(&other, 1));

    // Unlocking a record that holds nothing is logged and succeeds.
    log_.Clear();
    EXPECT_EQ(0u, ORLOiSCSISnapshotUnlock(&snap));
    EXPECT_TRUE(log_.Contains("iscsi_snapshot_unlock.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains(std::string("Snapshot is not locked. sid: 7, name: SnapShot-7, UUID: ") + snap.uuid))
        << log_.Dump();
    EXPECT_EQ(18990003u, ORLOiSCSISnapshotLock(nullptr, 0));
    EXPECT_EQ(18990201u, ORLOiSCSISnapshotWaitUntilUnlock(nullptr, 0));
    ORLOiSCSISnapshot bad = MakeSnap(3, 8);
    snprintf(bad.uuid, sizeof(bad.uuid), "../x");
    EXPECT_EQ(18990520u, ORLOiSCSISnapshotLock(&bad, 0));
}

TEST_F(SnapshotLockTest, AKilledHoldersProgressFileDoesNotKeepTheSnapshotLocked) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 1);
    SnapLockHolder holder;
    ASSERT_TRUE(holder.Start(snap, ORLO_ISCSI_SNAPSHOT_STEP_DELETE));
    ORLOiSCSISnapshotProgress progress;
    ASSERT_EQ(0u, ORLOiSCSISnapshotProgressGet(&snap, &progress));
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_STEP_DELETE, progress.step);
    EXPECT_EQ(0, holder.Finish('d'));  // exits without unlocking
    ASSERT_TRUE(Exists(ProgressPath(snap)));
    ASSERT_EQ(0u, ORLOiSCSISnapshotProgressGet(&snap, &progress)) << log_.Dump();
    EXPECT_EQ(1, progress.hasProgress) << "the file is still there";
    EXPECT_EQ(0, progress.isLocked) << "the kernel dropped the dead holder's lock";
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_STEP_IDLE, progress.step);
    bool locked = true;
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&snap, &locked));
    EXPECT_FALSE(locked);
    EXPECT_EQ(0u, ORLOiSCSISnapshotWaitUntilUnlock(&snap, 2));
    // The next lock overwrites the stale file.
    ASSERT_EQ(0u, ORLOiSCSISnapshotLock(&snap, 9));
    ASSERT_EQ(0u, ORLOiSCSISnapshotProgressGet(&snap, &progress));
    EXPECT_EQ(9, progress.step);
    ASSERT_EQ(0u, ORLOiSCSISnapshotUnlock(&snap));
}

TEST_F(SnapshotLockTest, UnsynchronisedSnapshotHasItsOwnLockAndNoProgressFile) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 2);
    snap.conf_flags = ORLO_ISCSI_SNAPSHOT_CONF_UNSYNC;
    SnapLockHolder holder;
    ASSERT_TRUE(holder.Start(snap, 0));
    EXPECT_TRUE(Exists(std::string("/tmp/iscsi/snapshot_unsync_lock/SN_") + snap.uuid + "_unsync.lock"));
    EXPECT_FALSE(Exists(LockPath(snap)));
    EXPECT_FALSE(Exists(ProgressPath(snap)));
    ORLOiSCSISnapshotProgress progress;
    ASSERT_EQ(0u, ORLOiSCSISnapshotProgressGet(&snap, &progress));
    EXPECT_EQ(1, progress.isLocked);
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_STEP_UNKNOWN, progress.step);
    bool locked = false;
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&snap, &locked));
    EXPECT_TRUE(locked);
    ORLOiSCSISnapshot synced = snap;
    synced.conf_flags = 0;
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&synced, &locked));
    EXPECT_FALSE(locked) << "the snapshot in sync is another lock";
    EXPECT_EQ(0, holder.Finish('u'));
    ASSERT_EQ(0u, ORLOiSCSISnapshotIsLocked(&snap, &locked));
    EXPECT_FALSE(locked);
}

TEST_F(SnapshotLockTest, ALockFileThatIsNotARegularFileIsNotABusySnapshot) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 3);
    ASSERT_EQ(0, mkdir(Real(LockPath(snap)).c_str(), 0700));
    for (int step : {ORLO_ISCSI_SNAPSHOT_STEP_CREATE, ORLO_ISCSI_SNAPSHOT_STEP_DELETE}) {
        log_.Clear();
        double start = Now();
        EXPECT_EQ(18990015u, ORLOiSCSISnapshotLock(&snap, step)) << "step " << step;
        EXPECT_LT(Now() - start, 2.0) << "nothing to wait for";
        EXPECT_EQ(-1, snap.lock_fd);
        EXPECT_TRUE(log_.Contains("Failed to lock file: " + LockPath(snap) + ". It is a directory")) << log_.Dump();
        EXPECT_FALSE(Exists(ProgressPath(snap)));
    }
    bool locked = false;
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotIsLocked(&snap, &locked));
    EXPECT_TRUE(log_.Contains("Failed to get snapshot progress. name: SnapShot-3")) << log_.Dump();
    log_.Clear();
    EXPECT_EQ(18990015u, ORLOiSCSISnapshotWaitUntilUnlock(&snap, 0));
    EXPECT_TRUE(log_.Contains("Failed to check if snapshot is locked. sid: 3, name: SnapShot-3")) << log_.Dump();
}

TEST_F(SnapshotLockTest, BusyLockRefusesCreationAfterTheRealFiveSecondsAndLetsDeletionThrough) {
    ORLOiSCSISnapshot snap = MakeSnap(3, 4);
    SnapLockHolder holder;
    ASSERT_TRUE(holder.Start(snap, ORLO_ISCSI_SNAPSHOT_STEP_CREATE));
    const std::string held = ReadFile(ProgressPath(snap));

    double start = Now();
    EXPECT_EQ(18990547u, ORLOiSCSISnapshotLock(&snap, ORLO_ISCSI_SNAPSHOT_STEP_CREATE));
    double waited = Now() - start;
    EXPECT_GE(waited, 4.9);
    EXPECT_LT(waited, 8.0);
    EXPECT_EQ(-1, snap.lock_fd);
    EXPECT_TRUE(log_.Contains("iscsi_snapshot_lock.cpp:")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("Failed to lock file: " + LockPath(snap) + ".")) << log_.Dump();

    // A deletion waits as long, then goes on without the lock and without touching the
    // holder's progress file.
    log_.Clear();
    start = Now();
    EXPECT_EQ(0u, ORLOiSCSISnapshotLock(&snap, ORLO_ISCSI_SNAPSHOT_STEP_DELETE));
    EXPECT_GE(Now() - start, 4.9);
    EXPECT_EQ(-1, snap.lock_fd);
    EXPECT_EQ(held, ReadFile(ProgressPath(snap)));
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();

    // Waiting with a time-out of 3 seconds gives up; waiting without one ends when the
    // holder lets go.
    start = Now();
    EXPECT_EQ(18990010u, ORLOiSCSISnapshotWaitUntilUnlock(&snap, 3));
    waited = Now() - start;
    EXPECT_GE(waited, 2.9);
    EXPECT_LT(waited, 6.0);
    EXPECT_TRUE(log_.Contains("Snapshot is still locked after 3 seconds. sid: 4, name: SnapShot-4")) << log_.Dump();
    holder.Tell('l');  // unlocks 1.5 seconds from now
    start = Now();
    EXPECT_EQ(0u, ORLOiSCSISnapshotWaitUntilUnlock(&snap, 0)) << log_.Dump();
    waited = Now() - start;
    EXPECT_GE(waited, 1.0);
    EXPECT_LT(waited, 5.0);
    EXPECT_EQ(0, holder.Join());
    EXPECT_FALSE(Exists(ProgressPath(snap)));
}

}  // namespace
