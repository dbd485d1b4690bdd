// Snapshot records on a full appliance.
//
// 1. Listing every snapshot (ORLOiSCSISnapshotConfLoad) with 1024 LUNs of 16 snapshots
//    each, against the floor of reading those 1024 files once: open, read whole, split
//    into lines and key=value pairs, close.  The listing also reads the LUN file, takes a
//    lock file per LUN and builds 16384 records; it is held to 2x the floor.  A second
//    reference shows what the records cost by themselves: 16384 zeroed heap blocks of
//    sizeof(ORLOiSCSISnapshot) (about 5.6 KB, most of it the 4095-byte root path),
//    allocated and freed, which is memory the kernel must fault in and clear.
// 2. Finding a snapshot by UUID (ORLOiSCSISnapshotConfGetByUuid) with 1,000 and with
//    16,000 snapshots in the cache: the cache is spread over files by the UUID's first
//    three characters, so the look-up should barely grow; the second is held to 1.5x the
//    first.
// Each figure is printed next to its bound at the end.  The runs use a memory file system
// (/dev/shm when there is one) so that they measure the code and not the disk.
//
// Run: bench/snapshot_conf_bench [--benchmark_min_time=0.5]
#include <benchmark/benchmark.h>
#include <ftw.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_snapshot.h"
#include "platform/olibc_file_internal.h"

namespace {

constexpr int kLunCount = 1024;
constexpr int kSnapshotsPerLun = 16;
constexpr int kSmallCache = 1000;
constexpr int kLargeCache = 16000;

std::map<std::string, double> gSeconds;  // mean seconds per iteration, by benchmark
std::string gListRoot;                   // 1024 LUNs x 16 snapshots
std::string gSmallRoot;                  // a cache of 1,000 snapshots
std::string gLargeRoot;                  // a cache of 16,000 snapshots

std::string LunUuid(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "6e7c0000-0000-4000-8000-%012d", lid);
    return buf;
}

// Snapshot UUIDs spread over the cache files as random ones are.
std::string SnapUuid(int n) {
    char buf[40];
    uint32_t head = static_cast<uint32_t>(n) * 2654435761u;
    snprintf(buf, sizeof(buf), "%08x-5a9c-4d3e-8f40-%012d", head, n);
    return buf;
}

ORLOiSCSISnapshot Snap(int lid, int sid, int n) {
    ORLOiSCSISnapshot s;
    memset(&s, 0, sizeof(s));
    s.lid = lid;
    s.sid = sid;
    s.type = ORLO_ISCSI_SNAPSHOT_TYPE_ADV;
    s.total_size = 10737418240ull;
    s.mappedSize = 4096ull * static_cast<uint64_t>(n);
    s.time = 1700000000 + n;
    s.snapshot_time = 1700000000 + n;
    s.isAppConsistence = sid % 2 == 0;
    snprintf(s.name, sizeof(s.name), "SnapShot-%d", sid);
    snprintf(s.status, sizeof(s.status), "Healthy");
    snprintf(s.note, sizeof(s.note), "scheduled snapshot %d of LUN %d", sid, lid);
    snprintf(s.rootpath, sizeof(s.rootpath), "/volume1");
    snprintf(s.taken_by, sizeof(s.taken_by), "schedule");
    snprintf(s.uuid, sizeof(s.uuid), "%s", SnapUuid(n).c_str());
    snprintf(s.parent_uuid, sizeof(s.parent_uuid), "%s", LunUuid(lid).c_str());
    snprintf(s.version, sizeof(s.version), "%s", SnapUuid(n + 1000000).c_str());
    return s;
}

// The section as the library writes it.
std::string SectionText(const ORLOiSCSISnapshot &s) {
    char buf[8192];
    snprintf(buf, sizeof(buf),
             "[SNAPSHOT_%s]\n\tlid=%d\n\tsid=%d\n\ttotal_size=%llu\n\tmappedSize=%llu\n\ttime=%d\n"
             "\tsnapshot_time=%d\n\tisAppConsistence=%s\n\tlock=%s\n\tname=%s\n\tstatus=%s\n\tnote=%s\n"
             "\trootpath=%s\n\ttaken_by=%s\n\tuuid=%s\n\tversion=%s\n\tparent_uuid=%s\n\ttype=ADV\n",
             s.uuid, s.lid, s.sid, static_cast<unsigned long long>(s.total_size),
             static_cast<unsigned long long>(s.mappedSize), s.time, s.snapshot_time, s.isAppConsistence ? "yes" : "no",
             s.lock ? "yes" : "no", s.name, s.status, s.note, s.rootpath, s.taken_by, s.uuid, s.version,
             s.parent_uuid);
    return buf;
}

void Write(const std::string &path, const std::string &text) {
    FILE *f = fopen(path.c_str(), "w");
    if (f == nullptr) return;
    fwrite(text.data(), 1, text.size(), f);
    fclose(f);
}

