// Shared pieces of the snapshot tests: a sandbox with the runtime directories and a few
// LUNs in the LUN file, snapshot records filled the way a caller fills them, section text
// as the library writes it, and a child process that holds a snapshot's operation lock.
#ifndef ORLO_TESTS_SNAPSHOT_SNAPSHOT_FIXTURE_H
#define ORLO_TESTS_SNAPSHOT_SNAPSHOT_FIXTURE_H

#include <dirent.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_snapshot.h"
#include "support/sandbox.h"

namespace snap_test {

inline std::string LunUuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "1d000000-0000-4000-8000-%012d", lid);
    return buf;
}

// Snapshot UUIDs whose first three characters (the cache file) are given.
inline std::string SnapUuidOf(int lid, int sid, const char *prefix = "5a9") {
    char buf[40];
    snprintf(buf, sizeof(buf), "%.3s%05d-0000-4000-8000-%012d", prefix, lid, sid);
    return buf;
}

inline std::string LunFile(int lid, const char *volume = "/volume1") {
    return std::string(volume) + "/@iSCSI/Snapshot/iscsi_snapshot_" + LunUuidOf(lid) + ".conf";
}

inline std::string CacheFile(const std::string &snapUuid) {
    return "/tmp/iscsi/snapshot_cache/iscsi_snapshot_" + snapUuid.substr(0, 3) + ".conf.cache";
}

inline ORLOiSCSILun MakeLun(int lid, const char *volume = "/volume1") {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.lid = lid;
    lun.lockHandle = -1;
    lun.type = ORLO_ISCSI_LUN_TYPE_ADV;
    lun.blockSize = 512;
    lun.size = 1ull << 30;
    snprintf(lun.uuid, sizeof(lun.uuid), "%s", LunUuidOf(lid).c_str());
    snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "serial-%d", lid);
    snprintf(lun.rootPath, sizeof(lun.rootPath), "%s", volume);
    snprintf(lun.name, sizeof(lun.name), "LUN-%d", lid);
    return lun;
}

// A record as the creation code fills it.
inline ORLOiSCSISnapshot MakeSnap(int lid, int sid, const char *volume = "/volume1", const char *prefix = "5a9") {
    ORLOiSCSISnapshot s;
    memset(&s, 0, sizeof(s));
    s.lid = lid;
    s.sid = sid;
    s.lock_fd = -1;
    s.type = ORLO_ISCSI_SNAPSHOT_TYPE_ADV;
    s.total_size = 10737418240ull + static_cast<uint64_t>(sid);
    s.mappedSize = 4096ull * static_cast<uint64_t>(sid);
    s.time = 1700000000 + sid;
    s.snapshot_time = 1700000100 + sid;
    s.isAppConsistence = sid % 2 == 0;
    s.lock = sid % 3 == 0;
    snprintf(s.name, sizeof(s.name), "SnapShot-%d", sid);
    snprintf(s.status, sizeof(s.status), "Healthy");
    snprintf(s.note, sizeof(s.note), "nightly %d", sid);
    snprintf(s.rootpath, sizeof(s.rootpath), "%s", volume);
    snprintf(s.taken_by, sizeof(s.taken_by), "admin");
    snprintf(s.uuid, sizeof(s.uuid), "%s", SnapUuidOf(lid, sid, prefix).c_str());
    snprintf(s.parent_uuid, sizeof(s.parent_uuid), "%s", LunUuidOf(lid).c_str());
    snprintf(s.version, sizeof(s.version), "ver-%d", sid);
    return s;
}

// The section exactly as the library writes a record.
inline std::string SectionText(const ORLOiSCSISnapshot &s) {
    char buf[8192];
    snprintf(buf, sizeof(buf),
             "[SNAPSHOT_%s]\n\tlid=%d\n\tsid=%d\n\ttotal_size=%llu\n\tmappedSize=%llu\n\ttime=%d\n"
             "\tsnapshot_time=%d\n\tisAppConsistence=%s\n\tlock=%s\n\tname=%s\n\tstatus=%s\n\tnote=%s\n"
             "\trootpath=%s\n\ttaken_by=%s\n\tuuid=%s\n\tversion=%s\n\tparent_uuid=%s\n\ttype=%s\n",
             s.uuid, s.lid, s.sid, static_cast<unsigned long long>(s.total_size),
             static_cast<unsigned long long>(s.mappedSize), s.time, s.snapshot_time, s.isAppConsistence ? "yes" : "no",
             s.lock ? "yes" : "no", s.name, s.status, s.note, s.rootpath, s.taken_by, s.uuid, s.version,
             s.parent_uuid, s.type == 1 ? "ADV" : s.type == 2 ? "BLUN" : "UNKNOWN");
    return buf;
}

