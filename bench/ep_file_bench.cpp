// The extent pool's small-block work, in a sandbox root on the machine's disk: header
// and block reads and writes (each opens and closes the file), the clone-status poll's
// map-file reads, making a map file for a LUN, and decoding a header with its verdicts.
// Also the CRC-32 alone, over one 64-byte header and over 1 MiB (bytes per second).
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <cstring>
#include <filesystem>
#include <string>

#include "ep_internal.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"

namespace {

class Sandbox {
  public:
    Sandbox() {
        char tmpl[] = "/tmp/orlo-ep-bench-XXXXXX";
        root_ = mkdtemp(tmpl);
        setenv("ORLO_SYSROOT", root_.c_str(), 1);
        std::filesystem::create_directories(root_ + "/tmp");
        std::filesystem::create_directories(root_ + "/volume1/@iSCSI/LUN/ADV/u");
        ok_ = ORLOiSCSIEpMetaFilesCreate("/volume1", 1u << 20) == 0 &&
              ORLOiSCSIEpMapFileMetaInit(kMap, "/volume1", 1ull << 40) == 0;
    }
    ~Sandbox() {
        unsetenv("ORLO_SYSROOT");
        std::filesystem::remove_all(root_);
    }
    bool ok() const { return ok_; }
    static constexpr const char *kMap = "/volume1/@iSCSI/LUN/ADV/u/u_00000";

  private:
    std::string root_;
    bool ok_ = false;
};

void BM_MapHeaderSet(benchmark::State &state) {
    Sandbox sb;
    if (!sb.ok()) return state.SkipWithError("no pool");
    unsigned char block[64] = {};
    for (auto _ : state) {
        block[12]++;
        if (ORLOiSCSIEpFileMapHeaderSet(Sandbox::kMap, block) != 0) return state.SkipWithError("set failed");
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_MapHeaderSet);

void BM_MapHeaderGet(benchmark::State &state) {
    Sandbox sb;
    if (!sb.ok()) return state.SkipWithError("no pool");
    unsigned char block[64];
    for (auto _ : state) {
        if (ORLOiSCSIEpFileMapHeaderGet(Sandbox::kMap, block) != 0) return state.SkipWithError("get failed");
        benchmark::DoNotOptimize(block);
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_MapHeaderGet);

// What one round of a clone-status poll reads from the map file.
void BM_CloneDoneCheck(benchmark::State &state) {
    Sandbox sb;
    if (!sb.ok()) return state.SkipWithError("no pool");
    bool done = false;
    for (auto _ : state) {
        if (ORLOiSCSIEpIsCloneDone(Sandbox::kMap, &done) != 0) return state.SkipWithError("read failed");
        benchmark::DoNotOptimize(done);
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_CloneDoneCheck);

void BM_VersionInfoGet(benchmark::State &state) {
    Sandbox sb;
    if (!sb.ok()) return state.SkipWithError("no pool");
    ORLOiSCSIEpMapVersionInfo info;
    for (auto _ : state) {
        if (ORLOiSCSIEpMapFileVersionInfoGet(Sandbox::kMap, &info) != 0) return state.SkipWithError("read failed");
        benchmark::DoNotOptimize(info);
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_VersionInfoGet);

void BM_HeaderDecode(benchmark::State &state) {
    Sandbox sb;
    if (!sb.ok()) return state.SkipWithError("no pool");
    ORLOiSCSIEpFileHeaderInfo info;
    for (auto _ : state) {
        if (ORLOiSCSIEpFileHeaderDecode(Sandbox::kMap, &info) != 0) return state.SkipWithError("decode failed");
        benchmark::DoNotOptimize(info);
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_HeaderDecode);

// Making a map file for a 1 TiB LUN (sparse file of 9 MiB, five sealed blocks).
void BM_MapFileMetaInit(benchmark::State &state) {
    Sandbox sb;
    if (!sb.ok()) return state.SkipWithError("no pool");
    int n = 0;
    for (auto _ : state) {
        std::string path = "/volume1/@iSCSI/LUN/ADV/u/m_" + std::to_string(n++);
        if (ORLOiSCSIEpMapFileMetaInit(path.c_str(), "/volume1", 1ull << 40) != 0)
            return state.SkipWithError("init failed");
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_MapFileMetaInit);

// The checksum by itself: a header's 64 bytes, and a megabyte as a whole-file check reads.
void BM_Crc32(benchmark::State &state) {
    std::string data(static_cast<size_t>(state.range(0)), '\0');
    for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<char>(i * 131 + 7);
    uint32_t crc = 0;
    for (auto _ : state) {
        crc = ORLOiSCSIFileCRC32CksumCompute(crc, data.data(), data.size());
        benchmark::DoNotOptimize(crc);
    }
    state.SetBytesProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Crc32)->Arg(64)->Arg(1 << 20);

}  // namespace

BENCHMARK_MAIN();
