// Something that is not a regular file where a lock file belongs (a symbolic link, a
// directory, a FIFO): the lock is never taken through it, the operation fails with
// "Failed to lock file" (18990015) and one line that names the path and what stands
// there, nothing changes, and the object it points to is left alone.  Once it is
// removed the same operation works.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <functional>
#include <string>

#include "e2e/e2e_processes.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"

namespace {

class LockFiles : public e2e::ServiceSandbox {
  protected:
    ORLOiSCSILun Lun(const std::string &name) {
        ORLOiSCSILunList list = {};
        EXPECT_EQ(0u, ORLOiSCSILunConfGetByLunName(name.c_str(), 0, &list));
        ORLOiSCSILun out;
        memset(&out, 0, sizeof(out));
        ORLOiSCSIListLink *link;
        ORLOiSCSILun *lun;
        if (ORLOiSCSIListIsInit(&list)) {
            ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, lun) out = *lun;
        }
        ORLOiSCSILunListFree(&list);
        out.lockHandle = -1;
        return out;
    }

    enum class Kind { kSymlink, kDirectory, kFifo };

    // Puts kind at the lock path, runs op, checks the refusal, then removes it and runs op
    // again.  The files that must not change are compared before and after.
    void Check(const std::string &lockPath, Kind kind, const char *what, const std::function<uint32_t()> &op) {
        SCOPED_TRACE(lockPath);
        const std::string real = Real(lockPath);
        unlink(real.c_str());
        rmdir(real.c_str());
        const std::string victim = Real("/root/victim");
        WriteFile("/root/victim", "precious\n", 0600);
        switch (kind) {
            case Kind::kSymlink: ASSERT_EQ(0, symlink(victim.c_str(), real.c_str())); break;
            case Kind::kDirectory: ASSERT_EQ(0, mkdir(real.c_str(), 0700)); break;
            case Kind::kFifo: ASSERT_EQ(0, mkfifo(real.c_str(), 0600)); break;
        }
        const std::string before = Snapshot();
        log_.Clear();
        EXPECT_EQ(18990015u, op()) << log_.Dump();
        const std::string line = "Failed to lock file: " + lockPath + ". It is " + what + ", not a regular file";
        EXPECT_TRUE(log_.Contains(line)) << "missing \"" << line << "\" in:\n" << log_.Dump();
        EXPECT_EQ(before, Snapshot()) << "the refused operation changed something";
        EXPECT_EQ("precious\n", ReadFile("/root/victim"));
        struct stat st;
        ASSERT_EQ(0, lstat(real.c_str(), &st)) << "the planted file is left for the administrator";
        if (kind == Kind::kDirectory) {
            rmdir(real.c_str());
        } else {
            unlink(real.c_str());
        }
        log_.Clear();
        EXPECT_EQ(0u, op()) << log_.Dump();
    }

    std::string Snapshot() {
        return ReadFile("/usr/orlo/etc/iscsi_lun.conf") + ReadFile("/usr/orlo/etc/iscsi_target.conf") +
               ReadFile("/usr/orlo/etc/iscsi_mapping.conf");
    }
};

TEST_F(LockFiles, ANonRegularLockFileIsNamedAndNeverFollowed) {
    std::string err;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "a", "--type", "THIN", "--size", "16M", "--volume", "/volume1"},
                     nullptr, &err))
        << err;
    ASSERT_EQ(0, Cli({"target", "create", "t"}, nullptr, &err)) << err;
    ORLOiSCSITarget t;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByName("t", 0, &t));
    ORLOiSCSILun a = Lun("a");

    // The mapping file's lock, in map add.
    Check("/tmp/iscsi/iscsi_mapping.conf.lock", Kind::kSymlink, "a symbolic link",
          [&] { return ORLOiSCSITargetMappingAdd(t.tid, a.lid, 256); });
    ASSERT_EQ(0u, ORLOiSCSITargetMappingRemove(t.tid, a.lid));

    // A LUN's own lock, in its deletion: not "LUN is locked", which would send an
    // administrator looking for a process that does not exist.
    ORLOiSCSILun b;
    ASSERT_EQ(0, Cli({"lun", "create", "--name", "b", "--type", "THIN", "--size", "16M", "--volume", "/volume1"},
                     nullptr, &err))
        << err;
    b = Lun("b");
    Check(std::string("/tmp/iscsi/lun_lock/LUN_") + b.uuid + ".lock", Kind::kDirectory, "a directory",
          [&] { return ORLOiSCSILunDelete(&b); });

    // The target lock, in a creation.
    int n = 0;
    Check("/tmp/iscsi/iscsi_target_op.lock", Kind::kFifo, "a FIFO", [&] {
        ORLOiSCSITarget fresh = t;
        fresh.tid = 0;
        snprintf(fresh.name, sizeof(fresh.name), "fresh%d", n);
        snprintf(fresh.iqn, sizeof(fresh.iqn), "iqn.2000-01.com.orlo-nas:fresh%d", n++);
        return ORLOiSCSITargetCreate(&fresh);
    });

    // The creation lock and the LUN files' lock, in a LUN creation.
    for (const char *lock : {"/tmp/iscsi/iscsi_lun_creation.lock", "/tmp/iscsi/iscsi_lun.conf.lock"}) {
        Check(lock, Kind::kSymlink, "a symbolic link", [&] {
            ORLOiSCSILun c;
            memset(&c, 0, sizeof(c));
            c.lockHandle = -1;
            c.type = ORLO_ISCSI_LUN_TYPE_THIN;
            c.size = 16 << 20;
            c.blockSize = 512;
            snprintf(c.name, sizeof(c.name), "c%d", n++);
            snprintf(c.rootPath, sizeof(c.rootPath), "/volume1");
            return ORLOiSCSILunCreate(&c);
        });
    }
}

}  // namespace
