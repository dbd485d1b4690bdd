// The time to create the n-th target of an appliance (n = 1, 128, 256): under the
// target lock a creation reads the target file to find the smallest free tid and to check
// that the name and the IQN are free, then writes its section, so its cost grows with the
// number of targets there are.  The 256th creation should cost no more than three times
// the first.  Targets are created disabled, so no kernel target is needed; prints the
// ratios after the benchmarks.  The root is on the disk, as the appliance's files are:
// each creation's file write is flushed (fsync), which is what a creation mostly costs.
// (On tmpfs the first creation costs about 70 us and the 256th about 1.6 ms, the rewrite
// of a file of 256 targets that every creation makes.)
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "bench_nth.h"
#include "orloiscsi_base.h"
#include "orloiscsi_target.h"

namespace {

ORLOiSCSITarget NewTarget(const std::string &name) {
    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    snprintf(t.name, sizeof(t.name), "%s", name.c_str());
    snprintf(t.iqn, sizeof(t.iqn), "iqn.2000-01.com.orlo-nas:bench.%s", name.c_str());
    t.max_recv_seg_bytes = 262144;
    t.max_send_seg_bytes = 262144;
    t.max_sessions = 1;
    return t;
}

// A sandbox root with a growing number of targets.
class Appliance {
  public:
    bool Start() {
        const char *base = getenv("ORLO_BENCH_DIR");  // e.g. /dev/shm for the code alone
        std::string tmpl = std::string(base != nullptr ? base : "/tmp") + "/orlo-target-create-bench.XXXXXX";
        if (mkdtemp(&tmpl[0]) == nullptr) return false;
        root_ = tmpl;
        setenv("ORLO_SYSROOT", root_.c_str(), 1);
        return ORLOiSCSIBaseMkdir(nullptr) == 0;
    }
    ~Appliance() {
        if (!root_.empty()) std::filesystem::remove_all(root_);
    }
    bool FillTo(int count) {
        for (; targets_ < count; ++targets_) {
            ORLOiSCSITarget t = NewTarget("fill-" + std::to_string(targets_ + 1));
            if (ORLOiSCSITargetCreate(&t) != 0) return false;
        }
        return true;
    }

  private:
    std::string root_;
    int targets_ = 0;
};

Appliance *gAppliance = nullptr;
orlobench::NthMedians gMedians;

// Creates the n-th target (n - 1 are there), and removes it again outside the timing.
void BM_CreateNthTarget(benchmark::State &state) {
    const int n = static_cast<int>(state.range(0));
    if (gAppliance == nullptr || !gAppliance->FillTo(n - 1)) {
        state.SkipWithError("cannot prepare the appliance");
        return;
    }
    std::vector<double> times;
    for (auto _ : state) {
        ORLOiSCSITarget t = NewTarget("bench-" + std::to_string(n));
        if (!gMedians.Time(state, &times, [&] { return ORLOiSCSITargetCreate(&t) == 0; }) || t.tid != n) {
            state.SkipWithError("creation failed");
            return;
        }
        if (ORLOiSCSITargetConfRemove(&t) != 0) {
            state.SkipWithError("removal failed");
            return;
        }
    }
    gMedians.Keep(n, times);
    state.counters["targets_before"] = n - 1;
}
BENCHMARK(BM_CreateNthTarget)->Arg(1)->Arg(128)->Arg(256)->Iterations(50)->UseManualTime()->Unit(benchmark::kMillisecond);

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    Appliance appliance;
    if (!appliance.Start()) {
        fprintf(stderr, "target_create_bench: cannot make a sandbox root\n");
        return 1;
    }
    gAppliance = &appliance;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    gAppliance = nullptr;
    gMedians.Print("create the n-th target", 256, 3.0);
    return 0;
}
