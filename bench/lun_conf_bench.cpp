// LUN configuration on a full appliance: 1024 LUN sections in the global file and in the
// volume's copy.  Listing every LUN, finding one by uuid (first, middle, last section) and
// rewriting one LUN's sections, each under the real lock files, in a sandbox root.
#include <benchmark/benchmark.h>
#include <stdlib.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include "orloiscsi_base.h"
#include "orloiscsi_lun.h"

namespace {

constexpr int kLunCount = 1024;

std::string UuidOf(int lid) {
    char buf[40];
    snprintf(buf, sizeof(buf), "6e7c0000-0000-4000-8000-%012d", lid);
    return buf;
}

ORLOiSCSILun MakeLun(int lid) {
    ORLOiSCSILun lun = {};
    lun.lid = lid;
    lun.lockHandle = -1;
    lun.type = lid % 3 == 0 ? ORLO_ISCSI_LUN_TYPE_FILE : ORLO_ISCSI_LUN_TYPE_THIN;
    lun.blockSize = lid % 2 ? 4096 : 512;
    lun.size = (1ull << 30) * static_cast<uint64_t>(lid);
    snprintf(lun.uuid, sizeof(lun.uuid), "%s", UuidOf(lid).c_str());
    snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "%s", UuidOf(lid).c_str());
    snprintf(lun.rootPath, sizeof(lun.rootPath), "/volume1");
    snprintf(lun.name, sizeof(lun.name), "LUN-%04d", lid);
    return lun;
}

// A sandbox root with both LUN files holding kLunCount sections as the library writes them.
class Appliance {
  public:
    Appliance() {
        char tmpl[] = "/tmp/orlo-lun-bench-XXXXXX";
        root_ = mkdtemp(tmpl);
        setenv("ORLO_SYSROOT", root_.c_str(), 1);
        std::filesystem::create_directories(root_ + "/usr/orlo/etc");
        std::filesystem::create_directories(root_ + "/volume1/@iSCSI/LUN");
        std::filesystem::create_directories(root_ + "/tmp");
        if (ORLOiSCSIBaseMkdir(nullptr) != 0) fprintf(stderr, "cannot make the runtime directories\n");
        std::string text;
        for (int lid = 1; lid <= kLunCount; ++lid) {
            ORLOiSCSILun l = MakeLun(lid);
            char section[8192];
            snprintf(section, sizeof(section),
                     "[LUN_%s]\n\tlid=%d\n\trootpath=%s\n\tname=%s\n\tuuid=%s\n\tvpd_unit_serial=%s\n"
                     "\tbytes=%llu\n\trestored_time=0\n\tdevtype=1\n\tpre_alloc=%s\n\tbkp_obj=0\n"
                     "\tvaai_support=no\n%s",
                     l.uuid, l.lid, l.rootPath, l.name, l.uuid, l.vpdUnitSerial,
                     static_cast<unsigned long long>(l.size), l.type == ORLO_ISCSI_LUN_TYPE_FILE ? "yes" : "no",
                     l.blockSize == 4096 ? "\tblocksize=4096\n" : "");
            text += section;
        }
        std::ofstream(root_ + "/usr/orlo/etc/iscsi_lun.conf") << text;
        std::ofstream(root_ + "/volume1/@iSCSI/LUN/iscsi_lun.conf") << text;
    }
    ~Appliance() {
        unsetenv("ORLO_SYSROOT");
        std::error_code ec;
        std::filesystem::remove_all(root_, ec);
    }

  private:
    std::string root_;
};

void BM_ConfGetAll(benchmark::State &state) {
    Appliance appliance;
    for (auto _ : state) {
        ORLOiSCSILunList list;
        ORLOiSCSIListInit(&list);
        uint32_t ret = ORLOiSCSILunConfGetAll(&list, 0);
        if (ret != 0 || list.count != kLunCount) state.SkipWithError("listing failed");
        ORLOiSCSILunListFree(&list);
    }
    state.SetItemsProcessed(state.iterations() * kLunCount);
    state.counters["luns"] = kLunCount;
}
BENCHMARK(BM_ConfGetAll)->Unit(benchmark::kMillisecond);

// The argument is the lid of the LUN sought: the reader stops at the first match.
void BM_ConfGetByUuid(benchmark::State &state) {
    Appliance appliance;
    const std::string uuid = UuidOf(static_cast<int>(state.range(0)));
    for (auto _ : state) {
        ORLOiSCSILun lun;
        if (ORLOiSCSILunConfGetByUuid(uuid.c_str(), &lun) != 0) state.SkipWithError("lookup failed");
        benchmark::DoNotOptimize(lun.lid);
    }
}
BENCHMARK(BM_ConfGetByUuid)->Arg(1)->Arg(512)->Arg(1024)->Unit(benchmark::kMillisecond);

// Rewrites one file LUN's section in both 1024-section files (replace in place).
void BM_ConfSet(benchmark::State &state) {
    Appliance appliance;
    ORLOiSCSILun lun = MakeLun(513);
    for (auto _ : state) {
        lun.size += 4096;
        if (ORLOiSCSILunConfSet(&lun) != 0) state.SkipWithError("write failed");
    }
}
BENCHMARK(BM_ConfSet)->Unit(benchmark::kMillisecond);

// One file only, the caller holding no lock: the cost of one section rewrite.
void BM_GlobalConfSetSection(benchmark::State &state) {
    Appliance appliance;
    ORLOiSCSILun lun = MakeLun(513);
    for (auto _ : state) {
        lun.size += 4096;
        if (ORLOiSCSILunGlobalConfSetSection(&lun) != 0) state.SkipWithError("write failed");
    }
}
BENCHMARK(BM_GlobalConfSetSection)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
