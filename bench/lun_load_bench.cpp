// Speed of putting LUNs into the kernel target and taking them out again, against the
// simulated kernel target: 1024 LUNs loaded (backstore, control string, five attributes,
// switch) and unloaded (link search, removal), reported in LUNs per second for each
// phase (load_luns_per_s, unload_luns_per_s).  File LUNs and advanced LUNs, and file LUNs
// again with 64 mapped targets in the fabric (each linking a backstore of its own): an
// unload must not grow with the targets, and the last line prints its rate next to the
// bound of 500 LUNs per second.  Needs root and /dev/fuse; mounts a private simulator
// under /tmp.
#include <benchmark/benchmark.h>

#include "bench_sim.h"
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
#include <string>
#include <thread>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"

namespace {

constexpr int kLuns = 1024;
constexpr double kMappedUnloadBound = 500;  // LUNs per second, with 64 mapped targets
double g_mappedUnloadRate = -1;
std::string g_root;
std::string g_mount;
std::vector<ORLOiSCSILun> g_file, g_adv;

std::string M(const std::string &inside) { return g_mount + inside; }

using benchsim::Put;

ORLOiSCSILun Record(int lid, uint32_t type) {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.lid = lid;
    lun.lockHandle = -1;
    lun.type = type;
    lun.blockSize = 512;
    lun.size = 1ull << 30;
    snprintf(lun.uuid, sizeof(lun.uuid), "b0000000-0000-4000-8000-%04x%08d", type, lid);
    snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "bench-%d", lid);
    snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
    snprintf(lun.name, sizeof(lun.name), "bench-%u-%d", type, lid);
    return lun;
}

// The LUNs' directories and data files, as creation leaves them.
bool MakeLuns(uint32_t type, std::vector<ORLOiSCSILun> *out) {
    for (int lid = 1; lid <= kLuns; ++lid) {
        ORLOiSCSILun lun = Record(lid, type);
        char data[4096];
        if (ORLOiSCSILunMkdir(&lun) != 0 || ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)) != 0) return false;
        uint32_t ret = ORLO_ISCSI_LUN_IS_ADV(type)
                           ? ORLOiSCSIEpMapFileMetaInit(data, lun.rootPath, lun.size)
                           : ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE);
        if (ret != 0) return false;
        out->push_back(lun);
    }
    return true;
}

// 64 targets, each mapping one backstore of its own through lun/lun_0.
bool MakeTargets() {
    if (mkdir(M("/target/iscsi").c_str(), 0700) != 0 && errno != EEXIST) return false;
    for (int i = 1; i <= 64; ++i) {
        std::string n = std::to_string(i);
        std::string b = M("/target/core/fileio_0/MAPPED_" + n);
        std::string g = M("/target/iscsi/iqn.2000-01.com.orlo:t" + n + "/tpgt_1");
        if (mkdir(b.c_str(), 0700) != 0 ||
            !Put(b + "/control", "fd_dev_name=/volume1/lun.img,fd_dev_size=1048576") || !Put(b + "/enable", "1") ||
            mkdir(M("/target/iscsi/iqn.2000-01.com.orlo:t" + n).c_str(), 0700) != 0 ||
            mkdir(g.c_str(), 0700) != 0 || mkdir((g + "/lun/lun_0").c_str(), 0700) != 0 ||
            symlink(b.c_str(), (g + "/lun/lun_0/lnk").c_str()) != 0)
            return false;
    }
    return true;
}

// Returns the unload rate (LUNs per second).
double LoadUnload(benchmark::State &state, std::vector<ORLOiSCSILun> *luns) {
    using Clock = std::chrono::steady_clock;
    double loadSec = 0, unloadSec = 0;
    for (auto _ : state) {
        auto t0 = Clock::now();
        for (const ORLOiSCSILun &lun : *luns)
            if (ORLOiSCSILunLoad(&lun) != 0) state.SkipWithError("load failed");
        auto t1 = Clock::now();
        for (const ORLOiSCSILun &lun : *luns)
            if (ORLOiSCSILunUnload(&lun) != 0) state.SkipWithError("unload failed");
        auto t2 = Clock::now();
        loadSec += std::chrono::duration<double>(t1 - t0).count();
        unloadSec += std::chrono::duration<double>(t2 - t1).count();
        state.SetIterationTime(std::chrono::duration<double>(t2 - t0).count());
    }
    const double n = static_cast<double>(state.iterations()) * static_cast<double>(luns->size());
    state.counters["load_luns_per_s"] = loadSec > 0 ? n / loadSec : 0;
    const double unloadRate = unloadSec > 0 ? n / unloadSec : 0;
    state.counters["unload_luns_per_s"] = unloadRate;
    state.SetItemsProcessed(static_cast<int64_t>(2 * n));
    return unloadRate;
}

void BM_File1024(benchmark::State &state) { LoadUnload(state, &g_file); }
BENCHMARK(BM_File1024)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(3);

void BM_Adv1024(benchmark::State &state) { LoadUnload(state, &g_adv); }
BENCHMARK(BM_Adv1024)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(3);

void BM_File1024With64MappedTargets(benchmark::State &state) {
    static const bool made = MakeTargets();
    if (!made) {
        state.SkipWithError("could not build the targets");
        return;
    }
    g_mappedUnloadRate = LoadUnload(state, &g_file);
}
BENCHMARK(BM_File1024With64MappedTargets)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(3);

bool Prepare() {
    FILE *f = fopen((g_root + "/etc.defaults/orloinfo.conf").c_str(), "w");
    if (f == nullptr) return false;
    fputs("support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n", f);
    fclose(f);
    int fd = open((g_root + "/volume1/lun.img").c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0644);
    if (fd >= 0) close(fd);
    return ORLOiSCSIBaseMkdir(nullptr) == 0 && ORLOiSCSIBaseMkdir("/volume1") == 0 &&
           ORLOiSCSIEpMetaFilesCreate("/volume1", 0) == 0 && MakeLuns(ORLO_ISCSI_LUN_TYPE_THIN, &g_file) &&
           MakeLuns(ORLO_ISCSI_LUN_TYPE_ADV, &g_adv);
}

}  // namespace

int main(int argc, char **argv) {
    int rc = benchsim::Main(argc, argv, "lun_load_bench",
                            {"/volume1", "/tmp", "/etc", "/etc.defaults", "/usr", "/usr/orlo", "/usr/orlo/etc"},
                            [](const benchsim::Sim &sim) {
                                g_root = sim.root;
                                g_mount = sim.mount;
                                setenv("ORLO_SYSROOT", g_root.c_str(), 1);
                                return Prepare();
                            });
    if (g_mappedUnloadRate >= 0)
        printf("unload with 64 mapped targets: %.0f LUNs/s (at least %.0f LUNs/s): %s\n", g_mappedUnloadRate,
               kMappedUnloadBound, g_mappedUnloadRate >= kMappedUnloadBound ? "within the bound" : "BELOW THE BOUND");
    return rc;
}
