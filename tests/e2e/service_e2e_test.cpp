// The whole iSCSI service against the simulated kernel target, driven as the appliance's
// management programs drive it: targets with and without CHAP, access lists, LUNs mapped
// into them while the service runs; then a full stop, a total stop with the modules
// unloaded, and a start from the configuration files alone that must rebuild exactly
// the tree the live changes made.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <map>
#include <string>
#include <vector>

#include "lun_kernel/lun_kernel_fixture.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"

namespace e2e_test {
namespace {

using lun_kernel_test::MakeLun;

const std::string kHostA = "iqn.1991-05.com.example:host-a";
const std::string kHostB = "iqn.1991-05.com.example:host-b";
const std::string kDefault = ORLO_ISCSI_DEFAULT_ACL_INITIATOR;

// Every path of a configfs subtree with what it holds: "dir", "-> <link target>", or the
// value an attribute reads ("!<errno>" when it cannot be read, as for write-only files).
using Tree = std::map<std::string, std::string>;

class ServiceE2ETest : public lun_kernel_test::LunKernelTest {
  protected:
    void SetUp() override {
        LunKernelTest::SetUp();
        if (IsSkipped() || HasFatalFailure()) return;
        WriteFile("/etc.defaults/orloinfo.conf",
                  "support_iscsi_target=\"yes\"\niscsi_target_type=\"lio4x\"\niscsitrg_cmdsn_depth=\"32\"\n");
    }

    void Walk(const std::string &inside, Tree *tree) {
        const std::string real = Cfg(inside);
        DIR *d = opendir(real.c_str());
        if (d == nullptr) return;
        std::vector<std::string> names;
        while (struct dirent *e = readdir(d))
            if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) names.push_back(e->d_name);
        closedir(d);
        for (const std::string &n : names) {
            const std::string path = inside + "/" + n;
            struct stat st;
            if (lstat(Cfg(path).c_str(), &st) != 0) {
                (*tree)[path] = "!lstat";
                continue;
            }
            if (S_ISLNK(st.st_mode)) {
                char buf[512];
                ssize_t len = readlink(Cfg(path).c_str(), buf, sizeof(buf) - 1);
                (*tree)[path] = "-> " + std::string(buf, len > 0 ? static_cast<size_t>(len) : 0);
            } else if (S_ISDIR(st.st_mode)) {
                (*tree)[path] = "dir";
                Walk(path, tree);
            } else {
                int fd = open(Cfg(path).c_str(), O_RDONLY);
                if (fd < 0) {
                    (*tree)[path] = "!" + std::to_string(errno);
                    continue;
                }
                char buf[4097];
                ssize_t len = read(fd, buf, sizeof(buf) - 1);
                close(fd);
                (*tree)[path] = len >= 0 ? std::string(buf, static_cast<size_t>(len)) : "!read";
            }
        }
    }
    // The fabric and the backstores: what the service start has to rebuild.
    Tree Snapshot() {
        Tree t;
        Walk("/target/iscsi", &t);
        Walk("/target/core", &t);
        return t;
    }
    static std::string Diff(const Tree &want, const Tree &got) {
        std::string out;
        for (const auto &p : want) {
            auto it = got.find(p.first);
            if (it == got.end())
                out += "missing " + p.first + "\n";
            else if (it->second != p.second)
                out += "differs " + p.first + ": want [" + p.second + "] got [" + it->second + "]\n";
        }
        for (const auto &p : got)
            if (want.find(p.first) == want.end()) out += "extra " + p.first + " [" + p.second + "]\n";
        return out;
    }

