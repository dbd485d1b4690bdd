// Shared pieces of the LUN tests: a sandbox with the runtime directories made, records
// filled the way a caller fills them, and a child process that holds a LUN's lock.
#ifndef ORLO_TESTS_LUN_LUN_FIXTURE_H
#define ORLO_TESTS_LUN_LUN_FIXTURE_H

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
#include "support/sandbox.h"

namespace lun_test {

constexpr const char *kGlobalConf = "/usr/orlo/etc/iscsi_lun.conf";
constexpr const char *kVolumeConf = "/volume1/@iSCSI/LUN/iscsi_lun.conf";

inline std::string UuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "5a1d0000-0000-4000-8000-%012d", lid);
    return buf;
}

// A record as a caller fills it.
inline ORLOiSCSILun MakeLun(int lid, uint32_t type, const char *rootPath = "/volume1") {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.lid = lid;
    lun.lockHandle = -1;
    lun.type = type;
    lun.blockSize = 512;
    lun.size = 1073741824ULL * static_cast<uint64_t>(lid);
    snprintf(lun.uuid, sizeof(lun.uuid), "%s", UuidOf(lid).c_str());
    snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "serial-%d", lid);
    snprintf(lun.rootPath, sizeof(lun.rootPath), "%s", rootPath);
    snprintf(lun.name, sizeof(lun.name), "LUN-%d", lid);
    return lun;
}

// The records of a list, copied out in list order.
inline std::vector<ORLOiSCSILun> Records(ORLOiSCSILunList *list) {
    std::vector<ORLOiSCSILun> out;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(list, link, lun) out.push_back(*lun);
    return out;
}

class LunTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ORLOiSCSIListInit(&list_);
    }
    void TearDown() override {
        ORLOiSCSILunListFree(&list_);
        SandboxTest::TearDown();
    }
    ORLOiSCSILunList list_;
};

// A child process that takes a LUN's lock and keeps it until told to let go (or to die
// without unlocking).
class LockHolder {
  public:
    // Forks; returns once the child holds the lock (false when it could not take it).
    bool Start(const ORLOiSCSILun &lun, int step) {
        int ready[2];
        if (pipe(ready) != 0 || pipe(go_) != 0) return false;
        pid_ = fork();
        if (pid_ == 0) {
            close(ready[0]);
            close(go_[1]);
            ORLOiSCSILun mine = lun;
            char ok = ORLOiSCSILunLock(&mine, step) == 0 ? 'y' : 'n';
            if (write(ready[1], &ok, 1) != 1) _exit(2);
            char cmd = 0;
            if (read(go_[0], &cmd, 1) != 1) cmd = 'u';
            if (cmd == 'd') _exit(0);     // dies holding it
            if (cmd == 'l') usleep(1500000);  // lets go a moment later
            _exit(ORLOiSCSILunUnlock(&mine) == 0 ? 0 : 1);
        }
        close(ready[1]);
        close(go_[0]);
        char ok = 'n';
        bool held = read(ready[0], &ok, 1) == 1 && ok == 'y';
        close(ready[0]);
        return held;
    }
    // Tells the child to unlock ('u') or to exit holding the lock ('d'); waits for it.
    int Finish(char how = 'u') {
        if (pid_ <= 0) return -1;
        if (write(go_[1], &how, 1) != 1) kill(pid_, SIGKILL);
        close(go_[1]);
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    // Tells the child to let go 1.5 seconds from now ('l'), without waiting for it (the
    // caller waits with Join).
    void FinishLater(char how = 'l') {
        if (write(go_[1], &how, 1) != 1) kill(pid_, SIGKILL);
        close(go_[1]);
    }
    int Join() {
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    pid_t pid() const { return pid_; }
    ~LockHolder() {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
    }

  private:
    pid_t pid_ = -1;
    int go_[2] = {-1, -1};
};

}  // namespace lun_test

#endif
