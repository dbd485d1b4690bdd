// Shared pieces of the tests of loading, unloading and deleting LUNs: a sandbox with the
// simulated kernel target of the newer generation (extent-pool LUNs in epio_0, the trash
// in epio_1), LUNs stored the way creation leaves them, and the trace of what the
// library did to the kernel tree.
#ifndef ORLO_TESTS_LUN_KERNEL_LUN_KERNEL_FIXTURE_H
#define ORLO_TESTS_LUN_KERNEL_LUN_KERNEL_FIXTURE_H

#include <gtest/gtest.h>
#include <dirent.h>
#include <time.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "lun/lun_fixture.h"
#include "orloiscsi_base.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "service/lio_version.h"
#include "support/configfs_sim_fixture.h"

namespace lun_kernel_test {

using lun_test::MakeLun;
using lun_test::UuidOf;

inline double Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

class LunKernelTest : public orlotest::ConfigfsSimTest {
  protected:
    void SetUp() override {
        ConfigfsSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        WriteFile("/etc.defaults/orloinfo.conf", "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\n");
        orlo::LioReset();
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
    }
    void TearDown() override {
        orlo::LioReset();
        ConfigfsSimTest::TearDown();
    }

    // The path the kernel reads the LUN's data from.
    static std::string DataPath(const ORLOiSCSILun &lun) {
        char buf[4096];
        EXPECT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, buf, sizeof(buf)));
        return buf;
    }
    static std::string LunDir(const ORLOiSCSILun &lun) {
        char buf[4096];
        EXPECT_EQ(0u, ORLOiSCSILunDirPathGet(&lun, buf, sizeof(buf)));
        return buf;
    }
    // The backstore directory inside the mount ("/target/core/fileio_0/LUN_<uuid>").
    static std::string Backstore(const ORLOiSCSILun &lun) {
        char buf[320];
        EXPECT_EQ(0u, ORLOiSCSILunConfigfsDirPath(&lun, buf, sizeof(buf)));
        return std::string(buf).substr(strlen("/config"));
    }

    // Stores the LUN as creation leaves it: its sections and directory, and its data
    // file (a sparse image, or for the advanced kinds the pool and a map file).
    void Store(const ORLOiSCSILun &lun) {
        ASSERT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        if (!ORLO_ISCSI_LUN_IS_FILE_BACKED(lun.type)) return;
        std::string data = DataPath(lun);
        if (ORLO_ISCSI_LUN_IS_ADV(lun.type)) {
            ASSERT_EQ(0u, ORLOiSCSIEpMetaFilesCreate(lun.rootPath, 0)) << log_.Dump();
            ASSERT_EQ(0u, ORLOiSCSIEpMapFileMetaInit(data.c_str(), lun.rootPath, lun.size)) << log_.Dump();
        } else {
            ASSERT_EQ(0u, ORLOiSCSIFileTrunc(data.c_str(), lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE))
                << log_.Dump();
        }
    }

    // The operations that change something (reads left out).
    std::vector<orlotest::SimOp> Changes() {
        std::vector<orlotest::SimOp> out;
        for (const orlotest::SimOp &op : Trace())
            if (op.op != "read") out.push_back(op);
        return out;
    }
    static std::string Line(const orlotest::SimOp &op) {
        return op.op + " " + op.path + (op.value.empty() ? "" : " " + op.value) + " " + op.result;
    }
    std::vector<std::string> ChangeLines() {
        std::vector<std::string> out;
        for (const orlotest::SimOp &op : Changes()) out.push_back(Line(op));
        return out;
    }

    // Entries of a directory (logical path); empty when it is missing.
    std::vector<std::string> Ls(const std::string &logical) {
        std::vector<std::string> names;
        DIR *d = opendir(Real(logical).c_str());
        if (d == nullptr) return names;
        while (struct dirent *e = readdir(d))
            if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) names.push_back(e->d_name);
        closedir(d);
        return names;
    }

    // The backstores under a host directory ("epio_1" and so on).
    std::vector<std::string> Backstores(const std::string &host) {
        std::vector<std::string> out;
        for (const std::string &n : Ls("/config/target/core/" + host))
            if (n.compare(0, 4, "LUN_") == 0 || n.compare(0, 10, "UNMAP_LUN_") == 0 || n.compare(0, 11, "UNSYNC_LUN_") == 0)
                out.push_back(n);
        return out;
    }

    // Waits until the volume's trash is empty (at most seconds), then until the
    // background run that emptied it has let the trash lock go.  False on time-out.
    bool WaitForTrash(const char *volume, double seconds = 20) {
        const std::string trash = std::string(volume) + "/@iSCSI/EP_unmap";
        double end = Now() + seconds;
        while (!Ls(trash).empty()) {
            if (Now() > end) return false;
            usleep(20000);
        }
        int32_t fd = -1;
        if (ORLOiSCSIEpTrashLock(&fd, volume) != 0) return false;
        return ORLOiSCSIEpTrashUnlock(fd) == 0;
    }
};

}  // namespace lun_kernel_test

#endif
