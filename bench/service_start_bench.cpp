// Speed of bringing the whole iSCSI service up from its configuration files and taking it
// down again, against the simulated kernel target: 1024 LUNs, 256 targets with 4
// mappings and 4 access entries each (3 initiators and the default entry), and the same
// at half the size.  For each run it reports the wall time, the configfs operations the
// library issued next to the fewest the resulting tree needs, and the configuration
// sections it parsed; at the end the full/half time ratio of the start, which must stay
// at or under 2.3 for the start to grow linearly.  Needs root and /dev/fuse; mounts a
// private simulator under /tmp.
#include <benchmark/benchmark.h>

#include "bench_sim.h"

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "platform/olibc_file_internal.h"

namespace {

constexpr int kFullTargets = 256;
constexpr int kMappingsPerTarget = 4;
std::string g_root;
std::string g_mount;
std::map<int, double> g_startSec;  // targets -> mean start time

const char *const kConfs[] = {"iscsi_lun.conf", "iscsi_target.conf", "iscsi_acl.conf", "iscsi_mapping.conf"};

std::string Stash(int targets) { return g_root + "/usr/orlo/etc/bench-" + std::to_string(targets); }

bool CopyFile(const std::string &from, const std::string &to) {
    FILE *in = fopen(from.c_str(), "rb");
    if (in == nullptr) return false;
    FILE *out = fopen((to + ".tmp").c_str(), "wb");
    if (out == nullptr) {
        fclose(in);
        return false;
    }
    char buf[65536];
    size_t n;
    bool ok = true;
    while ((n = fread(buf, 1, sizeof(buf), in)) > 0) ok = ok && fwrite(buf, 1, n, out) == n;
    fclose(in);
    ok = fclose(out) == 0 && ok;
    return ok && rename((to + ".tmp").c_str(), to.c_str()) == 0;
}

// Saves, resp. puts back, the configuration files of one size.
bool SaveConfs(int targets) {
    mkdir(Stash(targets).c_str(), 0755);
    for (const char *c : kConfs)
        if (!CopyFile(g_root + "/usr/orlo/etc/" + c, Stash(targets) + "/" + c)) return false;
    return true;
}
bool UseConfs(int targets) {
    for (const char *c : kConfs)
        if (!CopyFile(Stash(targets) + "/" + c, g_root + "/usr/orlo/etc/" + c)) return false;
    return true;
}

ORLOiSCSILun LunRecord(int lid) {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.lid = lid;
    lun.lockHandle = -1;
    lun.type = ORLO_ISCSI_LUN_TYPE_THIN;
    lun.blockSize = 512;
    lun.size = 1ull << 30;
    snprintf(lun.uuid, sizeof(lun.uuid), "c0000000-0000-4000-8000-%012d", lid);
    snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "start-%d", lid);
    snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
    snprintf(lun.name, sizeof(lun.name), "start-%d", lid);
    return lun;
}

// Targets first..last with their LUNs, mappings and access entries, stored as the
// management programs store them.
bool MakeConfig(int first, int last) {
    for (int tid = first; tid <= last; ++tid) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        t.tid = tid;
        t.enabled = true;
        snprintf(t.name, sizeof(t.name), "bench-%d", tid);
        snprintf(t.iqn, sizeof(t.iqn), "iqn.2000-01.com.orlo-nas:bench-%d", tid);
        snprintf(t.network_portals, sizeof(t.network_portals), "192.0.2.1:3260");
        t.max_recv_seg_bytes = 262144;
        t.max_send_seg_bytes = 262144;
        t.max_sessions = 4;
        if (tid % 2 == 0) {
            t.auth_type = ORLO_ISCSI_AUTH_CHAP;
            snprintf(t.user, sizeof(t.user), "user-%d", tid);
            snprintf(t.password, sizeof(t.password), "secret-%d-abcd", tid);
        }
        if (ORLOiSCSITargetConfAdd(&t) != 0) return false;
        for (int k = 0; k < kMappingsPerTarget; ++k) {
            int lid = (tid - 1) * kMappingsPerTarget + k + 1;
            ORLOiSCSILun lun = LunRecord(lid);
            char data[4096];
            if (ORLOiSCSILunMkdir(&lun) != 0 || ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)) != 0 ||
                ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE) != 0 ||
                ORLOiSCSILunConfSet(&lun) != 0 || ORLOiSCSITargetConfMappingAdd(tid, lid, k) != 0)
                return false;
        }
        for (int h = 1; h <= 3; ++h) {
            char initiator[128];
            snprintf(initiator, sizeof(initiator), "iqn.1991-05.com.example:host-%d-%d", tid, h);
            if (ORLOiSCSITargetConfAclAdd(tid, initiator, h == 1 ? ISCSI_TARGET_AUTHORITY_RO : ISCSI_TARGET_AUTHORITY_RW) != 0)
                return false;
        }
        if (ORLOiSCSITargetConfAclAdd(tid, ORLO_ISCSI_DEFAULT_ACL_INITIATOR, ISCSI_TARGET_AUTHORITY_NONE) != 0) return false;
    }
    return true;
}

bool SimWrite(const std::string &file, const std::string &text) {
    int fd = open((g_mount + "/.sim/" + file).c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) return false;
    bool ok = write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    close(fd);
    return ok;
}

