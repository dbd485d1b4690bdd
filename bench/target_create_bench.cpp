// The time to create the n-th target of an appliance (n = 1, 128, 256): under the
// target lock a creation reads the target file to find the smallest free tid and to check
// that the name and the IQN are free, then writes its section, so its cost grows with the
// number of targets there are.  The 256th creation should cost no more than three times
// the first.  Targets are created disabled, so no kernel target is needed; prints the
// ratios after the benchmarks.
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

double Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

// A sandbox root with a growing number of targets.
class Appliance {
  public:
    bool Start() {
        char tmpl[] = "/tmp/orlo-target-create-bench.XXXXXX";
        if (mkdtemp(tmpl) == nullptr) return false;
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
std::map<int, double> gMedianSeconds;

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
        const double start = Now();
        const uint32_t ret = ORLOiSCSITargetCreate(&t);
        const double elapsed = Now() - start;
        state.SetIterationTime(elapsed);
        times.push_back(elapsed);
        if (ret != 0 || t.tid != n) {
            state.SkipWithError("creation failed");
            return;
        }
        if (ORLOiSCSITargetConfRemove(&t) != 0) {
            state.SkipWithError("removal failed");
            return;
        }
    }
    std::sort(times.begin(), times.end());
    gMedianSeconds[n] = times[times.size() / 2];
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
    if (gMedianSeconds.count(1) != 0) {
        const double first = gMedianSeconds[1];
        printf("\nmedian time to create the n-th target:\n");
        for (const auto &m : gMedianSeconds)
            printf("  n=%4d  %8.3f ms  %5.2f x the 1st%s\n", m.first, m.second * 1e3, m.second / first,
                   m.first == 256 ? (m.second <= 3 * first ? "  (within 3x)" : "  (above 3x)") : "");
    }
    return 0;
}
