// The time to create the n-th LUN of an appliance (n = 1, 256, 1024): creation reads the
// LUN file once under the creation lock and rewrites both LUN files, so its cost grows
// with the number of LUNs there are.  The 1024th creation should cost no more than three
// times the first.  Runs as root (the volume is a tmpfs mounted at /volume1 of a sandbox
// root); prints the ratios after the benchmarks.
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <sys/mount.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "bench_nth.h"
#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"

namespace {

constexpr uint64_t kLunSize = 1ULL << 30;

ORLOiSCSILun NewLun(const std::string &name) {
    ORLOiSCSILun lun = {};
    lun.type = ORLO_ISCSI_LUN_TYPE_THIN;
    lun.size = kLunSize;
    lun.blockSize = 512;
    snprintf(lun.name, sizeof(lun.name), "%s", name.c_str());
    snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
    return lun;
}

// A sandbox root with a mounted volume and a growing number of LUNs.
class Appliance {
  public:
    bool Start(std::string *why) {
        if (geteuid() != 0) {
            *why = "needs root to mount the volume";
            return false;
        }
        char tmpl[] = "/tmp/orlo-lun-create-bench.XXXXXX";
        if (mkdtemp(tmpl) == nullptr) {
            *why = "mkdtemp failed";
            return false;
        }
        root_ = tmpl;
        for (const char *d : {"/tmp", "/usr/orlo/etc", "/etc.defaults", "/volume1"})
            std::filesystem::create_directories(root_ + d);
        if (mount("tmpfs", (root_ + "/volume1").c_str(), "tmpfs", 0, "size=4g") != 0) {
            *why = std::string("mount tmpfs: ") + strerror(errno);
            return false;
        }
        mounted_ = true;
        std::ofstream(root_ + "/etc.defaults/orloinfo.conf") << "max_iscsiluns=\"1024\"\n";
        setenv("ORLO_SYSROOT", root_.c_str(), 1);
        return ORLOiSCSIBaseMkdir(nullptr) == 0;
    }
    ~Appliance() {
        if (mounted_) umount2((root_ + "/volume1").c_str(), MNT_DETACH);
        if (!root_.empty()) std::filesystem::remove_all(root_);
    }
    // Creates LUNs until there are count of them.
    bool FillTo(int count) {
        for (; luns_ < count; ++luns_) {
            ORLOiSCSILun lun = NewLun("fill-" + std::to_string(luns_ + 1));
            if (ORLOiSCSILunCreate(&lun) != 0) return false;
        }
        return true;
    }
    // Takes a LUN made by a creation away again: its sections, file and directory.
    static bool Remove(const ORLOiSCSILun &lun) {
        char dir[4096], data[4096];
        if (ORLOiSCSILunConfRemove(&lun) != 0 || ORLOiSCSILunDirPathGet(&lun, dir, sizeof(dir)) != 0 ||
            ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)) != 0)
            return false;
        const char *root = getenv("ORLO_SYSROOT");
        std::filesystem::remove(std::string(root) + data);
        std::filesystem::remove(std::string(root) + dir);
        return true;
    }

  private:
    std::string root_;
    bool mounted_ = false;
    int luns_ = 0;
};

Appliance *gAppliance = nullptr;
orlobench::NthMedians gMedians;

// Creates the n-th LUN (n - 1 are there), and takes it away again outside the timing.
void BM_CreateNthLun(benchmark::State &state) {
    const int n = static_cast<int>(state.range(0));
    if (gAppliance == nullptr || !gAppliance->FillTo(n - 1)) {
        state.SkipWithError("cannot prepare the appliance");
        return;
    }
    std::vector<double> times;
    for (auto _ : state) {
        ORLOiSCSILun lun = NewLun("bench-" + std::to_string(n));
        if (!gMedians.Time(state, &times, [&] { return ORLOiSCSILunCreate(&lun) == 0; }) || lun.lid != n) {
            state.SkipWithError("creation failed");
            return;
        }
        if (!Appliance::Remove(lun)) {
            state.SkipWithError("removal failed");
            return;
        }
    }
    gMedians.Keep(n, times);
    state.counters["luns_before"] = n - 1;
}
BENCHMARK(BM_CreateNthLun)->Arg(1)->Arg(256)->Arg(1024)->Iterations(30)->UseManualTime()->Unit(benchmark::kMillisecond);

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    Appliance appliance;
    std::string why;
    if (!appliance.Start(&why)) {
        fprintf(stderr, "lun_create_bench: %s\n", why.c_str());
        return 0;
    }
    gAppliance = &appliance;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    gAppliance = nullptr;
    gMedians.Print("create the n-th LUN", 1024, 3.0);
    return 0;
}