    static ORLOiSCSITarget Target(const char *name, int auth) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        snprintf(t.name, sizeof(t.name), "%s", name);
        snprintf(t.iqn, sizeof(t.iqn), "iqn.2000-01.com.orlo-nas:%s", name);
        t.enabled = true;
        t.max_recv_seg_bytes = 262144;
        t.max_send_seg_bytes = 65536;
        t.max_sessions = 0;
        t.auth_type = auth;
        snprintf(t.network_portals, sizeof(t.network_portals), "192.0.2.10:3260,[2001:db8::10]:3261");
        if (auth >= ORLO_ISCSI_AUTH_CHAP) {
            snprintf(t.user, sizeof(t.user), "%s-user", name);
            snprintf(t.password, sizeof(t.password), "secret-%s-1", name);
        }
        if (auth == ORLO_ISCSI_AUTH_MUTUAL_CHAP) {
            snprintf(t.mutual_user, sizeof(t.mutual_user), "%s-back", name);
            snprintf(t.mutual_password, sizeof(t.mutual_password), "mutual-%s-2", name);
            t.has_header_checksum = true;
            t.has_data_checksum = true;
        }
        return t;
    }
    static ORLOiSCSIAcl Acl(int tid, const std::string &initiator, int authority) {
        ORLOiSCSIAcl a;
        memset(&a, 0, sizeof(a));
        a.tid = tid;
        snprintf(a.initiator, sizeof(a.initiator), "%s", initiator.c_str());
        a.authority = authority;
        return a;
    }
    std::string Tpg(const ORLOiSCSITarget &t) { return "/target/iscsi/" + std::string(t.iqn) + "/tpgt_1"; }
    int Mkdir(const std::string &inside) { return mkdir(Cfg(inside).c_str(), 0700) == 0 ? 0 : errno; }
    // One write to a kernel attribute, as an administrator's echo does it.
    int CfgWrite(const std::string &inside, const std::string &text) {
        int fd = open(Cfg(inside).c_str(), O_WRONLY);
        if (fd < 0) return errno;
        ssize_t n = write(fd, text.data(), text.size());
        int err = n < 0 ? errno : 0;
        close(fd);
        return err;
    }
    std::vector<std::string> FabricNodes() { return Ls("/config/target/iscsi"); }

    // Three targets (no authentication, CHAP, mutual CHAP), their access lists and six
    // mappings, made while the service runs.  LUNs 1-4 are file LUNs, 5-6 advanced.
    void BuildLive() {
        for (int lid = 1; lid <= 6; ++lid) {
            luns_.push_back(MakeLun(lid, lid <= 4 ? ORLO_ISCSI_LUN_TYPE_FILE : ORLO_ISCSI_LUN_TYPE_ADV));
            Store(luns_.back());
            if (HasFatalFailure()) return;
        }
        ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
        targets_ = {Target("open", ORLO_ISCSI_AUTH_NONE), Target("chap", ORLO_ISCSI_AUTH_CHAP),
                    Target("mutual", ORLO_ISCSI_AUTH_MUTUAL_CHAP)};
        for (ORLOiSCSITarget &t : targets_) ASSERT_EQ(0u, ORLOiSCSITargetCreate(&t)) << log_.Dump();
        ASSERT_EQ(1, targets_[0].tid);
        ASSERT_EQ(3, targets_[2].tid);
        // open: everybody may read and write.  chap: host A reads, host B writes, nobody
        // else.  mutual: host A writes, everybody else reads.
        ASSERT_EQ(0u, ORLOiSCSITargetDefaultAclSet(&targets_[0], ISCSI_TARGET_AUTHORITY_RW)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetMaskingsCreate({Acl(2, kHostA, ISCSI_TARGET_AUTHORITY_RO),
                                                     Acl(2, kHostB, ISCSI_TARGET_AUTHORITY_RW)}))
            << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetDefaultAclSet(&targets_[1], ISCSI_TARGET_AUTHORITY_NONE)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetMaskingCreate(Acl(3, kHostA, ISCSI_TARGET_AUTHORITY_RW))) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetDefaultAclSet(&targets_[2], ISCSI_TARGET_AUTHORITY_RO)) << log_.Dump();
        // Six mappings: LUN 1 through two targets, numbers chosen and given.
        ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 1, 256)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(1, 2, 256)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(2, 1, 7)) << log_.Dump();
        ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(2, 3, 256)) << log_.Dump();
        const int32_t lids[] = {5, 6};
        ASSERT_EQ(0u, ORLOiSCSITargetMappingsAdd(3, lids, 2)) << log_.Dump();
    }

    std::vector<ORLOiSCSILun> luns_;
    std::vector<ORLOiSCSITarget> targets_;
};

