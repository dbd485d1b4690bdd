// Callers side by side: eight orloiscsi processes let go at the same moment create
// targets, take one name, and map LUNs into one target, disabled and running.  Nothing
// may be lost or given twice, and the kernel tree and the files must agree afterwards.
#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstdio>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "e2e/e2e_processes.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"

namespace {

constexpr int kProcesses = 8;

class Concurrency : public e2e::ServiceSandbox {
  protected:
    // Every target in the file, by tid.
    std::map<int, ORLOiSCSITarget> StoredTargets() {
        std::map<int, ORLOiSCSITarget> out;
        ORLOiSCSITargetFilter filter = {};
        ORLOiSCSITargetList list = {};
        EXPECT_EQ(0u, ORLOiSCSITargetConfLoad(&filter, &list));
        ORLOiSCSIListLink *link;
        ORLOiSCSITarget *t;
        if (ORLOiSCSIListIsInit(&list)) {
            ORLO_ISCSI_TARGET_LIST_FOREACH(&list, link, t) {
                EXPECT_EQ(0u, out.count(t->tid)) << "tid " << t->tid << " stored twice";
                out[t->tid] = *t;
            }
        }
        ORLOiSCSITargetListFree(&list);
        return out;
    }
    // The stored mappings of a target: LUN number -> lid.
    std::map<int, int> StoredNumbers(int tid) {
        std::map<int, int> out;
        ORLOiSCSILunFilter filter = {};
        filter.flags = 0x7201;
        filter.tid = tid;
        ORLOiSCSIConf conf = {};
        EXPECT_EQ(0u, ORLOiSCSIConfGet(&filter, &conf));
        ORLOiSCSIListLink *link;
        ORLOiSCSIMapping *m;
        if (ORLOiSCSIListIsInit(&conf.mappings)) {
            ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf.mappings, link, m) {
                if (m->tid != tid) continue;
                EXPECT_EQ(0u, out.count(m->lun)) << "LUN number " << m->lun << " given twice";
                out[m->lun] = m->lid;
            }
        }
        ORLOiSCSIConfFree(&conf);
        return out;
    }
    // The name of the backstore a LUN entry links to: "LUN_<uuid>".
    std::string BackstoreOf(int lid) {
        ORLOiSCSILunList list = {};
        EXPECT_EQ(0u, ORLOiSCSILunConfGetByLid(lid, 0x400, &list));
        std::string name;
        ORLOiSCSIListLink *link;
        ORLOiSCSILun *lun;
        if (ORLOiSCSIListIsInit(&list)) {
            ORLO_ISCSI_LUN_LIST_FOREACH(&list, link, lun) name = std::string("LUN_") + lun->uuid;
        }
        ORLOiSCSILunListFree(&list);
        return name;
    }
    std::set<std::string> Dir(const std::string &real) {
        std::set<std::string> out;
        DIR *d = opendir(real.c_str());
        if (d == nullptr) return out;
        while (struct dirent *e = readdir(d))
            if (e->d_name[0] != '.') out.insert(e->d_name);
        closedir(d);
        return out;
    }
    // The kernel's LUN entries of a target: LUN number -> the backstore linked.
    std::map<int, std::string> KernelNumbers(const std::string &iqn) {
        std::map<int, std::string> out;
        const std::string lunDir = Cfg("/target/iscsi/" + iqn + "/tpgt_1/lun");
        for (const std::string &entry : Dir(lunDir)) {
            int n = -1;
            EXPECT_EQ(1, sscanf(entry.c_str(), "lun_%d", &n)) << entry;
            std::string linked;
            for (const std::string &f : Dir(lunDir + "/" + entry)) {
                struct stat st;
                if (lstat((lunDir + "/" + entry + "/" + f).c_str(), &st) == 0 && S_ISLNK(st.st_mode)) linked = f;
            }
            out[n] = linked;
        }
        return out;
    }
    std::set<std::string> KernelNodes() {
        std::set<std::string> out;
        for (const std::string &e : Dir(Cfg("/target/iscsi")))
            if (e.rfind("iqn.", 0) == 0) out.insert(e);
        return out;
    }
    // The LUN numbers the file gives a target, with the kernel's entries beside them when
    // the target runs: both must name the same LUNs under the same numbers.
    void ExpectKernelAgrees(const ORLOiSCSITarget &t) {
        std::map<int, std::string> wanted;
        for (const auto &m : StoredNumbers(t.tid)) wanted[m.first] = BackstoreOf(m.second);
        EXPECT_EQ(wanted, KernelNumbers(t.iqn)) << "target " << t.name;
    }
};

