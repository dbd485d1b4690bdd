// The messaging engine against bare relays with the same hops.
//
// On one host: a 100-byte message from a client to an echo service and back through the
// engine (client FIFO -> engine -> service FIFO, and back), next to a bare relay process
// doing the same hops with plain frames (client -> FIFO -> relay -> FIFO -> echo, and back).
// Across two hosts (network namespaces joined by a veth pair): through both engines and TCP,
// next to two bare relays joined by TCP.  Then the throughput of 4012-byte messages (64 per
// round, one small acknowledgement) on the same paths.  The summary prints each engine
// figure as a multiple of its bare relay.
//
// Needs root (network namespaces); prints why and does nothing otherwise.
#include <arpa/inet.h>
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sched.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "orlocomm.h"

namespace {

const char *kIp = "/usr/sbin/ip";
constexpr int kBarePort = 3263;
constexpr int kBatch = 64;
const uint8_t kMagic[8] = {0x12, 0x18, 0x0D, 0x0E, 0x0B, 0x0E, 0x06, 0x18};

// What a message asks of the echo service (its first data byte).
enum : uint8_t { kEcho = 1, kSink = 2, kAck = 3 };
// Where a bare frame goes (its first payload byte).
enum : uint8_t { kToEcho = 1, kToClient = 2 };

struct Setup {
    std::string binDir, nsA, nsB, vethA, vethB, addrA, addrB, rootA, rootB, fifoDir;
    pid_t engA = -1, engB = -1;
    std::vector<pid_t> children;
    PORLOCOMM comm = nullptr;
    int localRoute = -1, remoteRoute = -1;
    int bareLocalIn = -1, bareLocalOut = -1, bareRemoteIn = -1, bareRemoteOut = -1;
    bool ready = false;
} g;

int RunCmd(const std::vector<std::string> &argv) {
    pid_t pid = fork();
    if (pid == 0) {
        int null = open("/dev/null", O_WRONLY);
        dup2(null, 1);
        dup2(null, 2);
        std::vector<char *> a;
        for (const std::string &s : argv) a.push_back(const_cast<char *>(s.c_str()));
        a.push_back(nullptr);
        execv(a[0], a.data());
        _exit(127);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

bool EnterNs(const std::string &ns) {
    int fd = open(("/var/run/netns/" + ns).c_str(), O_RDONLY);
    bool ok = fd >= 0 && setns(fd, CLONE_NEWNET) == 0;
    if (fd >= 0) close(fd);
    return ok;
}

// ---- Plain frames for the bare relays ----

bool WriteAll(int fd, const void *buf, size_t len) {
    const auto *b = static_cast<const uint8_t *>(buf);
    while (len > 0) {
        ssize_t n = write(fd, b, len);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        b += n;
        len -= static_cast<size_t>(n);
    }
    return true;
}

bool ReadAll(int fd, void *buf, size_t len) {
    auto *b = static_cast<uint8_t *>(buf);
    while (len > 0) {
        ssize_t n = read(fd, b, len);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        b += n;
        len -= static_cast<size_t>(n);
    }
    return true;
}

bool SendFrame(int fd, const uint8_t *payload, uint32_t len) {
    uint8_t frame[32 + 4096];
    memset(frame, 0, 32);
    memcpy(frame, kMagic, 8);
    memcpy(frame + 24, &len, 4);
    memcpy(frame + 32, payload, len);
    return WriteAll(fd, frame, 32 + len);
}

// The payload length, or -1.
int RecvFrame(int fd, uint8_t *payload) {
    uint8_t h[32];
    if (!ReadAll(fd, h, 32) || memcmp(h, kMagic, 8) != 0) return -1;
    uint32_t len;
    memcpy(&len, h + 24, 4);
    if (len > 4096 || !ReadAll(fd, payload, len)) return -1;
    return static_cast<int>(len);
}

std::string Fifo(const std::string &name) { return g.fifoDir + "/" + name; }

int OpenFifo(const std::string &name, int flags) {
    std::string p = Fifo(name);
    mkfifo(p.c_str(), 0600);
    return open(p.c_str(), flags);
}

// The bare echo: answers kEcho with the same bytes and kAck with one byte, back to out.
[[noreturn]] void BareEcho(const std::string &in, const std::string &out) {
    int rfd = OpenFifo(in, O_RDWR);
    int wfd = OpenFifo(out, O_RDWR);
    uint8_t p[4096];
    for (;;) {
        int n = RecvFrame(rfd, p);
        if (n < 0) _exit(1);
        p[0] = kToClient;
        if (p[1] == kEcho) SendFrame(wfd, p, static_cast<uint32_t>(n));
        if (p[1] == kAck) SendFrame(wfd, p, 2);
    }
}

// The bare relay of one host: frames from the client's FIFO go to the echo (its FIFO, or
// the other relay over TCP), and answers come back the same way.
[[noreturn]] void BareRelayLocal() {
    int in = OpenFifo("relay_in", O_RDWR);
    int echo = OpenFifo("echo_in", O_RDWR);
    int client = OpenFifo("client_in", O_RDWR);
    uint8_t p[4096];
    for (;;) {
        int n = RecvFrame(in, p);
        if (n < 0) _exit(1);
        SendFrame(p[0] == kToEcho ? echo : client, p, static_cast<uint32_t>(n));
    }
}

int Listen(int port) {
    int s = socket(AF_INET, SOCK_STREAM, 0);
    int one = 1;
    setsockopt(s, SOL_SOCKET, SO_REUSEADDR, &one, sizeof(one));
    struct sockaddr_in a = {};
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<uint16_t>(port));
    if (bind(s, reinterpret_cast<sockaddr *>(&a), sizeof(a)) != 0 || listen(s, 4) != 0) _exit(1);
    return s;
}

void NoDelay(int fd) {
    int one = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof(one));
}

// One relay of the pair: it moves frames between its FIFO and the TCP connection, both ways.
[[noreturn]] void BareRelayTcp(bool sideA) {
    int fifoIn = OpenFifo(sideA ? "ra_in" : "rb_in", O_RDWR);
    int fifoOut = OpenFifo(sideA ? "rclient_in" : "recho_in", O_RDWR);
    int sock;
    if (sideA) {
        sock = socket(AF_INET, SOCK_STREAM, 0);
        struct sockaddr_in a = {};
        a.sin_family = AF_INET;
        a.sin_port = htons(kBarePort);
        inet_pton(AF_INET, g.addrB.c_str(), &a.sin_addr);
        for (int i = 0; connect(sock, reinterpret_cast<sockaddr *>(&a), sizeof(a)) != 0; ++i) {
            if (i > 200) _exit(1);
            close(sock);
            sock = socket(AF_INET, SOCK_STREAM, 0);
            usleep(20000);
        }
    } else {
        int l = Listen(kBarePort);
        sock = accept(l, nullptr, nullptr);
    }
    NoDelay(sock);
    uint8_t p[4096];
    struct pollfd fds[2] = {{fifoIn, POLLIN, 0}, {sock, POLLIN, 0}};
    for (;;) {
        if (poll(fds, 2, -1) < 0 && errno != EINTR) _exit(1);
        if (fds[0].revents & POLLIN) {
            int n = RecvFrame(fifoIn, p);
            if (n < 0 || !SendFrame(sock, p, static_cast<uint32_t>(n))) _exit(1);
        }
        if (fds[1].revents & (POLLIN | POLLHUP)) {
            int n = RecvFrame(sock, p);
            if (n < 0 || !SendFrame(fifoOut, p, static_cast<uint32_t>(n))) _exit(1);
        }
    }
}

// The echo service on the engine.
[[noreturn]] void EngineEcho(const std::string &root) {
    setenv("ORLO_SYSROOT", root.c_str(), 1);
    OrloCommSetLogMask(LOG_UPTO(LOG_NOTICE));
    PORLOCOMM comm = CreateOrloComm("echo");
    if (comm == nullptr) _exit(1);
    PORLOCOMM_EVLP e = CreateOrloCommEvlp();
    uint8_t copy[4096];
    for (;;) {
        int n = CommRecvEvlp(comm, e);
        if (n < 0) _exit(0);
        auto *d = static_cast<uint8_t *>(CommGetEvlpData(e));
        if (n >= 1 && d[0] == kEcho) {
            memcpy(copy, d, static_cast<size_t>(n));
            CommRetEvlp(comm, e, copy, n);
        } else if (n >= 1 && d[0] == kAck) {
            CommRetEvlp(comm, e, "a", 1);
        }
    }
}

pid_t Child(const std::string &ns, void (*fn)()) {
    pid_t pid = fork();
    if (pid == 0) {
        if (!EnterNs(ns)) _exit(1);
        fn();
        _exit(0);
    }
    g.children.push_back(pid);
    return pid;
}

pid_t StartEngine(const std::string &ns, const std::string &root) {
    pid_t pid = fork();
    if (pid == 0) {
        int null = open("/dev/null", O_WRONLY);
        dup2(null, 1);
        dup2(null, 2);
        std::string bin = g.binDir + "/orlocommd";
        execl(kIp, kIp, "netns", "exec", ns.c_str(), bin.c_str(), "--root", root.c_str(), "--foreground",
              static_cast<char *>(nullptr));
        _exit(127);
    }
    std::string pidFile = root + "/var/run/iscsi_snapshot_comm_core.pid";
    for (int i = 0; i < 500; ++i) {
        struct stat st;
        if (stat((root + "/tmp/orlocomm_pipe_svr_msg_req").c_str(), &st) == 0 && stat(pidFile.c_str(), &st) == 0)
            return pid;
        usleep(20000);
    }
    return -1;
}

void TearDown() {
    if (g.comm != nullptr) DestroyOrloComm(g.comm);
    g.comm = nullptr;
    for (pid_t p : g.children) kill(p, SIGKILL);
    for (pid_t p : g.children) waitpid(p, nullptr, 0);
    for (pid_t p : {g.engA, g.engB})
        if (p > 0) {
            kill(p, SIGTERM);
            waitpid(p, nullptr, 0);
        }
    if (!g.nsA.empty()) {
        RunCmd({kIp, "netns", "del", g.nsA});
        RunCmd({kIp, "netns", "del", g.nsB});
    }
    for (const std::string &d : {g.rootA, g.rootB, g.fifoDir})
        if (!d.empty()) RunCmd({"/bin/rm", "-rf", d});
}

std::string TempDir(const char *prefix) {
    std::string t = std::string("/tmp/") + prefix + "-XXXXXX";
    std::vector<char> b(t.begin(), t.end());
    b.push_back('\0');
    return mkdtemp(b.data()) == nullptr ? std::string() : std::string(b.data());
}

bool SetUp(const char *argv0) {
    std::string self = argv0;
    g.binDir = self.substr(0, self.rfind('/'));
    int tag = getpid() % 100000;
    int net = 16 + getpid() % 200;
    g.nsA = "obA" + std::to_string(tag);
    g.nsB = "obB" + std::to_string(tag);
    g.vethA = "obva" + std::to_string(tag);
    g.vethB = "obvb" + std::to_string(tag);
    g.addrA = "10.214." + std::to_string(net) + ".1";
    g.addrB = "10.214." + std::to_string(net) + ".2";
    for (const std::vector<std::string> &c : std::vector<std::vector<std::string>>{
             {kIp, "netns", "add", g.nsA},
             {kIp, "netns", "add", g.nsB},
             {kIp, "link", "add", g.vethA, "type", "veth", "peer", "name", g.vethB},
             {kIp, "link", "set", g.vethA, "netns", g.nsA},
             {kIp, "link", "set", g.vethB, "netns", g.nsB},
             {kIp, "-n", g.nsA, "addr", "add", g.addrA + "/24", "dev", g.vethA},
             {kIp, "-n", g.nsB, "addr", "add", g.addrB + "/24", "dev", g.vethB},
             {kIp, "-n", g.nsA, "link", "set", g.vethA, "up"},
             {kIp, "-n", g.nsB, "link", "set", g.vethB, "up"},
             {kIp, "-n", g.nsA, "link", "set", "lo", "up"},
             {kIp, "-n", g.nsB, "link", "set", "lo", "up"}})
        if (RunCmd(c) != 0) {
            fprintf(stderr, "comm_relay_bench: %s %s failed\n", c[1].c_str(), c[2].c_str());
            return false;
        }
    g.rootA = TempDir("orlo-benchA");
    g.rootB = TempDir("orlo-benchB");
    g.fifoDir = TempDir("orlo-benchfifo");
    g.engA = StartEngine(g.nsA, g.rootA);
    g.engB = StartEngine(g.nsB, g.rootB);
    if (g.engA < 0 || g.engB < 0) {
        fprintf(stderr, "comm_relay_bench: the engines did not start\n");
        return false;
    }
    Child(g.nsA, [] { EngineEcho(g.rootA); });
    Child(g.nsB, [] { EngineEcho(g.rootB); });
    Child(g.nsA, [] { BareRelayLocal(); });
    Child(g.nsA, [] { BareEcho("echo_in", "relay_in"); });
    Child(g.nsB, [] { BareRelayTcp(false); });
    Child(g.nsA, [] { BareRelayTcp(true); });
    Child(g.nsB, [] { BareEcho("recho_in", "rb_in"); });

    // The benchmark itself is the client, on host A.
    if (!EnterNs(g.nsA)) return false;
    setenv("ORLO_SYSROOT", g.rootA.c_str(), 1);
    OrloCommSetLogMask(LOG_UPTO(LOG_NOTICE));
    usleep(300000);  // the echo services register
    g.comm = CreateOrloComm("bench");
    if (g.comm == nullptr) return false;
    g.localRoute = OrloCommConnect(g.comm, "localhost", "echo");
    g.remoteRoute = OrloCommConnect(g.comm, g.addrB.c_str(), "echo");
    g.bareLocalIn = OpenFifo("client_in", O_RDWR);
    g.bareLocalOut = OpenFifo("relay_in", O_RDWR);
    g.bareRemoteIn = OpenFifo("rclient_in", O_RDWR);
    g.bareRemoteOut = OpenFifo("ra_in", O_RDWR);
    if (g.localRoute < 0 || g.remoteRoute < 0) {
        fprintf(stderr, "comm_relay_bench: cannot connect to the echo services (%d, %d)\n", g.localRoute,
                g.remoteRoute);
        return false;
    }
    return true;
}

// ---- The measured paths ----

bool EngineRound(int route, const uint8_t *data, int len, uint8_t *reply) {
    if (CommSendMessage(g.comm, route, data, len) != len) return false;
    return CommRecvMessage(g.comm, reply, 4096) == ORLOCOMM_DATA_OFFSET + len;
}

bool BareRound(int out, int in, uint8_t *frame, int len, uint8_t *reply) {
    frame[0] = kToEcho;
    return SendFrame(out, frame, static_cast<uint32_t>(len + 1)) && RecvFrame(in, reply) == len + 1;
}

void BM_RoundTrip100(benchmark::State &state) {
    bool engine = state.range(0) == 0, remote = state.range(1) == 1;
    uint8_t data[101], reply[4096];
    memset(data, 'r', sizeof(data));
    for (auto _ : state) {
        bool ok;
        if (engine) {
            data[0] = kEcho;
            ok = EngineRound(remote ? g.remoteRoute : g.localRoute, data, 100, reply);
        } else {
            data[1] = kEcho;
            ok = BareRound(remote ? g.bareRemoteOut : g.bareLocalOut, remote ? g.bareRemoteIn : g.bareLocalIn, data,
                           100, reply);
        }
        if (!ok) {
            state.SkipWithError("a round trip failed");
            break;
        }
    }
}

void BM_Throughput4012(benchmark::State &state) {
    bool engine = state.range(0) == 0, remote = state.range(1) == 1;
    std::vector<uint8_t> data(MAX_DATA_PACKETS + 1, 't');
    uint8_t reply[4096];
    for (auto _ : state) {
        bool ok = true;
        for (int i = 0; i < kBatch && ok; ++i) {
            uint8_t what = i + 1 == kBatch ? kAck : kSink;
            if (engine) {
                data[0] = what;
                ok = CommSendMessage(g.comm, remote ? g.remoteRoute : g.localRoute, data.data(), MAX_DATA_PACKETS) ==
                     MAX_DATA_PACKETS;
            } else {
                data[0] = kToEcho;
                data[1] = what;
                ok = SendFrame(remote ? g.bareRemoteOut : g.bareLocalOut, data.data(), MAX_DATA_PACKETS + 1);
            }
        }
        ok = ok && (engine ? CommRecvMessage(g.comm, reply, 4096) > 0
                           : RecvFrame(remote ? g.bareRemoteIn : g.bareLocalIn, reply) > 0);
        if (!ok) {
            state.SkipWithError("a transfer failed");
            break;
        }
    }
    state.SetBytesProcessed(state.iterations() * kBatch * MAX_DATA_PACKETS);
}

// Keeps each run's time per iteration, and prints the engine next to its bare relay.
class Summary : public benchmark::ConsoleReporter {
  public:
    void ReportRuns(const std::vector<Run> &runs) override {
        for (const Run &r : runs) {
            times_[r.benchmark_name()] = r.GetAdjustedRealTime();
            if (r.counters.count("bytes_per_second"))
                rates_[r.benchmark_name()] = r.counters.at("bytes_per_second") / 1e6;
        }
        ConsoleReporter::ReportRuns(runs);
    }
    void Finalize() override {
        ConsoleReporter::Finalize();
        printf("\n%-34s %12s %12s %8s\n", "path", "orlocomm", "bare relay", "ratio");
        Line("round trip of 100 bytes, one host", "BM_RoundTrip100/0/0/real_time", "BM_RoundTrip100/1/0/real_time", "us");
        Line("round trip of 100 bytes, two hosts", "BM_RoundTrip100/0/1/real_time", "BM_RoundTrip100/1/1/real_time", "us");
        Rate("4012-byte messages, one host", "BM_Throughput4012/0/0/real_time", "BM_Throughput4012/1/0/real_time");
        Rate("4012-byte messages, two hosts", "BM_Throughput4012/0/1/real_time", "BM_Throughput4012/1/1/real_time");
        printf("(the engine's round trip is to stay within 1.5x of its bare relay)\n");
    }