TEST_F(ServiceE2ETest, StartFromTheFilesRebuildsWhatTheLiveChangesMade) {
    BuildLive();
    if (HasFatalFailure()) return;
    const Tree live = Snapshot();

    // What the live changes made, checked by hand at the points that matter.
    const std::string open = Tpg(targets_[0]), chap = Tpg(targets_[1]), mutual = Tpg(targets_[2]);
    EXPECT_EQ("1\n", live.at(open + "/enable"));
    EXPECT_EQ("0\n", live.at(open + "/attrib/authentication"));
    EXPECT_EQ("1\n", live.at(open + "/attrib/generate_node_acls"));
    EXPECT_EQ("0\n", live.at(open + "/attrib/demo_mode_write_protect"));
    EXPECT_EQ("32\n", live.at(open + "/attrib/default_cmdsn_depth"));
    EXPECT_EQ("65535\n", live.at(open + "/max_session"));
    EXPECT_EQ("Orlo Target\n", live.at(open + "/param/TargetAlias"));
    EXPECT_EQ("CRC32C,None\n", live.at(open + "/param/DataDigest"));
    EXPECT_EQ("262144\n", live.at(open + "/param/MaxRecvDataSegmentLength"));
    EXPECT_EQ("65536\n", live.at(open + "/param/MaxXmitDataSegmentLength"));
    EXPECT_EQ("dir", live.at(open + "/np/192.0.2.10:3260"));
    EXPECT_EQ("dir", live.at(open + "/np/[2001:db8::10]:3261"));
    EXPECT_EQ("dir", live.at(open + "/lun/lun_0"));
    EXPECT_EQ("dir", live.at(open + "/lun/lun_1"));
    EXPECT_EQ(0u, live.count(open + "/acls/" + kDefault)) << "the default entry has no node ACL under lio4x";

    EXPECT_EQ("1\n", live.at(chap + "/attrib/authentication"));
    EXPECT_EQ("0\n", live.at(chap + "/attrib/generate_node_acls"));
    EXPECT_EQ("chap-user\n", live.at(chap + "/auth/userid"));
    EXPECT_EQ("secret-chap-1\n", live.at(chap + "/auth/password"));
    EXPECT_EQ("chap-user\n", live.at(chap + "/acls/" + kHostA + "/auth/userid"));
    EXPECT_EQ("1\n", live.at(chap + "/acls/" + kHostA + "/lun_7/write_protect"));
    EXPECT_EQ("0\n", live.at(chap + "/acls/" + kHostB + "/lun_7/write_protect"));
    EXPECT_EQ("0\n", live.at(chap + "/acls/" + kHostB + "/lun_0/write_protect"));
    EXPECT_EQ(0u, live.count(chap + "/lun/lun_1")) << "LUN 3 took the smallest free number, 0";

    EXPECT_EQ("mutual-back\n", live.at(mutual + "/auth/userid_mutual"));
    EXPECT_EQ("mutual-mutual-2\n", live.at(mutual + "/auth/password_mutual"));
    EXPECT_EQ("mutual-back\n", live.at(mutual + "/acls/" + kHostA + "/auth/userid_mutual"));
    EXPECT_EQ("CRC32C\n", live.at(mutual + "/param/HeaderDigest"));
    EXPECT_EQ("1\n", live.at(mutual + "/attrib/demo_mode_write_protect"));
    EXPECT_EQ("0\n", live.at(mutual + "/acls/" + kHostA + "/lun_1/write_protect"));
    for (const ORLOiSCSILun &lun : {luns_[4], luns_[5]})
        EXPECT_EQ("multi\n", live.at(Backstore(lun) + "/attrib/defer_queue_mode"));
    // Secrets are never stored in the clear.
    const std::string conf = ReadFile("/usr/orlo/etc/iscsi_target.conf");
    EXPECT_EQ(std::string::npos, conf.find("secret-chap-1"));
    EXPECT_EQ(std::string::npos, conf.find("mutual-mutual-2"));

    // A node no file knows goes with the full stop, as does everything else.
    ASSERT_EQ(0, Mkdir("/target/iscsi/iqn.2000-01.com.example:stray"));
    ASSERT_EQ(0, Mkdir("/target/iscsi/iqn.2000-01.com.example:stray/tpgt_1"));
    ASSERT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    EXPECT_TRUE(FabricNodes().empty());
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(1, nullptr));
    // The stored flags are untouched, so the start brings the targets back.
    EXPECT_NE(std::string::npos, ReadFile("/usr/orlo/etc/iscsi_target.conf").find("enabled=yes"));

    ASSERT_EQ(0u, ORLOiSCSITotallyStopAndUnload()) << log_.Dump();
    EXPECT_TRUE(Modules().empty()) << ::testing::PrintToString(Modules());

    ClearTrace();
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ("", Diff(live, Snapshot()));
    for (int tid = 1; tid <= 3; ++tid) EXPECT_EQ(3, ORLOiSCSITargetStatusGet(tid, nullptr)) << tid;
    EXPECT_EQ(3, ORLOiSCSITargetAliveCountGet());

    // A second start changes nothing.
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ("", Diff(live, Snapshot()));
}

