// Callers that die half-way: lun create, lun delete, target create and map add, each
// killed with SIGKILL at a random moment, two hundred times.  After every kill the next
// command of the same kind runs to its end, and then nothing may be left behind: no
// temporary file beside a configuration file, no LUN directory that no section names, no
// LUN section in one of its two files only, no progress file of a process that is gone,
// and every file still parses.
#include <dirent.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <functional>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "e2e/e2e_processes.h"
#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"

namespace {

constexpr int kTrials = 200;

class Crash : public e2e::ServiceSandbox {
  protected:
    std::set<std::string> Dir(const std::string &logical) {
        std::set<std::string> out;
        DIR *d = opendir(Real(logical).c_str());
        if (d == nullptr) return out;
        while (struct dirent *e = readdir(d))
            if (e->d_name[0] != '.') out.insert(e->d_name);
        closedir(d);
        return out;
    }

    // Starts a command and kills it after delayUs microseconds (it may have ended); counts
    // the kills that landed.
    void RunAndKill(const std::vector<std::string> &args, int delayUs) {
        std::vector<std::string> argv = Command(args);
        pid_t pid = fork();
        if (pid == 0) {
            int null = open("/dev/null", O_WRONLY);
            dup2(null, 1);
            dup2(null, 2);
            std::vector<char *> a;
            for (const std::string &s : argv) a.push_back(const_cast<char *>(s.c_str()));
            a.push_back(nullptr);
            execv(a[0], a.data());
            _exit(127);
        }
        usleep(static_cast<useconds_t>(delayUs));
        kill(pid, SIGKILL);
        int status = 0;
        waitpid(pid, &status, 0);
        if (WIFSIGNALED(status)) ++killed_;
    }
    int killed_ = 0;

    // Section names of a file, or a failure when it does not parse.
    std::set<std::string> Sections(const std::string &logical) {
        std::set<std::string> out;
        POLIBC_SZLIST list = nullptr;
        int n = ORLOiSCSIConfSectionEnum(logical.c_str(), &list);
        EXPECT_GE(n, 0) << logical << " does not parse";
        for (int i = 0; i < n; ++i) out.insert(OLIBCSzListGet(list, i));
        if (list != nullptr) OLIBCSzListFree(list);
        return out;
    }

    std::vector<std::string> LunNames() {
        std::vector<std::string> out;
        ORLOiSCSILunList luns = {};
        ORLOiSCSILunFilter all = {};
        all.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
        EXPECT_EQ(0u, ORLOiSCSILunConfLoad(&all, &luns));
        ORLOiSCSIListLink *link;
        ORLOiSCSILun *lun;
        if (ORLOiSCSIListIsInit(&luns)) {
            ORLO_ISCSI_LUN_LIST_FOREACH(&luns, link, lun) out.push_back(lun->name);
        }
        ORLOiSCSILunListFree(&luns);
        return out;
    }