  private:
    void Line(const char *what, const std::string &e, const std::string &b, const char *unit) {
        if (!times_.count(e) || !times_.count(b)) return;
        double te = times_[e], tb = times_[b];
        printf("%-34s %9.1f %s %9.1f %s %7.2fx\n", what, te, unit, tb, unit, te / tb);
    }
    void Rate(const char *what, const std::string &e, const std::string &b) {
        if (!rates_.count(e) || !rates_.count(b)) return;
        printf("%-34s %7.1f MB/s %7.1f MB/s %7.2fx\n", what, rates_[e], rates_[b], rates_[b] / rates_[e]);
    }
    std::map<std::string, double> times_, rates_;
};

}  // namespace

BENCHMARK(BM_RoundTrip100)->Args({0, 0})->Args({1, 0})->Args({0, 1})->Args({1, 1})->UseRealTime()
    ->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Throughput4012)->Args({0, 0})->Args({1, 0})->Args({0, 1})->Args({1, 1})->UseRealTime()
    ->Unit(benchmark::kMillisecond);

int main(int argc, char **argv) {
    if (geteuid() != 0) {
        printf("comm_relay_bench: needs root (network namespaces); nothing measured\n");
        return 0;
    }
    signal(SIGPIPE, SIG_IGN);
    benchmark::Initialize(&argc, argv);
    bool ok = SetUp(argv[0]);
    if (ok) {
        Summary reporter;
        benchmark::RunSpecifiedBenchmarks(&reporter);
    }
    TearDown();
    benchmark::Shutdown();
    return ok ? 0 : 1;
}