TEST_F(ServiceE2ETest, SessionsAndTakingALunAwayFromItsTargets) {
    BuildLive();
    if (HasFatalFailure()) return;
    const Tree live = Snapshot();

    ASSERT_EQ(0, AddSession(targets_[1].iqn, 1, kHostA, "198.51.100.7", 3));
    ASSERT_EQ(0, AddSession(targets_[1].iqn, 1, kHostB, "198.51.100.8", 9));
    ORLOiSCSISessionStateList sessions;
    memset(&sessions, 0, sizeof(sessions));
    ASSERT_EQ(2, ORLOiSCSITargetSessionStateListGet(2, &sessions)) << log_.Dump();
    std::vector<std::string> seen;
    ORLOiSCSIListLink *link;
    ORLOiSCSISessionState *s;
    ORLO_ISCSI_SESSION_STATE_LIST_FOREACH(&sessions, link, s)
    seen.push_back(std::string(s->iqn) + " " + s->ip + " " + s->cid);
    ORLOiSCSITargetSessionStateListFree(&sessions);
    std::sort(seen.begin(), seen.end());
    EXPECT_EQ((std::vector<std::string>{kHostA + " 198.51.100.7 3", kHostB + " 198.51.100.8 9"}), seen);
    char conn = 9;
    ASSERT_EQ(0u, ORLOiSCSITargetConnectionStatusGet(2, &conn));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_ACTIVE, conn);
    ASSERT_EQ(0u, ORLOiSCSITargetConnectionStatusGet(1, &conn));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_NONE, conn);

    // LUN 1 is seen through "open" and "chap"; "mutual" has its portal group switched off
    // by hand, so it is not running and must be left as it is.
    ASSERT_EQ(0, CfgWrite(Tpg(targets_[2]) + "/enable", "0"));
    ASSERT_EQ(0u, ORLOiSCSITargetMappingAdd(3, 1, 256)) << log_.Dump();
    int32_t state[ORLO_ISCSI_TARGET_STATE_ENTRIES] = {0};
    ASSERT_EQ(0, ORLOiSCSITargetDisableByLid(state, 1)) << log_.Dump();
    EXPECT_EQ(1, state[1]);
    EXPECT_EQ(1, state[2]);
    EXPECT_EQ(0, state[3]);
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_EQ(0, ORLOiSCSITargetStatusGet(2, nullptr));
    EXPECT_EQ(1, ORLOiSCSITargetStatusGet(3, nullptr));
    ASSERT_EQ(0u, ORLOiSCSITargetConnectionStatusGet(2, &conn));
    EXPECT_EQ(ORLO_ISCSI_TARGET_CONN_DOWN, conn);

    ASSERT_EQ(0u, ORLOiSCSITargetEnableByLid(state, 1)) << log_.Dump();
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(2, nullptr));
    EXPECT_EQ(1, ORLOiSCSITargetStatusGet(3, nullptr)) << "a target that was not running stays off";
    // The two restored targets are exactly as they were.
    ASSERT_EQ(0u, ORLOiSCSITargetMappingRemove(3, 1)) << log_.Dump();
    ASSERT_EQ(0, CfgWrite(Tpg(targets_[2]) + "/enable", "1"));
    EXPECT_EQ("", Diff(live, Snapshot()));
}

TEST_F(ServiceE2ETest, ATargetThatFailsToStartDoesNotKeepTheOthersDown) {
    BuildLive();
    if (HasFatalFailure()) return;
    ASSERT_EQ(0u, ORLOiSCSIStopAll()) << log_.Dump();
    ASSERT_EQ(0, SetFault("write", Tpg(targets_[1]) + "/enable", "EIO", false));
    ASSERT_EQ(0u, ORLOiSCSIStartAll()) << log_.Dump();
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(1, nullptr));
    EXPECT_NE(3, ORLOiSCSITargetStatusGet(2, nullptr));
    EXPECT_EQ(3, ORLOiSCSITargetStatusGet(3, nullptr));
    EXPECT_FALSE(service_test::Messages(log_, "ORLOiSCSITargetEnable(").empty()) << log_.Dump();
    EXPECT_TRUE(service_test::HasLog(log_, "iscsi_start_all_without_lock.cpp", "ORLOiSCSIStartAllWithoutLock",
                                     "Successfully started iSCSI service."))
        << log_.Dump();
}

}  // namespace
}  // namespace e2e_test