    // Everything that must hold after the command that follows a kill.
    void ExpectNothingLeft(const std::string &when) {
        SCOPED_TRACE(when);
        for (const std::string &dir : {std::string("/usr/orlo/etc"), std::string("/volume1/@iSCSI/LUN")}) {
            for (const std::string &f : Dir(dir)) {
                size_t dot = f.rfind('.');
                EXPECT_FALSE(f.find(".conf.") != std::string::npos && dot != std::string::npos && f.size() - dot == 7)
                    << "temporary file left: " << dir << "/" << f;
            }
        }
        const std::set<std::string> global = Sections("/usr/orlo/etc/iscsi_lun.conf");
        const std::set<std::string> volume = Sections("/volume1/@iSCSI/LUN/iscsi_lun.conf");
        EXPECT_EQ(global, volume) << "a LUN section in one file only";
        for (const char *f : {"/usr/orlo/etc/iscsi_target.conf", "/usr/orlo/etc/iscsi_mapping.conf",
                              "/usr/orlo/etc/iscsi_acl.conf"})
            Sections(f);
        ORLOiSCSILunList luns = {};
        ORLOiSCSILunFilter all = {};
        all.flags = ORLO_ISCSI_LUN_FILTER_ALL_WITH_BKP;
        EXPECT_EQ(0u, ORLOiSCSILunConfLoad(&all, &luns)) << "the LUN file loads";
        ORLOiSCSILunListFree(&luns);
        // Every LUN directory is named by a section.
        for (const std::string &type : Dir("/volume1/@iSCSI/LUN")) {
            struct stat st;
            if (lstat(Real("/volume1/@iSCSI/LUN/" + type).c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) continue;
            for (const std::string &uuid : Dir("/volume1/@iSCSI/LUN/" + type))
                EXPECT_EQ(1u, global.count("LUN_" + uuid)) << "orphan LUN directory " << type << "/" << uuid;
        }
        // Progress files belong to living processes only; none runs now.
        for (const std::string &f : Dir("/tmp/iscsi"))
            EXPECT_EQ(std::string::npos, f.find(".progress")) << "stale progress file " << f;
        EXPECT_FALSE(Exists("/usr/orlo/etc/iscsi_lun_pending.conf")) << "an operation is still pending";
    }
};

TEST_F(Crash, TwoHundredKilledWritersLeaveNothingBehindTheNextCommand) {
    std::mt19937 rng(20261123);
    // Each kind of command is killed at a moment drawn from its own running time, as the
    // last complete run of that kind measured it (start-up included), so that the kills
    // spread over the whole of the work.
    int lastRunUs[4] = {20000, 20000, 20000, 20000};
    auto timed = [](const std::function<void()> &f) {
        auto t0 = std::chrono::steady_clock::now();
        f();
        return static_cast<int>(
            std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::steady_clock::now() - t0).count());
    };
    const char *const kTypes[] = {"FILE", "THIN", "ADV"};
    std::string err;
    ASSERT_EQ(0, Cli({"target", "create", "mapped"}, nullptr, &err)) << err;
    int luns = 0, targets = 0;
    auto create = [&](bool kill, int delayUs) {
        std::string name = "c" + std::to_string(luns++);
        std::vector<std::string> args = {"lun", "create", "--name", name, "--type", kTypes[luns % 3], "--size", "4M",
                                         "--volume", "/volume1"};
        if (kill) {
            RunAndKill(args, delayUs);
        } else {
            EXPECT_EQ(0, Cli(args, nullptr, &err)) << err;
        }
        return name;
    };
    for (int trial = 0; trial < kTrials; ++trial) {
        const int kind = trial % 4;
        const int d = std::uniform_int_distribution<int>(0, lastRunUs[kind])(rng);
        switch (kind) {
            case 0:
                create(true, d);
                lastRunUs[kind] = timed([&] { create(false, 0); });
                break;
            case 1: {
                // A LUN made for the purpose is killed while it is deleted; the next
                // deletion is of another LUN.
                std::string victim = create(false, 0);
                std::string next = create(false, 0);
                RunAndKill({"lun", "delete", victim}, d);
                lastRunUs[kind] = timed([&] { EXPECT_EQ(0, Cli({"lun", "delete", next}, nullptr, &err)) << err; });
                break;
            }
            case 2:
                RunAndKill({"target", "create", "k" + std::to_string(targets++), "--disabled"}, d);
                lastRunUs[kind] = timed([&] {
                    EXPECT_EQ(0, Cli({"target", "create", "k" + std::to_string(targets++), "--disabled"}, nullptr, &err))
                        << err;
                });
                break;
            case 3: {
                std::string a = create(false, 0), b = create(false, 0);
                RunAndKill({"map", "add", "mapped", a}, d);
                lastRunUs[kind] = timed([&] { EXPECT_EQ(0, Cli({"map", "add", "mapped", b}, nullptr, &err)) << err; });
                // Keep the target's mappings few: take both out again.
                Cli({"map", "remove", "mapped", a});
                EXPECT_EQ(0, Cli({"map", "remove", "mapped", b}, nullptr, &err)) << err;
                break;
            }
        }
        ExpectNothingLeft("trial " + std::to_string(trial) + " (delay " + std::to_string(d) + " us)");
        if (HasFailure()) break;
        // Now and then every LUN goes, so that the volume and the LUN limit never run
        // short; deletions are where killed deletions are finished, too.
        if (trial % 40 == 39) {
            for (const std::string &name : LunNames()) {
                if (Cli({"lun", "delete", name}, nullptr, &err) != 0) {
                    // Mapped by a killed "map add" that reached the file: unmapped first.
                    Cli({"map", "remove", "mapped", name});
                    EXPECT_EQ(0, Cli({"lun", "delete", name}, nullptr, &err)) << err;
                }
            }
            ExpectNothingLeft("clearing after trial " + std::to_string(trial));
        }
    }
    // Most kills must land while the command still runs, or the test proves little.
    printf("%d of %d commands were killed before they ended\n", killed_, kTrials);
    EXPECT_GE(killed_, kTrials / 2);
}

}  // namespace
