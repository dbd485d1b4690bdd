// Snapshots of a block-family LUN on a real Btrfs volume: the snapshot is a read-only
// subvolume holding the LUN's bytes of that moment, recorded in the LUN's snapshot file and
// the cache; names, limits and holds are enforced; deletion, repair and the LUN's own
// deletion leave nothing behind; concurrent takers never share a sid, name or UUID.
#include <gtest/gtest.h>
#include <dirent.h>
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "orlo_storage.h"
#include "orloiscsi_base.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_snapshot.h"
#include "support/loop_volume.h"

namespace {

using orlotest::LoopVolume;

class BlunSnapshotTest : public orlotest::VolumeTest {
  protected:
    void SetUp() override {
        VolumeTest::SetUp();
        ORLO_SKIP_UNLESS_LOOP_VOLUME(LoopVolume::Fs::kBtrfs);
        ASSERT_TRUE(MountVolume(LoopVolume::Fs::kBtrfs, 1024ull << 20));
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr));
    }

    ORLOiSCSILun CreateLun(const std::string &name, uint32_t type = ORLO_ISCSI_LUN_TYPE_BLUN) {
        ORLOiSCSILun lun;
        memset(&lun, 0, sizeof(lun));
        lun.lockHandle = -1;
        lun.type = type;
        lun.size = 16 << 20;
        lun.blockSize = 512;
        snprintf(lun.name, sizeof(lun.name), "%s", name.c_str());
        snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
        EXPECT_EQ(0u, ORLOiSCSILunCreate(&lun)) << log_.Dump();
        return lun;
    }
    std::string DataPath(const ORLOiSCSILun &lun) {
        char buf[4096];
        EXPECT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, buf, sizeof(buf)));
        return buf;
    }
    // Writes text at the start of a file (logical path), in place.
    void Put(const std::string &logical, const std::string &text) {
        int fd = open(Real(logical).c_str(), O_WRONLY);
        ASSERT_GE(fd, 0) << logical << ": " << strerror(errno);
        ASSERT_EQ(static_cast<ssize_t>(text.size()), pwrite(fd, text.data(), text.size(), 0));
        close(fd);
    }
    std::string Get(const std::string &logical, size_t n) {
        std::string s(n, '\0');
        int fd = open(Real(logical).c_str(), O_RDONLY);
        if (fd < 0) return "<missing>";
        ssize_t got = pread(fd, &s[0], n, 0);
        close(fd);
        return got == static_cast<ssize_t>(n) ? s : "<short>";
    }
    ORLOiSCSISnapshot Request(const std::string &name) {
        ORLOiSCSISnapshot s;
        memset(&s, 0, sizeof(s));
        s.lock_fd = -1;
        snprintf(s.name, sizeof(s.name), "%s", name.c_str());
        snprintf(s.taken_by, sizeof(s.taken_by), "test");
        return s;
    }
    std::vector<ORLOiSCSISnapshot> Snapshots(const ORLOiSCSILun &lun) {
        ORLOiSCSISnapshotList list = {};
        ORLOiSCSIListInit(&list);
        ORLOiSCSISnapshotFilter all = {};
        EXPECT_EQ(0u, ORLOiSCSISnapshotConfLoadByParentLun(&lun, &all, &list)) << log_.Dump();
        std::vector<ORLOiSCSISnapshot> out;
        ORLOiSCSIListLink *link;
        ORLOiSCSISnapshot *s;
        ORLO_ISCSI_SNAPSHOT_LIST_FOREACH(&list, link, s) out.push_back(*s);
        ORLOiSCSISnapshotListFree(&list);
        return out;
    }
    std::string Subvol(const ORLOiSCSILun &lun, const ORLOiSCSISnapshot &s) {
        return std::string("/volume1/@iSCSI/Snapshot/BLUN/") + lun.uuid + "/" + s.uuid;
    }
};

