// Speed of the simulated kernel target: attribute open-write-close (one writer and
// two), open-read-close, backstore mkdir-rmdir, and a tree of 256 targets built and torn
// down with the same calls an administrator's script makes.  Each prints operations per
// second (items_per_second); the attribute writes run five times and report their
// median.  At the end the one-writer figure is printed next to its bound, with MISSED
// when it falls short.  Needs root and /dev/fuse; mounts a private simulator in /tmp.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <ostream>
#include <string>
#include <vector>

#include "bench_sim.h"

namespace {

std::string g_root;
std::string g_mount;

std::string M(const std::string &inside) { return g_mount + inside; }

using benchsim::Put;

void BM_AttributeOpenWriteClose(benchmark::State &state) {
    const std::string attr = M("/target/iscsi/iqn.2000-01.com.orlo:bench/tpgt_1/param/TargetAlias");
    for (auto _ : state)
        if (!Put(attr, "Orlo Target")) state.SkipWithError("write failed");
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_AttributeOpenWriteClose)->UseRealTime()->Repetitions(5)->ReportAggregatesOnly(true);
BENCHMARK(BM_AttributeOpenWriteClose)->Threads(2)->UseRealTime()->Repetitions(5)->ReportAggregatesOnly(true);

void BM_AttributeOpenReadClose(benchmark::State &state) {
    const std::string attr = M("/target/iscsi/iqn.2000-01.com.orlo:bench/tpgt_1/attrib/default_cmdsn_depth");
    char buf[64];
    for (auto _ : state) {
        int fd = open(attr.c_str(), O_RDONLY | O_CLOEXEC);
        if (fd < 0 || read(fd, buf, sizeof(buf)) <= 0) state.SkipWithError("read failed");
        if (fd >= 0) close(fd);
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_AttributeOpenReadClose)->UseRealTime();

// One mkdir and one rmdir of a backstore (with its default groups) per iteration.
void BM_BackstoreMkdirRmdir(benchmark::State &state) {
    const std::string dir = M("/target/core/fileio_0/LUN_bench_" + std::to_string(state.thread_index()));
    for (auto _ : state) {
        if (mkdir(dir.c_str(), 0700) != 0 || rmdir(dir.c_str()) != 0) state.SkipWithError("mkdir/rmdir failed");
    }
    state.SetItemsProcessed(state.iterations() * 2);
}
BENCHMARK(BM_BackstoreMkdirRmdir)->UseRealTime();

// 256 targets, each with a file backstore, a portal, a LUN entry with its link and an
// initiator with its LUN entry, built in the kernel's order and dismantled again.
void BM_Tree256Targets(benchmark::State &state) {
    int64_t ops = 0;
    bool ok = true;
    auto step = [&](bool r) {
        ok = ok && r;
        ++ops;
    };
    for (auto _ : state) {
        for (int i = 1; i <= 256; ++i) {
            std::string n = std::to_string(i);
            std::string b = M("/target/core/fileio_0/LUN_" + n);
            std::string t = M("/target/iscsi/iqn.2000-01.com.orlo:t" + n);
            std::string g = t + "/tpgt_1";
            std::string acl = g + "/acls/iqn.1991-05.com.example:host";
            step(mkdir(b.c_str(), 0700) == 0);
            step(Put(b + "/control", "fd_dev_name=/volume1/lun.img,fd_dev_size=1048576,thin_provision=1,"
                                     "block_size=512,enable_sink=x,fd_dio=0"));
            step(Put(b + "/attrib/lun_name", "bench"));
            step(Put(b + "/attrib/is_skip_resource_monitor", "0"));
            step(Put(b + "/alua/default_tg_pt_gp/alua_access_type", "1"));
            step(Put(b + "/enable", "1"));
            step(mkdir(t.c_str(), 0700) == 0);
            step(mkdir(g.c_str(), 0700) == 0);
            step(Put(g + "/attrib/default_cmdsn_depth", "16"));
            step(mkdir((g + "/np/127.0.0.1:3260").c_str(), 0700) == 0);
            step(Put(g + "/attrib/authentication", "0"));
            step(Put(g + "/param/DataDigest", "CRC32C,None"));
            step(Put(g + "/param/HeaderDigest", "CRC32C,None"));
            step(Put(g + "/param/MaxRecvDataSegmentLength", "262144"));
            step(Put(g + "/max_session", "65535"));
            step(Put(g + "/param/TargetAlias", "Orlo Target"));
            step(mkdir((g + "/lun/lun_0").c_str(), 0700) == 0);
            step(symlink(b.c_str(), (g + "/lun/lun_0/LUN_" + n).c_str()) == 0);
            step(mkdir(acl.c_str(), 0700) == 0);
            step(mkdir((acl + "/lun_0").c_str(), 0700) == 0);
            step(symlink((g + "/lun/lun_0").c_str(), (acl + "/lun_0/lio_lun").c_str()) == 0);
            step(Put(acl + "/lun_0/write_protect", "0"));
            step(Put(g + "/enable", "1"));
        }
        for (int i = 1; i <= 256; ++i) {
            std::string n = std::to_string(i);
            std::string t = M("/target/iscsi/iqn.2000-01.com.orlo:t" + n);
            std::string g = t + "/tpgt_1";
            std::string acl = g + "/acls/iqn.1991-05.com.example:host";
            step(Put(g + "/enable", "0"));
            step(rmdir((g + "/np/127.0.0.1:3260").c_str()) == 0);
            step(unlink((acl + "/lun_0/lio_lun").c_str()) == 0);
            step(rmdir((acl + "/lun_0").c_str()) == 0);
            step(rmdir(acl.c_str()) == 0);
            step(unlink((g + "/lun/lun_0/LUN_" + n).c_str()) == 0);
            step(rmdir((g + "/lun/lun_0").c_str()) == 0);
            step(rmdir(g.c_str()) == 0);
            step(rmdir(t.c_str()) == 0);
            step(rmdir(M("/target/core/fileio_0/LUN_" + n).c_str()) == 0);
        }
        if (!ok) state.SkipWithError("a tree operation failed");
    }
    state.SetItemsProcessed(ops);
}
BENCHMARK(BM_Tree256Targets)->Unit(benchmark::kMillisecond)->UseRealTime();

// One process writing attributes must reach this many writes per second.
const double kOneWriterBound = 25000;

// The console report, followed by the attribute-write figures (the medians) and the
// one-writer figure's bound.
class BoundReporter : public benchmark::ConsoleReporter {
  public:
    BoundReporter() : ConsoleReporter(isatty(STDOUT_FILENO) ? OO_Color : OO_None) {}

    void ReportRuns(const std::vector<Run> &runs) override {
        ConsoleReporter::ReportRuns(runs);
        for (const Run &r : runs) {
            if (r.run_name.function_name != "BM_AttributeOpenWriteClose") continue;
            if (r.run_type == Run::RT_Aggregate && r.aggregate_name != "median") continue;
            Figure &f = r.threads == 1 ? one_ : two_;
            auto rate = r.counters.find("items_per_second");
            f.seen = true;
            f.failed = r.error_occurred || rate == r.counters.end();
            if (!f.failed) f.perSecond = rate->second.value;
        }
    }

    void Finalize() override {
        std::ostream &out = GetOutputStream();
        char line[160];
        if (!one_.seen) {
            out << "one writer:  not run (filtered out)\n";
        } else if (one_.failed) {
            out << "one writer:  FAILED (the writes did not go through); bound: at least " << kOneWriterBound
                << " writes/s\n";
        } else {
            snprintf(line, sizeof(line), "one writer:  %.0f writes/s (median of 5); bound: at least %.0f writes/s: %s\n",
                     one_.perSecond, kOneWriterBound, one_.perSecond >= kOneWriterBound ? "met" : "MISSED");
            out << line;
        }
        if (two_.seen && !two_.failed) {
            snprintf(line, sizeof(line), "two writers: %.0f writes/s together (median of 5)\n", two_.perSecond);
            out << line;
        } else if (two_.seen) {
            out << "two writers: FAILED (the writes did not go through)\n";
        }
    }

  private:
    struct Figure {
        bool seen = false;
        bool failed = false;
        double perSecond = 0;
    };
    Figure one_, two_;
};

}  // namespace

int main(int argc, char **argv) {
    BoundReporter display;
    return benchsim::Main(argc, argv, "configfs_sim_bench", {"/volume1"}, [](const benchsim::Sim &sim) {
        g_root = sim.root;
        g_mount = sim.mount;
        int fd = open((g_root + "/volume1/lun.img").c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0644);
        if (fd >= 0) close(fd);
        return mkdir(M("/target/iscsi").c_str(), 0700) == 0 &&
               mkdir(M("/target/iscsi/iqn.2000-01.com.orlo:bench").c_str(), 0700) == 0 &&
               mkdir(M("/target/iscsi/iqn.2000-01.com.orlo:bench/tpgt_1").c_str(), 0700) == 0;
    }, &display);
}