std::string MakeRoot(const char *base) {
    std::string tmpl = std::string(base) + "/orlo-snap-bench-XXXXXX";
    if (mkdtemp(&tmpl[0]) == nullptr) return std::string();
    for (const char *d : {"/usr", "/usr/orlo", "/usr/orlo/etc", "/tmp", "/volume1", "/volume1/@iSCSI",
                          "/volume1/@iSCSI/Snapshot", "/etc.defaults"})
        mkdir((tmpl + d).c_str(), 0755);
    setenv("ORLO_SYSROOT", tmpl.c_str(), 1);
    ORLOiSCSIBaseMkdir(nullptr);
    return tmpl;
}

// 1024 LUNs in the LUN file, 16 snapshots in each LUN's snapshot file.
void BuildListRoot(const std::string &root) {
    std::string luns;
    int n = 0;
    for (int lid = 1; lid <= kLunCount; ++lid) {
        char section[1024];
        snprintf(section, sizeof(section),
                 "[LUN_%s]\n\tlid=%d\n\trootpath=/volume1\n\tname=LUN-%04d\n\tuuid=%s\n\tvpd_unit_serial=%s\n"
                 "\tbytes=1073741824\n\trestored_time=0\n\tdevtype=5\n\tpre_alloc=no\n\tbkp_obj=0\n"
                 "\tvaai_support=no\n",
                 LunUuid(lid).c_str(), lid, lid, LunUuid(lid).c_str(), LunUuid(lid).c_str());
        luns += section;
        std::string snaps;
        for (int sid = 1; sid <= kSnapshotsPerLun; ++sid) snaps += SectionText(Snap(lid, sid, ++n));
        Write(root + "/volume1/@iSCSI/Snapshot/iscsi_snapshot_" + LunUuid(lid) + ".conf", snaps);
    }
    Write(root + "/usr/orlo/etc/iscsi_lun.conf", luns);
}

// A cache of count snapshots, each in the file its UUID names.
void BuildCacheRoot(const std::string &root, int count) {
    std::map<std::string, std::string> files;
    for (int n = 1; n <= count; ++n) {
        ORLOiSCSISnapshot s = Snap(1 + n % kLunCount, 1 + n % 256, n);
        files[std::string(s.uuid, 3)] += SectionText(s);
    }
    for (const auto &kv : files) {
        Write(root + "/tmp/iscsi/snapshot_cache/iscsi_snapshot_" + kv.first + ".conf.cache", kv.second);
    }
}

// ---- Listing ----

void BM_ListFloor(benchmark::State &state) {
    setenv("ORLO_SYSROOT", gListRoot.c_str(), 1);
    std::vector<std::string> paths;
    for (int lid = 1; lid <= kLunCount; ++lid)
        paths.push_back("/volume1/@iSCSI/Snapshot/iscsi_snapshot_" + LunUuid(lid) + ".conf");
    size_t keys = 0;
    for (auto _ : state) {
        for (const std::string &p : paths) {
            orlo::olibc::FileImage image;
            if (orlo::olibc::ReadImage(p.c_str(), &image, false) != 0) {
                state.SkipWithError("read failed");
                return;
            }
            orlo::olibc::LineScanner scanner(image.data);
            orlo::olibc::Line line;
            while (scanner.Next(&line)) {
                scanner.Parse(&line);
                keys += line.kind == orlo::olibc::LineKind::kKey;
            }
        }
        benchmark::DoNotOptimize(keys);
    }
}

// The records alone: as many zeroed blocks as the listing builds, touched where a record
// is written, then freed.
void BM_RecordsFloor(benchmark::State &state) {
    std::vector<ORLOiSCSISnapshot *> records(static_cast<size_t>(kLunCount * kSnapshotsPerLun));
    for (auto _ : state) {
        for (ORLOiSCSISnapshot *&r : records) {
            r = static_cast<ORLOiSCSISnapshot *>(calloc(1, sizeof(ORLOiSCSISnapshot)));
            if (r == nullptr) {
                state.SkipWithError("out of memory");
                return;
            }
            r->sid = 1;
            r->rootpath[0] = '/';
            r->uuid[0] = 'u';
        }
        benchmark::DoNotOptimize(records.data());
        for (ORLOiSCSISnapshot *r : records) free(r);
    }
}

void BM_ConfLoad(benchmark::State &state) {
    setenv("ORLO_SYSROOT", gListRoot.c_str(), 1);
    for (auto _ : state) {
        ORLOiSCSISnapshotList list;
        ORLOiSCSIListInit(&list);
        ORLOiSCSISnapshotFilter all = {};
        if (ORLOiSCSISnapshotConfLoad(&all, &list) != 0 || list.count != kLunCount * kSnapshotsPerLun) {
            state.SkipWithError("listing failed");
            ORLOiSCSISnapshotListFree(&list);
            return;
        }
        ORLOiSCSISnapshotListFree(&list);
    }
    state.counters["snapshots"] = kLunCount * kSnapshotsPerLun;
}