// The stored fields of two records agree.
inline void ExpectSameRecord(const ORLOiSCSISnapshot &want, const ORLOiSCSISnapshot &got) {
    EXPECT_EQ(want.lid, got.lid);
    EXPECT_EQ(want.sid, got.sid);
    EXPECT_EQ(want.type, got.type);
    EXPECT_EQ(want.total_size, got.total_size);
    EXPECT_EQ(want.mappedSize, got.mappedSize);
    EXPECT_EQ(want.time, got.time);
    EXPECT_EQ(want.snapshot_time, got.snapshot_time);
    EXPECT_EQ(want.isAppConsistence, got.isAppConsistence);
    EXPECT_EQ(want.lock, got.lock);
    EXPECT_STREQ(want.name, got.name);
    EXPECT_STREQ(want.status, got.status);
    EXPECT_STREQ(want.note, got.note);
    EXPECT_STREQ(want.rootpath, got.rootpath);
    EXPECT_STREQ(want.taken_by, got.taken_by);
    EXPECT_STREQ(want.uuid, got.uuid);
    EXPECT_STREQ(want.parent_uuid, got.parent_uuid);
    EXPECT_STREQ(want.version, got.version);
}

// The names in a directory (real path), "." and ".." aside.
inline std::vector<std::string> DirEntries(const std::string &dir) {
    std::vector<std::string> out;
    DIR *d = opendir(dir.c_str());
    if (d == nullptr) return out;
    while (struct dirent *e = readdir(d))
        if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) out.push_back(e->d_name);
    closedir(d);
    return out;
}

// The records of a list, copied out in list order.
inline std::vector<ORLOiSCSISnapshot> Records(ORLOiSCSISnapshotList *list) {
    std::vector<ORLOiSCSISnapshot> out;
    ORLOiSCSIListLink *link;
    ORLOiSCSISnapshot *s;
    ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(list, link, s) out.push_back(*s);
    return out;
}

class SnapshotTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ORLOiSCSIListInit(&list_);
    }
    void TearDown() override {
        ORLOiSCSISnapshotListFree(&list_);
        SandboxTest::TearDown();
    }
    // Puts LUNs into the LUN file.
    void AddLuns(const std::vector<int> &lids, const char *volume = "/volume1") {
        for (int lid : lids) {
            ORLOiSCSILun lun = MakeLun(lid, volume);
            ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        }
    }
    ORLOiSCSISnapshotList list_;
};

// A child process that takes a snapshot's operation lock and keeps it until told to let
// go ('u'), to let go 1.5 seconds later ('l'), or to die without unlocking ('d').
class SnapLockHolder {
  public:
    bool Start(const ORLOiSCSISnapshot &snap, int step) {
        int ready[2];
        if (pipe(ready) != 0 || pipe(go_) != 0) return false;
        pid_ = fork();
        if (pid_ == 0) {
            close(ready[0]);
            close(go_[1]);
            ORLOiSCSISnapshot mine = snap;
            char ok = ORLOiSCSISnapshotLock(&mine, step) == 0 && mine.lock_fd > 0 ? 'y' : 'n';
            if (write(ready[1], &ok, 1) != 1) _exit(2);
            char cmd = 0;
            if (read(go_[0], &cmd, 1) != 1) cmd = 'u';
            if (cmd == 'd') _exit(0);
            if (cmd == 'l') usleep(1500000);
            _exit(ORLOiSCSISnapshotUnlock(&mine) == 0 ? 0 : 1);
        }
        close(ready[1]);
        close(go_[0]);
        char ok = 'n';
        bool held = read(ready[0], &ok, 1) == 1 && ok == 'y';
        close(ready[0]);
        return held;
    }
    void Tell(char how) {
        if (write(go_[1], &how, 1) != 1) kill(pid_, SIGKILL);
        close(go_[1]);
    }
    int Join() {
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    int Finish(char how = 'u') {
        Tell(how);
        return Join();
    }
    pid_t pid() const { return pid_; }
    ~SnapLockHolder() {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
    }

  private:
    pid_t pid_ = -1;
    int go_[2] = {-1, -1};
};

}  // namespace snap_test

#endif
