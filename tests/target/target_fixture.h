// Shared pieces of the target tests: a sandbox with the runtime directories, records
// filled the way a caller fills them, and the records of a list copied out.
#ifndef ORLO_TESTS_TARGET_TARGET_FIXTURE_H
#define ORLO_TESTS_TARGET_TARGET_FIXTURE_H

#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_target.h"
#include "support/sandbox.h"

namespace target_test {

constexpr const char *kTargetConf = "/usr/orlo/etc/iscsi_target.conf";
constexpr const char *kAclConf = "/usr/orlo/etc/iscsi_acl.conf";
constexpr const char *kTargetLock = "/tmp/iscsi/iscsi_target.conf.lock";
constexpr const char *kAclLock = "/tmp/iscsi/iscsi_acl.conf.lock";

inline ORLOiSCSITarget MakeTarget(int tid) {
    ORLOiSCSITarget t;
    memset(&t, 0, sizeof(t));
    t.tid = tid;
    snprintf(t.name, sizeof(t.name), "Target-%d", tid);
    snprintf(t.iqn, sizeof(t.iqn), "iqn.2000-01.com.orlo-nas:store.target-%d", tid);
    t.max_recv_seg_bytes = 262144;
    t.max_send_seg_bytes = 262144;
    t.max_sessions = 1;
    return t;
}

inline std::vector<ORLOiSCSITarget> Records(ORLOiSCSITargetList *list) {
    std::vector<ORLOiSCSITarget> out;
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t;
    ORLO_ISCSI_TARGET_LIST_FOREACH(list, link, t) out.push_back(*t);
    return out;
}

inline std::vector<int> Tids(ORLOiSCSITargetList *list) {
    std::vector<int> out;
    for (const ORLOiSCSITarget &t : Records(list)) out.push_back(t.tid);
    return out;
}

// A whole section in the stored form, every key given; extra lines appended as they are.
inline std::string Section(int tid, const std::string &name, const std::string &extra = "",
                           const std::string &skip = "") {
    const std::vector<std::pair<std::string, std::string>> kv = {
        {"tid", std::to_string(tid)}, {"name", name}, {"iqn", "iqn.2000-01.com.orlo-nas:t" + std::to_string(tid)},
        {"enabled", "no"}, {"authen", "no"}, {"username", ""}, {"password", ""}, {"mutual", "no"},
        {"mutual_username", ""}, {"mutual_password", ""}, {"hdr_chksum", "no"}, {"data_chksum", "no"},
        {"send_seg_bytes", "262144"}, {"recv_seg_bytes", "262144"},
    };
    std::string s = "[iSCSI_T" + std::to_string(tid) + "]\n";
    for (const auto &p : kv)
        if (p.first != skip) s += "\t" + p.first + "=" + p.second + "\n";
    return s + extra;
}

class TargetTest : public orlotest::SandboxTest {
  protected:
    void SetUp() override {
        SandboxTest::SetUp();
        ASSERT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
    }
    // How many log lines contain text.
    int LinesWith(const std::string &text) const {
        int n = 0;
        for (const std::string &l : log_.Lines())
            if (l.find(text) != std::string::npos) ++n;
        return n;
    }
};

}  // namespace target_test

#endif