// What the library did to the kernel tree since the trace was cleared: changes issued,
// the fewest changes that reach the same tree, and reads.  Building, the fewest make each
// directory and link and write each attribute once; taking down, they remove each
// directory and link once (switching a group off first is a courtesy to initiators, not
// a need of the tree).
struct Ops {
    long issued = 0;
    long fewest = 0;
    long reads = 0;
};
Ops CountOps(bool building) {
    Ops ops;
    FILE *f = fopen((g_mount + "/.sim/trace").c_str(), "r");
    if (f == nullptr) return ops;
    std::set<std::string> distinct;
    char *line = nullptr;
    size_t cap = 0;
    while (getline(&line, &cap, f) > 0) {
        std::string l(line);
        size_t t1 = l.find('\t');
        size_t t2 = t1 == std::string::npos ? t1 : l.find('\t', t1 + 1);
        if (t2 == std::string::npos) continue;
        std::string op = l.substr(0, t1);
        if (op == "read") {
            ++ops.reads;
            continue;
        }
        ++ops.issued;
        distinct.insert(op + " " + l.substr(t1 + 1, t2 - t1 - 1));
    }
    free(line);
    fclose(f);
    for (auto it = distinct.begin(); it != distinct.end();) {
        const bool removal = it->compare(0, 6, "rmdir ") == 0 || it->compare(0, 7, "unlink ") == 0;
        if (removal != !building)
            it = distinct.erase(it);
        else
            ++it;
    }
    ops.fewest = static_cast<long>(distinct.size());
    return ops;
}

uint64_t Parsed() { return orlo::olibc::SectionStatsGet().parsed; }

void Report(benchmark::State &state, double sec, const Ops &ops, uint64_t parsed) {
    const double n = static_cast<double>(state.iterations());
    state.counters["wall_ms"] = sec / n * 1e3;
    state.counters["ops_issued"] = static_cast<double>(ops.issued);
    state.counters["ops_fewest"] = static_cast<double>(ops.fewest);
    state.counters["ops_reads"] = static_cast<double>(ops.reads);
    state.counters["sections_parsed"] = static_cast<double>(parsed) / n;
}

// One measured run a loop pass: prepare() (untimed) brings the service into the state the
// measured call starts from, measured() is timed; then the trace is counted.
template <typename Prepare, typename Measured>
double Measure(benchmark::State &state, bool building, Prepare prepare, Measured measured) {
    using Clock = std::chrono::steady_clock;
    if (!UseConfs(static_cast<int>(state.range(0)))) {
        state.SkipWithError("could not put the configuration in place");
        return 0;
    }
    double sec = 0;
    uint64_t parsed = 0;
    Ops ops;
    for (auto _ : state) {
        state.PauseTiming();
        if (!prepare() || !SimWrite("trace", "clear\n")) {
            state.SkipWithError("could not prepare the run");
            return 0;
        }
        state.ResumeTiming();
        uint64_t p0 = Parsed();
        auto t0 = Clock::now();
        uint32_t ret = measured();
        double s = std::chrono::duration<double>(Clock::now() - t0).count();
        parsed += Parsed() - p0;
        state.SetIterationTime(s);
        sec += s;
        if (ret != 0) {
            state.SkipWithError("the measured call failed");
            return 0;
        }
        state.PauseTiming();
        ops = CountOps(building);
        state.ResumeTiming();
    }
    Report(state, sec, ops, parsed);
    return sec / static_cast<double>(state.iterations());
}

void BM_StartAll(benchmark::State &state) {
    double sec = Measure(
        state, true, [] { return ORLOiSCSIStopAll() == 0 && ORLOiSCSILunServiceStopAll() == 0; },
        [] { return ORLOiSCSIStartAll(); });
    if (sec > 0) g_startSec[static_cast<int>(state.range(0))] = sec;
}
BENCHMARK(BM_StartAll)->Arg(kFullTargets / 2)->Arg(kFullTargets)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(2);

void BM_StopAll(benchmark::State &state) {
    Measure(state, false, [] { return ORLOiSCSIStartAll() == 0; }, [] { return ORLOiSCSIStopAll(); });
}
BENCHMARK(BM_StopAll)->Arg(kFullTargets / 2)->Arg(kFullTargets)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(2);

bool Prepare() {
    FILE *f = fopen((g_root + "/etc.defaults/orloinfo.conf").c_str(), "w");
    if (f == nullptr) return false;
    fputs("support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n", f);
    fclose(f);
    return ORLOiSCSIBaseMkdir(nullptr) == 0 && ORLOiSCSIBaseMkdir("/volume1") == 0 &&
           MakeConfig(1, kFullTargets / 2) && SaveConfs(kFullTargets / 2) &&
           MakeConfig(kFullTargets / 2 + 1, kFullTargets) && SaveConfs(kFullTargets);
}

}  // namespace

int main(int argc, char **argv) {
    int rc = benchsim::Main(argc, argv, "service_start_bench",
                            {"/volume1", "/tmp", "/etc", "/etc.defaults", "/usr", "/usr/orlo", "/usr/orlo/etc"},
                            [](const benchsim::Sim &sim) {
                                g_root = sim.root;
                                g_mount = sim.mount;
                                setenv("ORLO_SYSROOT", g_root.c_str(), 1);
                                return Prepare();
                            });
    auto half = g_startSec.find(kFullTargets / 2), full = g_startSec.find(kFullTargets);
    if (half != g_startSec.end() && full != g_startSec.end() && half->second > 0)
        printf("start: %d targets %.0f ms, %d targets %.0f ms, ratio %.2f (linear growth allows at most 2.30)\n",
               kFullTargets / 2, half->second * 1e3, kFullTargets, full->second * 1e3, full->second / half->second);
    return rc;
}
