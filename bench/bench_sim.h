// A simulated kernel target for the benchmarks that need one: a fresh temporary root,
// orlo-configfs-sim (built beside the benchmark program) mounted at <root>/config, and
// the newer generation's target-core and iSCSI modules inserted.  Needs root and
// /dev/fuse.  The simulator ends with the benchmark (PR_SET_PDEATHSIG) and Stop
// unmounts it and removes the root.
#ifndef ORLO_BENCH_BENCH_SIM_H
#define ORLO_BENCH_BENCH_SIM_H

#include <fcntl.h>
#include <ftw.h>
#include <limits.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <string>
#include <thread>

#include <benchmark/benchmark.h>

namespace benchsim {

struct Sim {
    std::string root;   // the sandbox root
    std::string mount;  // <root>/config
    pid_t pid = -1;
};

inline int RemoveOne(const char *path, const struct stat *, int type, struct FTW *) {
    if (type == FTW_DP)
        rmdir(path);
    else
        unlink(path);
    return 0;
}

inline bool WriteControl(const Sim &sim, const std::string &text) {
    int fd = open((sim.mount + "/.sim/modules").c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) return false;
    bool ok = write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    close(fd);
    return ok;
}

// Makes the root with the given top directories, mounts the simulator and inserts the
// modules.  False, with a line on stderr naming who, when it cannot.
inline bool Start(const char *who, std::initializer_list<const char *> dirs, Sim *sim) {
    char self[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", self, sizeof(self) - 1);
    if (n <= 0) return false;
    self[n] = '\0';
    std::string program = std::string(self).substr(0, std::string(self).rfind('/')) + "/orlo-configfs-sim";
    std::string tmpl = std::string("/tmp/orlo-") + who + "-XXXXXX";
    if (mkdtemp(&tmpl[0]) == nullptr) return false;
    sim->root = tmpl;
    sim->mount = sim->root + "/config";
    mkdir(sim->mount.c_str(), 0755);
    for (const char *d : dirs) mkdir((sim->root + d).c_str(), 0755);
    sim->pid = fork();
    if (sim->pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGTERM);
        execl(program.c_str(), program.c_str(), "--root", sim->root.c_str(), sim->mount.c_str(),
              static_cast<char *>(nullptr));
        _exit(127);
    }
    struct stat st;
    bool up = false;
    for (int i = 0; i < 2000 && !up; ++i) {
        up = stat((sim->mount + "/.sim/modules").c_str(), &st) == 0;
        if (!up) std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    if (!up) {
        fprintf(stderr, "%s: %s did not mount\n", who, program.c_str());
        return false;
    }
    for (const char *m : {"rodsp_ep", "orlo_extent_pool", "target_core_mod", "target_core_iblock", "target_core_file",
                          "target_core_ep", "iscsi_target_mod"})
        if (!WriteControl(*sim, std::string("insert ") + m + "\n")) {
            fprintf(stderr, "%s: could not insert %s\n", who, m);
            return false;
        }
    return true;
}

inline void Stop(Sim *sim) {
    if (sim->pid > 0) {
        kill(sim->pid, SIGTERM);
        waitpid(sim->pid, nullptr, 0);
        sim->pid = -1;
    }
    if (!sim->mount.empty()) umount2(sim->mount.c_str(), MNT_DETACH);
    if (!sim->root.empty()) nftw(sim->root.c_str(), RemoveOne, 16, FTW_DEPTH | FTW_PHYS | FTW_MOUNT);
}

// Writes a whole attribute as a shell's "echo VALUE > PATH" does.
inline bool Put(const std::string &path, const char *value) {
    int fd = open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC);
    if (fd < 0) return false;
    size_t len = strlen(value);
    bool ok = write(fd, value, len) == static_cast<ssize_t>(len);
    close(fd);
    return ok;
}

// The main of a benchmark that needs the simulator: skips without root or /dev/fuse,
// starts it, lets prepare(sim) fill the sandbox, runs the benchmarks (shown by display
// when one is given, else by the library's reporter) and stops it.
template <typename Prepare>
int Main(int argc, char **argv, const char *who, std::initializer_list<const char *> dirs, Prepare prepare,
         benchmark::BenchmarkReporter *display = nullptr) {
    if (geteuid() != 0 || access("/dev/fuse", R_OK | W_OK) != 0) {
        fprintf(stderr, "%s: needs root and /dev/fuse to mount the simulator; skipped\n", who);
        return 0;
    }
    Sim sim;
    int rc = 1;
    if (Start(who, dirs, &sim)) {
        if (!prepare(sim)) {
            fprintf(stderr, "%s: could not prepare the sandbox\n", who);
        } else {
            benchmark::Initialize(&argc, argv);
            if (display != nullptr)
                benchmark::RunSpecifiedBenchmarks(display);
            else
                benchmark::RunSpecifiedBenchmarks();
            benchmark::Shutdown();
            rc = 0;
        }
    }
    Stop(&sim);
    return rc;
}

}  // namespace benchsim

#endif
