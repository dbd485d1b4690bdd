// Speed of the simulated kernel target: attribute open-write-close and open-read-close,
// backstore mkdir-rmdir, and a tree of 256 targets built and torn down with the same
// calls an administrator's script makes.  Each prints operations per second
// (items_per_second).  Needs root and /dev/fuse; mounts a private simulator in /tmp.
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
BENCHMARK(BM_AttributeOpenWriteClose)->UseRealTime();
BENCHMARK(BM_AttributeOpenWriteClose)->Threads(2)->UseRealTime();

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

}  // namespace

int main(int argc, char **argv) {
    return benchsim::Main(argc, argv, "configfs_sim_bench", {"/volume1"}, [](const benchsim::Sim &sim) {
        g_root = sim.root;
        g_mount = sim.mount;
        int fd = open((g_root + "/volume1/lun.img").c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0644);
        if (fd >= 0) close(fd);
        return mkdir(M("/target/iscsi").c_str(), 0700) == 0 &&
               mkdir(M("/target/iscsi/iqn.2000-01.com.orlo:bench").c_str(), 0700) == 0 &&
               mkdir(M("/target/iscsi/iqn.2000-01.com.orlo:bench/tpgt_1").c_str(), 0700) == 0;
    });
}