TEST_F(Concurrency, EightCallersNeverShareATidANameOrALunNumber) {
    // Eight creations of distinct targets at once: eight tids, eight sections, eight nodes.
    std::vector<std::vector<std::string>> commands;
    for (int i = 0; i < kProcesses; ++i) commands.push_back(Command({"target", "create", "t" + std::to_string(i)}));
    std::vector<e2e::Outcome> runs = e2e::RunTogether(commands, scratch_);
    std::set<int> tids;
    for (const e2e::Outcome &r : runs) {
        EXPECT_EQ(0, r.status) << r.err;
        int tid = 0;
        size_t at = r.out.find("created target ");
        ASSERT_NE(std::string::npos, at) << r.out;
        tid = atoi(r.out.c_str() + at + 15);
        EXPECT_TRUE(tids.insert(tid).second) << "tid " << tid << " given twice";
    }
    std::map<int, ORLOiSCSITarget> stored = StoredTargets();
    ASSERT_EQ(static_cast<size_t>(kProcesses), stored.size());
    for (int tid : tids) EXPECT_EQ(1u, stored.count(tid));
    std::set<std::string> iqns;
    for (const auto &s : stored) iqns.insert(s.second.iqn);
    EXPECT_EQ(iqns, KernelNodes());

    // Eight creations of one name: one wins, the others are told the name is taken.
    commands.clear();
    for (int i = 0; i < kProcesses; ++i) commands.push_back(Command({"target", "create", "same", "--disabled"}));
    runs = e2e::RunTogether(commands, scratch_);
    int won = 0;
    for (const e2e::Outcome &r : runs) {
        if (r.status == 0) {
            ++won;
        } else {
            EXPECT_EQ(1, r.status);
            EXPECT_NE(std::string::npos, r.err.find("18990700")) << r.err;
        }
    }
    EXPECT_EQ(1, won);
    int named = 0;
    for (const auto &s : StoredTargets()) named += std::string(s.second.name) == "same";
    EXPECT_EQ(1, named);

    // LUNs to map, and a disabled and a running target.
    for (int i = 0; i < 2 * kProcesses; ++i) {
        std::string err;
        ASSERT_EQ(0, Cli({"lun", "create", "--name", "l" + std::to_string(i), "--type", "THIN", "--size", "16M",
                          "--volume", "/volume1"},
                         nullptr, &err))
            << err;
    }
    std::string err;
    ASSERT_EQ(0, Cli({"target", "create", "off", "--disabled"}, nullptr, &err)) << err;
    ASSERT_EQ(0, Cli({"target", "create", "on"}, nullptr, &err)) << err;

    for (const char *target : {"off", "on"}) {
        const int base = std::string(target) == "off" ? 0 : kProcesses;
        commands.clear();
        for (int i = 0; i < kProcesses; ++i)
            commands.push_back(Command({"map", "add", target, "l" + std::to_string(base + i)}));
        runs = e2e::RunTogether(commands, scratch_);
        for (const e2e::Outcome &r : runs) EXPECT_EQ(0, r.status) << target << ": " << r.err;
        ORLOiSCSITarget t;
        ASSERT_EQ(0u, ORLOiSCSITargetGetByName(target, 0, &t));
        std::map<int, int> numbers = StoredNumbers(t.tid);
        ASSERT_EQ(static_cast<size_t>(kProcesses), numbers.size()) << target;
        EXPECT_EQ(0, numbers.begin()->first);
        EXPECT_EQ(kProcesses - 1, numbers.rbegin()->first) << "numbers are the smallest free ones";
        std::set<int> lids;
        for (const auto &m : numbers) lids.insert(m.second);
        EXPECT_EQ(static_cast<size_t>(kProcesses), lids.size());
        if (std::string(target) == "off") {
            EXPECT_TRUE(KernelNumbers(t.iqn).empty());
            ASSERT_EQ(0, Cli({"target", "enable", target}, nullptr, &err)) << err;
        }
        ExpectKernelAgrees(t);
    }

    // A LUN mapped already is not mapped again: the kernel and the file keep one entry.
    ORLOiSCSITarget on;
    ASSERT_EQ(0u, ORLOiSCSITargetGetByName("on", 0, &on));
    const std::string before = ReadFile("/usr/orlo/etc/iscsi_mapping.conf");
    EXPECT_EQ(1, Cli({"map", "add", "on", "l8"}, nullptr, &err));
    EXPECT_NE(std::string::npos, err.find("18990534")) << err;
    EXPECT_EQ(before, ReadFile("/usr/orlo/etc/iscsi_mapping.conf"));
    ExpectKernelAgrees(on);

    // Every other target is in the kernel exactly when it is stored enabled ("off" was
    // switched on by hand, which leaves its stored flag alone).
    for (const auto &s : StoredTargets()) {
        if (std::string(s.second.name) == "off") continue;
        EXPECT_EQ(s.second.enabled, KernelNodes().count(s.second.iqn) == 1) << s.second.name;
    }
}

}  // namespace
