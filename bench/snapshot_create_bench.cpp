// The time to take the n-th snapshot of one block-family LUN (n = 1, 128, 256) on a
// loop-mounted Btrfs volume: a creation reads the LUN's snapshot file to count, name and
// number the new snapshot and writes it again, so its cost grows with the snapshots there
// are.  The 256th should cost no more than three times the first.  Needs root and
// mkfs.btrfs; prints the ratios after the benchmarks.
#include <benchmark/benchmark.h>
#include <stdlib.h>
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
#include "orloiscsi_snapshot.h"

namespace {

ORLOiSCSISnapshot Request(const std::string &name) {
    ORLOiSCSISnapshot s;
    memset(&s, 0, sizeof(s));
    s.lock_fd = -1;
    snprintf(s.name, sizeof(s.name), "%s", name.c_str());
    snprintf(s.taken_by, sizeof(s.taken_by), "bench");
    return s;
}

// A sandbox root with a Btrfs volume at /volume1 and one block-family LUN on it.
class Appliance {
  public:
    bool Start(std::string *why) {
        if (geteuid() != 0) {
            *why = "needs root to mount the volume";
            return false;
        }
        char tmpl[] = "/tmp/orlo-snapshot-bench.XXXXXX";
        if (mkdtemp(tmpl) == nullptr) return (*why = "mkdtemp failed", false);
        root_ = tmpl;
        std::filesystem::create_directories(root_ + "/volume1");
        std::filesystem::create_directories(root_ + "/etc.defaults");
        image_ = root_ + ".img";
        const std::string mk = "truncate -s 2G " + image_ + " && mkfs.btrfs -q -f " + image_ + " >/dev/null && mount -o loop " +
                               image_ + " " + root_ + "/volume1";
        if (system(mk.c_str()) != 0) return (*why = "cannot make a Btrfs volume (mkfs.btrfs, loop devices)", false);
        mounted_ = true;
        setenv("ORLO_SYSROOT", root_.c_str(), 1);
        if (ORLOiSCSIBaseMkdir(nullptr) != 0) return (*why = "cannot make the runtime directories", false);
        memset(&lun_, 0, sizeof(lun_));
        lun_.lockHandle = -1;
        lun_.type = ORLO_ISCSI_LUN_TYPE_BLUN;
        lun_.size = 64 << 20;
        lun_.blockSize = 512;
        snprintf(lun_.name, sizeof(lun_.name), "bench");
        snprintf(lun_.rootPath, sizeof(lun_.rootPath), "/volume1");
        if (ORLOiSCSILunCreate(&lun_) != 0) return (*why = "cannot create the LUN", false);
        return true;
    }
    ~Appliance() {
        if (mounted_) system(("umount -l " + root_ + "/volume1").c_str());
        if (!image_.empty()) unlink(image_.c_str());
        if (!root_.empty()) std::filesystem::remove_all(root_);
    }
    bool FillTo(int count) {
        for (; taken_ < count; ++taken_) {
            ORLOiSCSISnapshot s = Request("fill-" + std::to_string(taken_ + 1));
            if (ORLOiSCSISnapshotCreate(&lun_, &s) != 0) return false;
        }
        return true;
    }
    ORLOiSCSILun *lun() { return &lun_; }

  private:
    std::string root_, image_;
    bool mounted_ = false;
    ORLOiSCSILun lun_;
    int taken_ = 0;
};

Appliance *gAppliance = nullptr;
orlobench::NthMedians gMedians;

// Takes the n-th snapshot (n - 1 are there) and deletes it again outside the timing.
void BM_TakeNthSnapshot(benchmark::State &state) {
    const int n = static_cast<int>(state.range(0));
    if (gAppliance == nullptr || !gAppliance->FillTo(n - 1)) {
        state.SkipWithError("cannot prepare the LUN's snapshots");
        return;
    }
    std::vector<double> times;
    for (auto _ : state) {
        ORLOiSCSISnapshot s = Request("bench-" + std::to_string(n));
        const bool made = gMedians.Time(state, &times, [&] { return ORLOiSCSISnapshotCreate(gAppliance->lun(), &s) == 0; });
        if (!made || s.sid != n || ORLOiSCSISnapshotDelete(&s, nullptr) != 0) {
            state.SkipWithError("taking or deleting the snapshot failed");
            return;
        }
    }
    gMedians.Keep(n, times);
    state.counters["snapshots_before"] = n - 1;
}
BENCHMARK(BM_TakeNthSnapshot)->Arg(1)->Arg(128)->Arg(256)->Iterations(20)->UseManualTime()->Unit(benchmark::kMillisecond);

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    Appliance appliance;
    std::string why;
    if (!appliance.Start(&why)) {
        fprintf(stderr, "snapshot_create_bench: %s\n", why.c_str());
        return 0;
    }
    gAppliance = &appliance;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    gAppliance = nullptr;
    gMedians.Print("take the n-th snapshot of one LUN", 256, 3.0);
    return 0;
}
