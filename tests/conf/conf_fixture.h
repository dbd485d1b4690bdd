// Shared pieces of the configuration snapshot and mapping tests: sections of the three
// files in their stored form, and the contents of a snapshot copied out.
#ifndef ORLO_TESTS_CONF_CONF_FIXTURE_H
#define ORLO_TESTS_CONF_CONF_FIXTURE_H

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_conf.h"
#include "support/sandbox.h"
#include "target/target_fixture.h"

namespace conf_test {

constexpr const char *kLunConf = "/usr/orlo/etc/iscsi_lun.conf";
constexpr const char *kMappingConf = "/usr/orlo/etc/iscsi_mapping.conf";
constexpr const char *kLunLock = "/tmp/iscsi/iscsi_lun.conf.lock";
constexpr const char *kMappingLock = "/tmp/iscsi/iscsi_mapping.conf.lock";

// A LUN section as the library writes it; bkp makes it a backup object (BKP_THIN).
inline std::string LunSection(int lid, bool bkp = false) {
    char uuid[40];
    snprintf(uuid, sizeof(uuid), "c0f00000-0000-4000-8000-%012d", lid);
    std::string s = std::string("[LUN_") + uuid + "]\n";
    s += "\tlid=" + std::to_string(lid) + "\n\trootpath=/volume1\n\tname=lun" + std::to_string(lid) + "\n";
    s += std::string("\tuuid=") + uuid + "\n\tvpd_unit_serial=serial" + std::to_string(lid) + "\n";
    s += "\tbytes=1048576\n\trestored_time=0\n\tdevtype=1\n";
    s += bkp ? "\tpre_alloc=no\n\tbkp_obj=1\n\tvaai_support=no\n" : "\tpre_alloc=yes\n\tbkp_obj=0\n\tvaai_support=no\n";
    return s;
}

// A mapping section as the library writes it.
inline std::string MapSection(int tid, int lid, int lun) {
    return "[iSCSI_MAP_T" + std::to_string(tid) + "_L" + std::to_string(lid) + "]\n\ttid=" + std::to_string(tid) +
           "\n\tlid=" + std::to_string(lid) + "\n\tlun=" + std::to_string(lun) + "\n";
}

// One mapping as seen in a snapshot: its fields and what its pointers resolve to
// (0 for a NULL pointer).
struct MapView {
    int tid, lid, lun, ptrTid, ptrLid;
    bool operator==(const MapView &o) const {
        return tid == o.tid && lid == o.lid && lun == o.lun && ptrTid == o.ptrTid && ptrLid == o.ptrLid;
    }
};
inline std::ostream &operator<<(std::ostream &os, const MapView &m) {
    return os << "{T" << m.tid << " L" << m.lid << " n" << m.lun << " ->T" << m.ptrTid << " ->L" << m.ptrLid << "}";
}

inline std::vector<int> LidsOf(ORLOiSCSIConf *conf) {
    std::vector<int> out;
    ORLOiSCSIListLink *link;
    ORLOiSCSILun *lun;
    ORLO_ISCSI_LUN_LIST_FOREACH(&conf->luns, link, lun) out.push_back(lun->lid);
    return out;
}
inline std::vector<int> TidsOf(ORLOiSCSIConf *conf) { return target_test::Tids(&conf->targets); }
inline std::vector<MapView> MapsOf(ORLOiSCSIConf *conf) {
    std::vector<MapView> out;
    ORLOiSCSIListLink *link;
    ORLOiSCSIMapping *m;
    ORLO_ISCSI_MAPPING_LIST_FOREACH(&conf->mappings, link, m) {
        out.push_back({m->tid, m->lid, m->lun, m->pTrg ? m->pTrg->tid : 0, m->pLun ? m->pLun->lid : 0});
    }
    return out;
}

// Walks a list and counts its elements (to check the stored count against the chain).
inline int ChainLength(const ORLOiSCSIList *list) {
    if (!ORLOiSCSIListIsInit(list)) return 0;
    int n = 0;
    for (const ORLOiSCSIListLink *l = list->head.next; l != &list->head; l = l->next) ++n;
    return n;
}

class ConfTest : public target_test::TargetTest {
  protected:
    void SetUp() override {
        TargetTest::SetUp();
        ORLOiSCSIListInit(&conf_.luns);
        ORLOiSCSIListInit(&conf_.targets);
        ORLOiSCSIListInit(&conf_.mappings);
    }
    void TearDown() override {
        ORLOiSCSIConfFree(&conf_);
        TargetTest::TearDown();
    }
    // Takes a snapshot with flags (and the other criteria of f) into conf_.
    uint32_t Get(uint32_t flags, ORLOiSCSILunFilter f = {}) {
        f.flags = flags;
        ORLOiSCSIConfFree(&conf_);
        return ORLOiSCSIConfGet(&f, &conf_);
    }
    // The counts agree with the chains and the snapshot is empty.
    void ExpectEmpty() {
        EXPECT_EQ(0, conf_.luns.count);
        EXPECT_EQ(0, conf_.targets.count);
        EXPECT_EQ(0, conf_.mappings.count);
        EXPECT_EQ(0, ChainLength(&conf_.luns));
        EXPECT_EQ(0, ChainLength(&conf_.targets));
        EXPECT_EQ(0, ChainLength(&conf_.mappings));
    }
    void ExpectCountsMatchChains() {
        EXPECT_EQ(conf_.luns.count, ChainLength(&conf_.luns));
        EXPECT_EQ(conf_.targets.count, ChainLength(&conf_.targets));
        EXPECT_EQ(conf_.mappings.count, ChainLength(&conf_.mappings));
    }
    ORLOiSCSIConf conf_;
};

}  // namespace conf_test

#endif
