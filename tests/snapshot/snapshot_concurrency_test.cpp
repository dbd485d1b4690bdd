// Processes adding snapshot records side by side: each chooses a sid, a default name and
// a UUID and writes the record as one step under the LUN's snapshot file lock.  Nothing
// may be chosen twice, and the LUNs' files and the cache must end up agreeing.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <map>
#include <set>
#include <string>
#include <vector>

#include "snapshot_fixture.h"

namespace {

using snap_test::MakeLun;
using snap_test::MakeSnap;
using snap_test::Records;
using snap_test::SectionText;
using snap_test::SnapshotTest;

constexpr int kProcesses = 4;
constexpr int kLuns = 4;
constexpr int kAddsPerProcess = 50;

// One writer: kAddsPerProcess records, round robin over the LUNs.  Exit status 0 when
// every add succeeded.
int Writer(int id) {
    for (int i = 0; i < kAddsPerProcess; ++i) {
        ORLOiSCSILun lun = MakeLun(1 + (i + id) % kLuns);
        ORLOiSCSISnapshotConfLockGuard guard(&lun);
        if (!guard.held()) return 10;
        ORLOiSCSISnapshot s = MakeSnap(lun.lid, 0);
        s.sid = ORLOiSCSISnapshotUnusedSidFind(&lun, nullptr);
        if (s.sid < 1) return 11;
        if (ORLOiSCSISnapshotUnusedNameFind(lun.lid, s.name, sizeof(s.name)) != 0) return 12;
        memset(s.uuid, 0, sizeof(s.uuid));
        if (ORLOiSCSISnapshotUuidGenerate(s.uuid) != 0) return 13;
        snprintf(s.taken_by, sizeof(s.taken_by), "writer-%d", id);
        if (ORLOiSCSISnapshotConfAdd(&s) != 0) return 14;
    }
    return 0;
}

class SnapshotConcurrencyTest : public SnapshotTest {};

TEST_F(SnapshotConcurrencyTest, FourProcessesAddingTwoHundredRecordsChooseNothingTwice) {
    AddLuns({1, 2, 3, 4});
    std::vector<pid_t> pids;
    for (int id = 0; id < kProcesses; ++id) {
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) _exit(Writer(id));
        pids.push_back(pid);
    }
    for (pid_t pid : pids) {
        int status = 0;
        ASSERT_EQ(pid, waitpid(pid, &status, 0));
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
    }

    ORLOiSCSISnapshotFilter all = {};
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoad(&all, &list_)) << log_.Dump();
    std::vector<ORLOiSCSISnapshot> got = Records(&list_);
    ASSERT_EQ(static_cast<size_t>(kProcesses * kAddsPerProcess), got.size());
    std::map<int, std::set<int>> sids;
    std::map<int, std::set<std::string>> names;
    std::set<std::string> uuids;
    std::map<std::string, std::string> cacheText;  // cache file -> what it should hold
    for (const ORLOiSCSISnapshot &s : got) {
        EXPECT_TRUE(sids[s.lid].insert(s.sid).second) << "sid " << s.sid << " twice in LUN " << s.lid;
        EXPECT_TRUE(names[s.lid].insert(s.name).second) << s.name << " twice in LUN " << s.lid;
        EXPECT_TRUE(uuids.insert(s.uuid).second) << s.uuid;
        // Every record has its copy in the cache, equal to the LUN file's.
        ORLOiSCSISnapshot cached;
        ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &cached)) << log_.Dump();
        snap_test::ExpectSameRecord(s, cached);
    }
    for (int lid = 1; lid <= kLuns; ++lid) {
        // 50 records per LUN, given sids 1..50 and names SnapShot-1..50.
        ASSERT_EQ(static_cast<size_t>(kAddsPerProcess), sids[lid].size()) << "LUN " << lid;
        EXPECT_EQ(1, *sids[lid].begin());
        EXPECT_EQ(kAddsPerProcess, *sids[lid].rbegin());
        EXPECT_EQ(1u, names[lid].count("SnapShot-" + std::to_string(kAddsPerProcess)));
    }
    // The cache holds nothing else.
    size_t cached = 0;
    for (const std::string &file : snap_test::DirEntries(Real("/tmp/iscsi/snapshot_cache"))) {
        ORLOiSCSISnapshotList one;
        ORLOiSCSIListInit(&one);
        ASSERT_EQ(0u, ORLOiSCSISnapshotConfLoadWithPath(&all, &one, ("/tmp/iscsi/snapshot_cache/" + file).c_str()))
            << file;
        cached += static_cast<size_t>(one.count);
        ORLOiSCSISnapshotListFree(&one);
    }
    EXPECT_EQ(uuids.size(), cached);
    EXPECT_TRUE(log_.Lines().empty()) << log_.Dump();
}

TEST_F(SnapshotConcurrencyTest, TheLunLockIsHeldAcrossCallsAndNests) {
    AddLuns({1});
    ORLOiSCSILun lun = MakeLun(1);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLock(&lun)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfLock(&lun));
    // While this thread holds it, the library's own takes ride on the hold...
    ORLOiSCSISnapshot s = MakeSnap(1, 1);
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfAdd(&s)) << log_.Dump();
    EXPECT_EQ(2, ORLOiSCSISnapshotUnusedSidFind(&lun, nullptr));
    // ...and another process waits for it.
    const std::string lockPath = std::string("/tmp/iscsi/snapshot_conf_lock/iscsi_snapshot_") + lun.uuid + ".conf.lock";
    auto otherCanTake = [&]() {
        pid_t pid = fork();
        if (pid == 0) {
            int handle = -1;
            _exit(OLIBCFileLockTimeByFile(lockPath.c_str(), 0, 0, &handle) ? 0 : 1);
        }
        int status = 0;
        waitpid(pid, &status, 0);
        return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    };
    EXPECT_FALSE(otherCanTake());
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfUnlock(&lun));
    EXPECT_FALSE(otherCanTake()) << "nested: still held";
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfUnlock(&lun));
    EXPECT_TRUE(otherCanTake());
    log_.Clear();
    EXPECT_EQ(18990016u, ORLOiSCSISnapshotConfUnlock(&lun));
    EXPECT_TRUE(log_.Contains("Snapshot config lock is not held by this thread")) << log_.Dump();
}

}  // namespace