// ---- By UUID ----

void GetByUuid(benchmark::State &state, const std::string &root, int count) {
    setenv("ORLO_SYSROOT", root.c_str(), 1);
    std::vector<std::string> uuids;
    for (int n = 1; n <= count; n += count / 500) uuids.push_back(SnapUuid(n));
    size_t i = 0;
    for (auto _ : state) {
        ORLOiSCSISnapshot s;
        if (ORLOiSCSISnapshotConfGetByUuid(uuids[i++ % uuids.size()].c_str(), &s) != 0) {
            state.SkipWithError("look-up failed");
            return;
        }
        benchmark::DoNotOptimize(s.sid);
    }
}

void BM_GetByUuid1000(benchmark::State &state) { GetByUuid(state, gSmallRoot, kSmallCache); }
void BM_GetByUuid16000(benchmark::State &state) { GetByUuid(state, gLargeRoot, kLargeCache); }

class BoundReporter : public benchmark::ConsoleReporter {
  public:
    void ReportRuns(const std::vector<Run> &runs) override {
        for (const Run &r : runs) {
            if (r.run_type != Run::RT_Iteration || r.iterations == 0) continue;
            gSeconds[r.run_name.function_name] = r.real_accumulated_time / static_cast<double>(r.iterations);
        }
        ConsoleReporter::ReportRuns(runs);
    }
    void Finalize() override {
        ConsoleReporter::Finalize();
        auto line = [](const char *what, const char *num, const char *den, double bound) {
            auto a = gSeconds.find(num);
            auto b = gSeconds.find(den);
            if (a == gSeconds.end() || b == gSeconds.end() || b->second <= 0) return true;
            double ratio = a->second / b->second;
            printf("%-46s %10.3f ms %10.3f ms %7.2f  (bound %.1f) %s\n", what, a->second * 1e3, b->second * 1e3, ratio,
                   bound, ratio <= bound ? "ok" : "EXCEEDED");
            return ratio <= bound;
        };
        printf("\n%-46s %13s %13s %7s\n", "", "measured", "against", "ratio");
        bool ok = line("ConfLoad, 1024 LUNs x 16 / reading the files", "BM_ConfLoad", "BM_ListFloor", 2.0);
        auto load = gSeconds.find("BM_ConfLoad");
        auto files = gSeconds.find("BM_ListFloor");
        auto records = gSeconds.find("BM_RecordsFloor");
        if (load != gSeconds.end() && files != gSeconds.end() && records != gSeconds.end())
            printf("%-46s %10.3f ms %10.3f ms %7.2f  (no bound: the records alone take %.3f ms)\n",
                   "ConfLoad / (reading the files + the records)", load->second * 1e3,
                   (files->second + records->second) * 1e3, load->second / (files->second + records->second),
                   records->second * 1e3);
        ok = line("GetByUuid, 16,000 / 1,000 in the cache", "BM_GetByUuid16000", "BM_GetByUuid1000", 1.5) && ok;
        printf("%s\n", ok ? "every figure within its bound" : "SOME FIGURE EXCEEDS ITS BOUND");
    }
};

int RemoveOne(const char *path, const struct stat *, int type, struct FTW *) {
    if (type == FTW_DP)
        rmdir(path);
    else
        unlink(path);
    return 0;
}

}  // namespace

BENCHMARK(BM_ListFloor)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_RecordsFloor)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ConfLoad)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_GetByUuid1000)->Unit(benchmark::kMicrosecond)->UseRealTime();
BENCHMARK(BM_GetByUuid16000)->Unit(benchmark::kMicrosecond)->UseRealTime();

int main(int argc, char **argv) {
    struct stat st;
    const char *base = stat("/dev/shm", &st) == 0 && S_ISDIR(st.st_mode) ? "/dev/shm" : "/tmp";
    gListRoot = MakeRoot(base);
    gSmallRoot = MakeRoot(base);
    gLargeRoot = MakeRoot(base);
    if (gListRoot.empty() || gSmallRoot.empty() || gLargeRoot.empty()) return 1;
    printf("runs in %s\n", base);
    BuildListRoot(gListRoot);
    BuildCacheRoot(gSmallRoot, kSmallCache);
    BuildCacheRoot(gLargeRoot, kLargeCache);
    benchmark::Initialize(&argc, argv);
    BoundReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    unsetenv("ORLO_SYSROOT");
    for (const std::string &root : {gListRoot, gSmallRoot, gLargeRoot})
        nftw(root.c_str(), RemoveOne, 16, FTW_DEPTH | FTW_PHYS);
    return 0;
}
