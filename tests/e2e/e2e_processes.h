// Running several orloiscsi processes at once, as the appliance's management programs do,
// and a sandbox with the service started and a tmpfs data volume for them to work on.
#ifndef ORLO_TESTS_E2E_E2E_PROCESSES_H
#define ORLO_TESTS_E2E_E2E_PROCESSES_H

#include <fcntl.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "support/configfs_sim_fixture.h"

namespace e2e {

struct Outcome {
    int status = -1;  // exit status, or -1 when killed
    std::string out, err;
};

// Starts every command line, held at a gate until all are forked, then lets them go at
// once and waits for all.  Output goes through files (no pipe can fill up).
inline std::vector<Outcome> RunTogether(const std::vector<std::vector<std::string>> &commands,
                                        const std::string &scratchDir) {
    int gate[2];
    std::vector<Outcome> outcomes(commands.size());
    if (pipe(gate) != 0) return outcomes;
    std::vector<pid_t> pids;
    for (size_t i = 0; i < commands.size(); ++i) {
        std::string outPath = scratchDir + "/run" + std::to_string(i) + ".out";
        std::string errPath = scratchDir + "/run" + std::to_string(i) + ".err";
        pid_t pid = fork();
        if (pid == 0) {
            close(gate[1]);
            char c;
            while (read(gate[0], &c, 1) < 0 && errno == EINTR) {
            }
            int o = open(outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
            int e = open(errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
            dup2(o, 1);
            dup2(e, 2);
            std::vector<char *> args;
            for (const std::string &a : commands[i]) args.push_back(const_cast<char *>(a.c_str()));
            args.push_back(nullptr);
            execv(args[0], args.data());
            _exit(127);
        }
        pids.push_back(pid);
    }
    close(gate[0]);
    close(gate[1]);  // the gate opens
    for (size_t i = 0; i < pids.size(); ++i) {
        int status = 0;
        waitpid(pids[i], &status, 0);
        outcomes[i].status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        std::ifstream o(scratchDir + "/run" + std::to_string(i) + ".out"), e(scratchDir + "/run" + std::to_string(i) + ".err");
        std::stringstream so, se;
        so << o.rdbuf();
        se << e.rdbuf();
        outcomes[i].out = so.str();
        outcomes[i].err = se.str();
    }
    return outcomes;
}

// A sandbox with the simulated kernel target, the service started and a tmpfs volume.
class ServiceSandbox : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        WriteFile("/etc.defaults/orloinfo.conf",
                  "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\nmax_iscsiluns=\"1024\"\n");
        ASSERT_EQ(0, mount("tmpfs", Real("/volume1").c_str(), "tmpfs", 0, "size=512m")) << strerror(errno);
        volumeMounted_ = true;
        std::string err;
        ASSERT_EQ(0, Cli({"service", "start"}, nullptr, &err)) << err;
        scratch_ = orlotest::MakeTempDir("orlo-e2e-runs");
    }
    void TearDown() override {
        if (!scratch_.empty()) orlotest::RemoveTree(scratch_);
        if (volumeMounted_) umount2(Real("/volume1").c_str(), MNT_DETACH);
        ConfigfsSimTest::TearDown();
    }
    std::vector<std::string> Command(std::vector<std::string> args) const {
        std::vector<std::string> argv = {orlotest::BuiltProgram("orloiscsi"), "--root", root()};
        argv.insert(argv.end(), args.begin(), args.end());
        return argv;
    }
    int Cli(std::vector<std::string> args, std::string *out = nullptr, std::string *err = nullptr) {
        return orlotest::RunProgram(Command(std::move(args)), out, err);
    }

    bool volumeMounted_ = false;
    std::string scratch_;
};

}  // namespace e2e

#endif