TEST_F(BlunSnapshotTest, ASnapshotIsAReadOnlySubvolumeOfThatMomentRecordedTwice) {
    ORLOiSCSILun lun = CreateLun("data");
    const std::string data = DataPath(lun);
    Put(data, "old bytes");

    ORLOiSCSISnapshot s = Request("first");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun, &s)) << log_.Dump();
    EXPECT_EQ(1, s.sid);
    EXPECT_EQ(ORLO_ISCSI_SNAPSHOT_TYPE_BLUN, s.type);
    EXPECT_STREQ("Healthy", s.status);
    EXPECT_EQ(lun.size, s.total_size);
    EXPECT_STREQ(lun.uuid, s.parent_uuid);
    Put(data, "new bytes");

    // The snapshot's copy of the data file holds the old bytes and cannot be written.
    const std::string copy = Subvol(lun, s) + data.substr(data.find(lun.uuid) + strlen(lun.uuid));
    EXPECT_EQ("old bytes", Get(copy, 9));
    EXPECT_EQ("new bytes", Get(data, 9));
    int fd = open(Real(copy).c_str(), O_WRONLY);
    EXPECT_LT(fd, 0) << "a snapshot is read-only";
    EXPECT_EQ(EROFS, errno);
    if (fd >= 0) close(fd);

    // Both copies of the record.
    ORLOiSCSISnapshot fromCache, fromVolume;
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &fromCache));
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfInVolumeLoadByUuid(lun.rootPath, lun.uuid, s.uuid, &fromVolume));
    EXPECT_STREQ("first", fromCache.name);
    EXPECT_STREQ("first", fromVolume.name);

    // Names are the LUN's own: taken on this LUN, free on another; none given gets a default.
    ORLOiSCSISnapshot twin = Request("first");
    EXPECT_EQ(18990513u, ORLOiSCSISnapshotCreate(&lun, &twin));
    EXPECT_TRUE(log_.Contains("Duplicated snapshot name. lid: " + std::to_string(lun.lid) + ", name: first"));
    ORLOiSCSILun other = CreateLun("other");
    ORLOiSCSISnapshot elsewhere = Request("first");
    EXPECT_EQ(0u, ORLOiSCSISnapshotCreate(&other, &elsewhere)) << log_.Dump();
    ORLOiSCSISnapshot unnamed = Request("");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun, &unnamed)) << log_.Dump();
    EXPECT_STREQ("SnapShot-1", unnamed.name);
    EXPECT_EQ(2, unnamed.sid);

    // The limit counts per LUN, with an event for the administrator.
    WriteFile("/etc.defaults/orloinfo.conf", "max_snapshot_per_lun=\"2\"\n");
    ORLOiSCSISnapshot third = Request("third");
    EXPECT_EQ(18990543u, ORLOiSCSISnapshotCreate(&lun, &third));
    EXPECT_NE(std::string::npos, ReadFile("/var/log/orlo/event.log").find("Maximum snapshot count reached"));
    EXPECT_EQ(2u, Snapshots(lun).size());
    WriteFile("/etc.defaults/orloinfo.conf", "");

    // Held by an application: only the unchecked deletion takes it.
    ASSERT_EQ(0u, ORLOiSCSISnapshotLockByAppKey(&s, "backup-app"));
    EXPECT_EQ(18990540u, ORLOiSCSISnapshotDelete(&s, nullptr));
    EXPECT_TRUE(Exists(Subvol(lun, s)));
    EXPECT_EQ(0u, ORLOiSCSISnapshotDeleteWithoutCheckingAppKey(&s, nullptr)) << log_.Dump();
    EXPECT_FALSE(Exists(Subvol(lun, s)));
    EXPECT_FALSE(Exists(std::string("/tmp/iscsi/snapshot_app_lock/SN_") + s.uuid + ".app.lock"));
    EXPECT_FALSE(Exists(std::string("/tmp/iscsi/snapshot_lock/SN_") + s.uuid + ".lock"));
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &fromCache));
    EXPECT_TRUE(Exists(std::string("/volume1/@iSCSI/Snapshot/BLUN/") + lun.uuid)) << "one snapshot is left";

    // The last one takes the LUN's snapshot directory with it.
    ASSERT_EQ(0u, ORLOiSCSISnapshotDelete(&unnamed, "test")) << log_.Dump();
    EXPECT_FALSE(Exists(std::string("/volume1/@iSCSI/Snapshot/BLUN/") + lun.uuid));
    EXPECT_TRUE(Snapshots(lun).empty());

    // Another kind of LUN is refused before any lock is taken.
    ORLOiSCSILun thin = CreateLun("thin", ORLO_ISCSI_LUN_TYPE_THIN);
    unlink(Real(std::string("/tmp/iscsi/lun_lock/LUN_") + thin.uuid + ".lock").c_str());
    ORLOiSCSISnapshot refused = Request("x");
    EXPECT_EQ(18990500u, ORLOiSCSISnapshotCreate(&thin, &refused));
    EXPECT_FALSE(Exists(std::string("/tmp/iscsi/lun_lock/LUN_") + thin.uuid + ".lock"));
}

