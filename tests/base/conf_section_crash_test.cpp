// Crash safety of configuration writes: a child process replaces and removes sections
// in a loop and is SIGKILLed at a random moment, hundreds of times.  After every kill
// the file must be exactly the state before the interrupted write or exactly the state
// after it (replayed on a scratch copy through the same calls), and still parse.
#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <random>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "support/sandbox.h"

namespace {

constexpr int kSections = 10;

// Operation number i, deterministic: replace or add a section, or remove two.
uint32_t ApplyOp(const char *path, long i) {
    if (i % 3 == 1) {
        POLIBC_SZLIST l = OLIBCSzListAlloc(2);
        OLIBCSzListPush(&l, ("S_" + std::to_string((i + 3) % kSections)).c_str());
        OLIBCSzListPush(&l, ("S_" + std::to_string((i + 7) % kSections)).c_str());
        uint32_t rc = ORLOiSCSIRemoveSectionList(path, l);
        OLIBCSzListFree(l);
        return rc;
    }
    POLIBC_SZHASH h = OLIBCSzHashAlloc(32);
    for (int k = 0; k < 20; ++k)
        OLIBCSzHashSetValue(&h, ("key" + std::to_string(k)).c_str(), ("gen" + std::to_string(i)).c_str());
    uint32_t rc = ORLOiSCSIPutSectionToConfig(path, ("S_" + std::to_string(i % kSections)).c_str(), h);
    OLIBCSzHashFree(h);
    return rc;
}

class ConfSectionCrashTest : public orlotest::SandboxTest {};

TEST_F(ConfSectionCrashTest, KilledWriterLeavesOldOrNewFileNeverAMix) {
    const char *conf = "/usr/orlo/etc/iscsi_lun.conf";
    const char *scratch = "/usr/orlo/etc/replay.conf";
    // Bystander sections that no operation touches, to make the file a realistic size.
    std::string initial = "# LUN configuration\n";
    for (int i = 0; i < 150; ++i) {
        initial += "[LUN_keep_" + std::to_string(i) + "]\n";
        for (int k = 0; k < 20; ++k) initial += "\tkey" + std::to_string(k) + "=value " + std::to_string(i) + "\n";
    }
    WriteFile(conf, initial);
    std::string state = initial;
    long next = 0;  // the first operation not yet known to be on disk
    // Kill moments spread over about three operations of this machine (and build), so
    // that kills land before, inside and between writes wherever the suite runs.
    WriteFile(scratch, state);
    auto t0 = std::chrono::steady_clock::now();
    for (long i = 0; i < 5; ++i) ASSERT_EQ(0u, ApplyOp(scratch, i));
    double opUs = std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - t0).count() / 5;
    std::mt19937 rng(12345);
    std::uniform_int_distribution<int> delayUs(0, static_cast<int>(3 * opUs) + 1000);
    int interrupted = 0;

    for (int round = 0; round < 300; ++round) {
        int fds[2];
        ASSERT_EQ(0, pipe(fds));
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            close(fds[0]);
            for (long i = next;; ++i) {
                // Announce the operation before starting it.
                if (write(fds[1], &i, sizeof(i)) != sizeof(i)) _exit(2);
                if (ApplyOp(conf, i) != 0) _exit(3);
            }
        }
        close(fds[1]);
        usleep(static_cast<useconds_t>(delayUs(rng)));
        kill(pid, SIGKILL);
        int status = 0;
        waitpid(pid, &status, 0);
        ASSERT_TRUE(WIFSIGNALED(status)) << "writer failed with " << WEXITSTATUS(status);
        long started = next - 1;
        long v;
        while (read(fds[0], &v, sizeof(v)) == sizeof(v)) started = v;
        close(fds[0]);

        // Replay: operations next..started-1 finished; operation started may have.
        WriteFile(scratch, state);
        for (long i = next; i < started; ++i) ASSERT_EQ(0u, ApplyOp(scratch, i));
        std::string before = ReadFile(scratch);
        std::string after = before;
        if (started >= next) {
            ASSERT_EQ(0u, ApplyOp(scratch, started));
            after = ReadFile(scratch);
        }
        std::string now = ReadFile(conf);
        if (now == after) {
            state = after;
            next = started + 1;
        } else {
            ASSERT_EQ(before, now) << "round " << round << ": file is neither before nor after operation " << started;
            state = before;
            next = started;
            ++interrupted;
        }
        POLIBC_SZLIST names = nullptr;
        ASSERT_GE(ORLOiSCSIConfSectionEnum(conf, &names), 150);
        OLIBCSzListFree(names);

        // Temporary files of killed writers may remain beside the file; clear them.
        DIR *d = opendir(Real("/usr/orlo/etc").c_str());
        while (struct dirent *e = readdir(d)) {
            std::string n = e->d_name;
            if (n.rfind("iscsi_lun.conf.", 0) == 0 || n.rfind("replay.conf.", 0) == 0)
                unlink(Real("/usr/orlo/etc/" + n).c_str());
        }
        closedir(d);
    }
    // Every bystander section is still there, untouched.
    for (int i = 0; i < 150; ++i) {
        std::string header = "[LUN_keep_" + std::to_string(i) + "]\n";
        EXPECT_NE(std::string::npos, state.find(header + "\tkey0=value " + std::to_string(i) + "\n")) << i;
    }
    EXPECT_GT(next, 100);          // the writer made real progress
    EXPECT_GT(interrupted, 10);    // and was often caught in the middle of a write
    RecordProperty("operations", static_cast<int>(next));
    RecordProperty("interrupted", interrupted);
}

}  // namespace
