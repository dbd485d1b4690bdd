// Shared pieces of the iSNS tests: Debian's iSNS server (isnsd) run on the loopback
// address with its own configuration and in-memory database under a temporary
// directory, queried with isnsadm; stand-ins for servers that misbehave; and a
// simulated kernel target in which targets with known portals run.
#ifndef ORLO_TESTS_ISNS_ISNS_FIXTURE_H
#define ORLO_TESTS_ISNS_ISNS_FIXTURE_H

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <fstream>
#include <map>
#include <regex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "orloiscsi_base.h"
#include "orloiscsi_service.h"
#include "orloiscsi_target.h"
#include "service/service_test_util.h"
#include "support/sandbox.h"
#include "target/isns_client.h"

namespace isns_test {

constexpr const char *kIsnsd = "/usr/sbin/isnsd";
constexpr const char *kIsnsadm = "/usr/sbin/isnsadm";
constexpr const char *kIsnsConf = "/usr/orlo/etc/isns.conf";
constexpr const char *kEntity = "orlo-test";

inline double Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

// A loopback port nobody listens on at the moment.
inline int FreePort() {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    struct sockaddr_in sa;
    memset(&sa, 0, sizeof(sa));
    sa.sin_family = AF_INET;
    sa.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof(sa);
    int port = -1;
    if (bind(fd, reinterpret_cast<struct sockaddr *>(&sa), sizeof(sa)) == 0 &&
        getsockname(fd, reinterpret_cast<struct sockaddr *>(&sa), &len) == 0)
        port = ntohs(sa.sin_port);
    close(fd);
    return port;
}

// Whether something accepts connections on 127.0.0.1:port.
inline bool Accepting(int port) {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    struct sockaddr_in sa;
    memset(&sa, 0, sizeof(sa));
    sa.sin_family = AF_INET;
    sa.sin_port = htons(static_cast<uint16_t>(port));
    sa.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    bool ok = connect(fd, reinterpret_cast<struct sockaddr *>(&sa), sizeof(sa)) == 0;
    close(fd);
    return ok;
}

// One object of isnsadm's output: its type ("Network Entity", "iSCSI Storage Node",
// "Portal", "iSCSI Portal Group") and its attributes by name, values unquoted.
struct Object {
    std::string type;
    std::map<std::string, std::string> attrs;
};

inline std::vector<Object> ParseObjects(const std::string &out) {
    std::vector<Object> objs;
    // "object[N] = <Type>" (queries) or "Object N:" (lists, whose type is the listed one).
    const std::regex head("^object\\[[0-9]+\\] = <(.*)>$|^Object [0-9]+:$");
    const std::regex attr("^\\s+[0-9a-f]{4}\\s+\\w+\\s+: (.*?) = (.*)$");
    size_t pos = 0;
    while (pos < out.size()) {
        size_t nl = out.find('\n', pos);
        if (nl == std::string::npos) nl = out.size();
        std::string line = out.substr(pos, nl - pos);
        pos = nl + 1;
        std::smatch m;
        if (std::regex_match(line, m, head)) {
            objs.push_back(Object{m[1], {}});
        } else if (!objs.empty() && std::regex_match(line, m, attr)) {
            std::string v = m[2];
            if (v.size() >= 2 && v.front() == '"' && v.back() == '"') v = v.substr(1, v.size() - 2);
            objs.back().attrs[m[1]] = v;
        }
    }
    return objs;
}

// Debian's iSNS server on 127.0.0.1, its files in a temporary directory, its database in
// memory (so a restart forgets every registration).
class IsnsServer {
  public:
    ~IsnsServer() {
        Stop();
        if (!dir_.empty()) orlotest::RemoveTree(dir_);
    }
    // Starts it on a free port with the given registration period ("10m", "2s").
    bool Start(const std::string &period = "10m") {
        if (dir_.empty()) dir_ = orlotest::MakeTempDir("orlo-isnsd");
        if (port_ < 0) port_ = FreePort();
        period_ = period;
        std::ofstream(dir_ + "/isnsd.conf")
            << "BindAddress = 127.0.0.1:" << port_ << "\nPIDFile = " << dir_ << "/isnsd.pid\n"
            << "ControlSocket = " << dir_ << "/isnsctl\nSecurity = 0\nSLPRegister = 0\nESIRetries = 0\n"
            << "DefaultDiscoveryDomain = 1\nRegistrationPeriod = " << period_
            << "\nSourceName = iqn.2000-01.org.test:isnsd\n";
        std::ofstream(dir_ + "/isnsadm.conf") << "ServerAddress = 127.0.0.1:" << port_
                                               << "\nSecurity = 0\nSourceName = iqn.2000-01.org.test:isnsadm\n"
                                               << "ControlSocket = " << dir_ << "/isnsctl\n";
        pid_ = fork();
        if (pid_ == 0) {
            int fd = ::open((dir_ + "/isnsd.log").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
            if (fd >= 0) {
                dup2(fd, 1);
                dup2(fd, 2);
            }
            std::string conf = dir_ + "/isnsd.conf";
            execl(kIsnsd, kIsnsd, "-f", "-4", "-c", conf.c_str(), static_cast<char *>(nullptr));
            _exit(127);
        }
        for (int i = 0; i < 100; ++i) {
            if (Accepting(port_)) return true;
            if (waitpid(pid_, nullptr, WNOHANG) == pid_) break;
            usleep(50 * 1000);
        }
        Stop();
        return false;
    }
    void Stop() {
        if (pid_ <= 0) return;
        kill(pid_, SIGTERM);
        for (int i = 0; i < 100 && waitpid(pid_, nullptr, WNOHANG) != pid_; ++i) usleep(20 * 1000);
        if (kill(pid_, 0) == 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
        pid_ = -1;
    }
    // A restart on the same port, with nothing registered.
    bool Restart() {
        Stop();
        return Start(period_);
    }
    int port() const { return port_; }
    std::string address() const { return "127.0.0.1:" + std::to_string(port_); }

    // isnsadm with the given arguments; its standard output.
    std::string Adm(const std::vector<std::string> &args) const {
        std::vector<std::string> argv = {kIsnsadm, "-c", dir_ + "/isnsadm.conf"};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string out, err;
        orlotest::RunProgram(argv, &out, &err);
        return out;
    }
    // Everything the server holds in an entity.
    std::vector<Object> Entity(const std::string &eid = kEntity) const {
        return ParseObjects(Adm({"--query", "eid=" + eid}));
    }
    // The storage nodes of an entity, sorted.
    std::vector<std::string> Nodes(const std::string &eid = kEntity) const {
        std::vector<std::string> out;
        for (const Object &o : Entity(eid))
            if (o.type == "iSCSI Storage Node") out.push_back(o.attrs.at("iSCSI name"));
        std::sort(out.begin(), out.end());
        return out;
    }
    // A node's portal groups as "addr:port/tcp tag", sorted.  Listed one group per
    // request: an entity with many portals does not fit one answer.
    std::vector<std::string> PortalGroups(const std::string &iqn) const {
        std::vector<std::string> out;
        for (const Object &o : ParseObjects(Adm({"--list", "portal-groups"}))) {
            if (o.attrs.count("Portal group name") == 0 || o.attrs.at("Portal group name") != iqn) continue;
            out.push_back(o.attrs.at("Portal group address") + ":" + o.attrs.at("Portal group port") + " " +
                          o.attrs.at("Portal group tag"));
        }
        std::sort(out.begin(), out.end());
        return out;
    }
    std::string Alias(const std::string &iqn, const std::string &eid = kEntity) const {
        for (const Object &o : Entity(eid))
            if (o.type == "iSCSI Storage Node" && o.attrs.at("iSCSI name") == iqn)
                return o.attrs.count("iSCSI alias") ? o.attrs.at("iSCSI alias") : "";
        return "<none>";
    }
    bool HasEntity(const std::string &eid = kEntity) const {
        for (const Object &o : Entity(eid))
            if (o.type == "Network Entity") return true;
        return false;
    }

  private:
    std::string dir_;
    std::string period_ = "10m";
    int port_ = -1;
    pid_t pid_ = -1;
};

// A stand-in for a server that misbehaves, on 127.0.0.1: "silent" accepts connections
// and never answers, "garbage" answers each request with the given bytes, "close"
// accepts and closes at once, "full" never accepts and lets its one-entry backlog fill,
// so that further connection attempts go unanswered (packets dropped).
class BadServer {
  public:
    BadServer(const std::string &mode, const std::string &reply = "") : mode_(mode), reply_(reply) {
        fd_ = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        struct sockaddr_in sa;
        memset(&sa, 0, sizeof(sa));
        sa.sin_family = AF_INET;
        sa.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t len = sizeof(sa);
        bind(fd_, reinterpret_cast<struct sockaddr *>(&sa), sizeof(sa));
        getsockname(fd_, reinterpret_cast<struct sockaddr *>(&sa), &len);
        port_ = ntohs(sa.sin_port);
        listen(fd_, 0);
        if (mode_ == "full") {
            // One connection completes into the queue; later handshakes are dropped.
            filler_ = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
            connect(filler_, reinterpret_cast<struct sockaddr *>(&sa), sizeof(sa));
            return;
        }
        thread_ = std::thread([this] { Serve(); });
    }
    ~BadServer() {
        stop_ = true;
        if (thread_.joinable()) thread_.join();
        for (int c : conns_) close(c);
        if (filler_ >= 0) close(filler_);
        close(fd_);
    }
    int port() const { return port_; }
    std::string address() const { return "127.0.0.1:" + std::to_string(port_); }
    int accepted() const { return accepted_.load(); }

  private:
    void Serve() {
        while (!stop_) {
            struct pollfd p = {fd_, POLLIN, 0};
            if (poll(&p, 1, 50) <= 0) continue;
            int c = accept(fd_, nullptr, nullptr);
            if (c < 0) continue;
            ++accepted_;
            if (mode_ == "close") {
                close(c);
                continue;
            }
            conns_.push_back(c);
            if (mode_ == "garbage") {
                char buf[8192];
                struct pollfd q = {c, POLLIN, 0};
                if (poll(&q, 1, 2000) > 0 && recv(c, buf, sizeof(buf), 0) > 0)
                    (void)send(c, reply_.data(), reply_.size(), MSG_NOSIGNAL);
            }
        }
    }
    std::string mode_, reply_;
    int fd_ = -1, filler_ = -1, port_ = -1;
    std::atomic<bool> stop_{false};
    std::atomic<int> accepted_{0};
    std::vector<int> conns_;
    std::thread thread_;
};

// A sandbox with a simulated kernel target and the iSNS client of this process reset.
class IsnsSimTest : public service_test::ServiceSimTest {
  protected:
    void SetUp() override {
        orlo::isns::Reset();
        ServiceSimTest::SetUp();
    }
    void TearDown() override {
        orlo::isns::Reset();
        ServiceSimTest::TearDown();
    }
    // isns.conf pointing at a server, with the test entity and extra lines.
    void Configure(bool enable, const std::string &server, const std::string &extra = "") {
        WriteFile(kIsnsConf, std::string("isns_enable=") + (enable ? "yes" : "no") + "\nisns_server=" + server +
                                 "\nisns_entity=" + kEntity + "\n" + extra);
    }
    static std::string IqnOf(int tid) { return "iqn.2000-01.com.orlo-nas:reg-" + std::to_string(tid); }
    // A stored target listening on the given portals (network_portals).
    ORLOiSCSITarget StoreTarget(int tid, bool enabled, const std::string &portals, bool bkp = false) {
        ORLOiSCSITarget t;
        memset(&t, 0, sizeof(t));
        t.tid = tid;
        t.enabled = enabled;
        t.bkp_obj = bkp;
        snprintf(t.name, sizeof(t.name), "reg-%d", tid);
        snprintf(t.iqn, sizeof(t.iqn), "%s", IqnOf(tid).c_str());
        snprintf(t.network_portals, sizeof(t.network_portals), "%s", portals.c_str());
        t.max_recv_seg_bytes = 262144;
        t.max_send_seg_bytes = 262144;
        t.max_sessions = 1;
        EXPECT_EQ(0u, ORLOiSCSIBaseMkdir(nullptr)) << log_.Dump();
        EXPECT_EQ(0u, ORLOiSCSITargetConfAdd(&t)) << log_.Dump();
        return t;
    }
    // The lines logged by the iSNS client's files, and those that mention iSNS.
    std::vector<std::string> IsnsLines() const {
        std::vector<std::string> out;
        const std::regex isnsFile("^iSCSI:[^:]*isns[^:]*:");
        for (const std::string &l : log_.Lines())
            if (std::regex_search(l, isnsFile) || l.find("iSNS") != std::string::npos) out.push_back(l);
        return out;
    }
};

}  // namespace isns_test

#endif