TEST_F(BlunSnapshotTest, RepairAndTheLunsDeletionLeaveNoObjectWithoutRecordNorRecordWithoutObject) {
    ORLOiSCSILun lun = CreateLun("data");
    ORLOiSCSISnapshot a = Request("a"), b = Request("b");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun, &a)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun, &b)) << log_.Dump();

    // As a killed creation leaves them: a's record gone, b's subvolume gone.
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDelete(&a));
    ASSERT_EQ(0, ORLOBtrfsDeleteSubvolFaultTolerant(Subvol(lun, b).c_str()));
    log_.Clear();
    ASSERT_EQ(0, ORLOiSCSILunLock(&lun, 10));
    EXPECT_EQ(2, ORLOiSCSISnapshotRepair(&lun)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSILunUnlock(&lun));
    EXPECT_FALSE(Exists(Subvol(lun, a)));
    EXPECT_TRUE(Snapshots(lun).empty());
    EXPECT_TRUE(log_.Contains("has no record: it goes")) << log_.Dump();
    EXPECT_TRUE(log_.Contains("its record goes")) << log_.Dump();

    // The next creation repairs too: an orphan made behind its back is gone afterwards.
    ORLOiSCSISnapshot c = Request("c");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun, &c)) << log_.Dump();
    ASSERT_EQ(0u, ORLOiSCSISnapshotConfDelete(&c));
    ORLOiSCSISnapshot d = Request("d");
    ASSERT_EQ(0u, ORLOiSCSISnapshotCreate(&lun, &d)) << log_.Dump();
    EXPECT_FALSE(Exists(Subvol(lun, c)));
    EXPECT_EQ(1, d.sid) << "c's sid was free again";

    // Deleting the LUN deletes its snapshots, their records and directory.
    ASSERT_EQ(0u, ORLOiSCSILunDelete(&lun)) << log_.Dump();
    EXPECT_FALSE(Exists(std::string("/volume1/@iSCSI/Snapshot/BLUN/") + lun.uuid));
    EXPECT_FALSE(Exists(std::string("/volume1/@iSCSI/Snapshot/iscsi_snapshot_") + lun.uuid + ".conf"));
    ORLOiSCSISnapshot gone;
    EXPECT_EQ(18990532u, ORLOiSCSISnapshotConfGetByUuid(d.uuid, &gone));
}

TEST_F(BlunSnapshotTest, FourProcessesTakingFiftyEachNeverShareASidNameOrUuid) {
    std::vector<ORLOiSCSILun> luns;
    for (int i = 0; i < 4; ++i) luns.push_back(CreateLun("lun" + std::to_string(i)));
    std::vector<pid_t> pids;
    for (int p = 0; p < 4; ++p) {
        pid_t pid = fork();
        if (pid == 0) {
            int failed = 0;
            for (int j = 0; j < 50; ++j) {
                ORLOiSCSILun lun = luns[static_cast<size_t>((p + j) % 4)];
                // Every process takes default names half the time, so names are chosen too.
                ORLOiSCSISnapshot s = Request(j % 2 == 0 ? "" : "p" + std::to_string(p) + "-" + std::to_string(j));
                uint32_t ret;
                do {
                    ret = ORLOiSCSISnapshotCreate(&lun, &s);
                } while (ret == 18990535);  // the LUN was busy past its 5 seconds: again
                if (ret != 0) ++failed;
            }
            _exit(failed == 0 ? 0 : 1);
        }
        pids.push_back(pid);
    }
    for (pid_t pid : pids) {
        int status = 0;
        waitpid(pid, &status, 0);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    }
    std::set<std::string> uuids;
    size_t total = 0;
    for (const ORLOiSCSILun &lun : luns) {
        std::set<int> sids;
        std::set<std::string> names;
        for (const ORLOiSCSISnapshot &s : Snapshots(lun)) {
            ++total;
            EXPECT_TRUE(sids.insert(s.sid).second) << lun.name << " sid " << s.sid << " twice";
            EXPECT_TRUE(names.insert(s.name).second) << lun.name << " name " << s.name << " twice";
            EXPECT_TRUE(uuids.insert(s.uuid).second) << s.uuid << " twice";
            ORLOiSCSISnapshot cached;
            ASSERT_EQ(0u, ORLOiSCSISnapshotConfGetByUuid(s.uuid, &cached)) << s.uuid << " missing from the cache";
            EXPECT_EQ(s.sid, cached.sid);
            EXPECT_STREQ(s.name, cached.name);
            EXPECT_TRUE(Exists(Subvol(lun, s)));
        }
    }
    EXPECT_EQ(200u, total);
}

}  // namespace
