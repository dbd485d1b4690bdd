// Shared pieces of the mapping and target life-cycle tests: a simulated kernel target of
// the newer generation, file LUNs stored on /volume1 the way creation leaves them,
// targets and access-list entries stored through the library, and readers for the
// mapping file and the kernel tree.
#ifndef ORLO_TESTS_TARGET_KERNEL_LIFE_FIXTURE_H
#define ORLO_TESTS_TARGET_KERNEL_LIFE_FIXTURE_H

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "lun/lun_fixture.h"
#include "orloiscsi_base.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_file.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"
#include "target/target_fixture.h"

namespace life_test {

constexpr const char *kMappingConf = "/usr/orlo/etc/iscsi_mapping.conf";
const std::string kHost1 = "iqn.1991-05.com.example:host1";
const std::string kHost2 = "iqn.1991-05.com.example:host2";

class LifeTest : public service_test::ServiceSimTest {
  protected:
    void SetUp() override {
        ServiceSimTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir("/volume1")) << log_.Dump();
        ASSERT_EQ(0, InsertModuleSet(kIscsiModules, 4));
        ASSERT_EQ(0, mkdir(Cfg("/target/iscsi").c_str(), 0700));
    }

    // A file LUN stored with its section and a sparse image.
    ORLOiSCSILun StoreLun(int lid) {
        ORLOiSCSILun lun = lun_test::MakeLun(lid, ORLO_ISCSI_LUN_TYPE_FILE);
        lun.size = 1048576;
        EXPECT_EQ(0u, ORLOiSCSILunConfSet(&lun)) << log_.Dump();
        char data[4096];
        EXPECT_EQ(0u, ORLOiSCSILunDataPathGet(&lun, 0, data, sizeof(data)));
        WriteFile(data, "");
        EXPECT_EQ(0u, ORLOiSCSIFileTrunc(data, lun.size, nullptr, ORLO_ISCSI_TRUNC_MODE_SPARSE)) << log_.Dump();
        return lun;
    }
    // A target stored under its own tid, not in the kernel.
    ORLOiSCSITarget StoreTarget(int tid, bool enabled = false) {
        ORLOiSCSITarget t = target_test::MakeTarget(tid);
        t.enabled = enabled;
        EXPECT_EQ(0u, ORLOiSCSITargetConfAdd(&t)) << log_.Dump();
        return t;
    }
    // The target's node in the kernel with its portal group (no LUNs, no access lists).
    void MakeNode(const ORLOiSCSITarget &t, bool enabled) {
        ASSERT_EQ(0, mkdir(Cfg(Node(t)).c_str(), 0700));
        ASSERT_EQ(0, mkdir(Cfg(Tpg(t)).c_str(), 0700));
        if (enabled) {
            ASSERT_EQ(0, CfgWrite(Tpg(t) + "/enable", "1"));
        }
    }

    static std::string Node(const ORLOiSCSITarget &t) { return std::string("/target/iscsi/") + t.iqn; }
    static std::string Tpg(const ORLOiSCSITarget &t) { return Node(t) + "/tpgt_1"; }
    // The LUN's backstore inside the mount ("/target/core/fileio_0/LUN_<uuid>").
    static std::string Backstore(const ORLOiSCSILun &lun) {
        char buf[320];
        EXPECT_EQ(0u, ORLOiSCSILunConfigfsDirPath(&lun, buf, sizeof(buf)));
        return std::string(buf).substr(strlen("/config"));
    }

    bool InKernel(const std::string &inside) {
        struct stat st;
        return lstat(Cfg(inside).c_str(), &st) == 0;
    }
    std::string LinkOf(const std::string &inside) {
        char buf[4096];
        ssize_t n = readlink(Cfg(inside).c_str(), buf, sizeof(buf) - 1);
        if (n < 0) return "";
        buf[n] = '\0';
        return buf;
    }
    std::string CfgRead(const std::string &inside) {
        std::string v = ReadFile("/config" + inside);
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }
    // Entries of a directory inside the mount; empty when it is missing.
    std::vector<std::string> Ls(const std::string &inside) {
        std::vector<std::string> names;
        DIR *d = opendir(Cfg(inside).c_str());
        if (d == nullptr) return names;
        while (struct dirent *e = readdir(d))
            if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) names.push_back(e->d_name);
        closedir(d);
        return names;
    }
    // The operations that changed the tree, as "op path [value] result".
    std::vector<std::string> Changes() {
        std::vector<std::string> out;
        for (const orlotest::SimOp &op : Trace()) {
            if (op.op == "read") continue;
            out.push_back(op.op + " " + op.path + (op.op == "write" || op.op == "symlink" ? " " + op.value : "") +
                          " " + op.result);
        }
        return out;
    }

    // The stored mappings as "tid:lid:lun", in file order.
    std::vector<std::string> Mappings() {
        std::vector<std::string> out;
        ORLOiSCSILunFilter filter = {};
        filter.flags = ORLO_ISCSI_LUN_FILTER_LOAD_MAPPINGS;
        ORLOiSCSIConf conf = {};
        EXPECT_EQ(0u, ORLOiSCSIConfGet(&filter, &conf)) << log_.Dump();
        ORLOiSCSIListLink *link;
        ORLOiSCSIMapping *m;
        ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
            out.push_back(std::to_string(m->tid) + ":" + std::to_string(m->lid) + ":" + std::to_string(m->lun));
        }
        ORLOiSCSIConfFree(&conf);
        return out;
    }
    // The stored target of a tid (backup objects too); tid 0 when there is none.
    ORLOiSCSITarget Stored(int tid) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        if (ORLOiSCSITargetGetByTid(tid, ORLO_ISCSI_TARGET_FILTER_BKP, &t) != 0) t.tid = 0;
        return t;
    }
    int Status(const ORLOiSCSITarget &t) { return ORLOiSCSITargetStatusGet(t.tid, &t); }
};

}  // namespace life_test

#endif
