// Two appliances on one machine: two network namespaces joined by a veth pair, an engine in
// each with a sandbox root of its own, and applications run inside the namespaces.  The
// namespaces are made per test and always removed.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "comm_engine_fixture.h"

namespace {

using commtest::Slurp;
using commtest::SpawnLogged;
using commtest::WaitExit;

const char *kIp = "/usr/sbin/ip";

class CommTwoHostTest : public ::testing::Test {
  protected:
    struct Host {
        std::string ns, veth, addr, root;
        pid_t engine = -1;
    };

    void SetUp() override {
        if (geteuid() != 0) GTEST_SKIP() << "needs root: the hosts are network namespaces";
        if (access(kIp, X_OK) != 0) GTEST_SKIP() << "needs iproute2 (" << kIp << ")";
        int tag = getpid() % 100000;
        int net = 16 + getpid() % 200;
        a_.ns = "ocA" + std::to_string(tag);
        b_.ns = "ocB" + std::to_string(tag);
        a_.veth = "ocva" + std::to_string(tag);
        b_.veth = "ocvb" + std::to_string(tag);
        a_.addr = "10.213." + std::to_string(net) + ".1";
        b_.addr = "10.213." + std::to_string(net) + ".2";
        nobody_ = "10.213." + std::to_string(net) + ".9";
        made_ = true;
        for (const std::vector<std::string> &cmd : std::vector<std::vector<std::string>>{
                 {kIp, "netns", "add", a_.ns},
                 {kIp, "netns", "add", b_.ns},
                 {kIp, "link", "add", a_.veth, "type", "veth", "peer", "name", b_.veth},
                 {kIp, "link", "set", a_.veth, "netns", a_.ns},
                 {kIp, "link", "set", b_.veth, "netns", b_.ns},
                 {kIp, "-n", a_.ns, "addr", "add", a_.addr + "/24", "dev", a_.veth},
                 {kIp, "-n", b_.ns, "addr", "add", b_.addr + "/24", "dev", b_.veth},
                 {kIp, "-n", a_.ns, "link", "set", a_.veth, "up"},
                 {kIp, "-n", b_.ns, "link", "set", b_.veth, "up"},
                 {kIp, "-n", a_.ns, "link", "set", "lo", "up"},
                 {kIp, "-n", b_.ns, "link", "set", "lo", "up"}}) {
            std::string err;
            ASSERT_EQ(orlotest::RunProgram(cmd, nullptr, &err), 0) << cmd[1] << " " << cmd[2] << ": " << err;
        }
        a_.root = orlotest::MakeTempDir("orlo-hostA");
        b_.root = orlotest::MakeTempDir("orlo-hostB");
        StartEngine(&a_);
        StartEngine(&b_);
    }

    void TearDown() override {
        for (pid_t p : helpers_)
            if (WaitExit(p, 0) < 0) {
                kill(p, SIGKILL);
                WaitExit(p, 5000);
            }
        for (Host *h : {&a_, &b_}) {
            if (h->engine > 0) {
                EXPECT_EQ(StopEngine(h), 0) << Slurp(h->root + "/engine.log");
            }
        }
        if (made_) {
            orlotest::RunProgram({kIp, "netns", "del", a_.ns});
            orlotest::RunProgram({kIp, "netns", "del", b_.ns});
        }
        for (Host *h : {&a_, &b_})
            if (!h->root.empty()) orlotest::RemoveTree(h->root);
    }

    void StartEngine(Host *h) {
        std::string log = h->root + "/engine.log";
        size_t before = Slurp(log).size();
        h->engine = SpawnLogged({kIp, "netns", "exec", h->ns, orlotest::BuiltProgram("orlocommd"), "--root", h->root,
                                 "--foreground", "--verbose"},
                                log);
        for (int i = 0; i < 500; ++i) {
            if (Slurp(log).find("orlocommd: serving", before) != std::string::npos) return;
            usleep(20000);
        }
        FAIL() << "the engine in " << h->ns << " did not start\n" << Slurp(log);
    }

    int StopEngine(Host *h) {
        kill(h->engine, SIGTERM);
        int status = WaitExit(h->engine, 20000);
        if (status < 0) {
            kill(h->engine, SIGKILL);
            status = WaitExit(h->engine, 5000);
        }
        h->engine = -1;
        return status;
    }

    std::vector<std::string> In(const Host &h, std::vector<std::string> argv) {
        std::vector<std::string> full = {kIp, "netns", "exec", h.ns};
        full.insert(full.end(), argv.begin(), argv.end());
        return full;
    }
    pid_t Serve(const Host &h, const std::string &name, const std::string &log) {
        pid_t p = SpawnLogged(In(h, {orlotest::BuiltProgram("orlocomm-test-peer"), "--root", h.root, "serve", name}),
                              h.root + "/" + log);
        helpers_.push_back(p);
        return p;
    }
    bool AwaitLog(const Host &h, const std::string &file, const std::string &text, int ms) {
        for (int waited = 0; waited <= ms; waited += 20) {
            if (Slurp(h.root + "/" + file).find(text) != std::string::npos) return true;
            usleep(20000);
        }
        return false;
    }
    int Stream(const Host &h, const std::string &to, long count, std::string *out) {
        return orlotest::RunProgram(In(h, {orlotest::BuiltProgram("orlocomm-test-peer"), "--root", h.root, "stream",
                                           to, "echo", std::to_string(count)}),
                                    out);
    }
    // The Pong status orlocomm-cat prints ("0x2022 ..."), or "" when none came.
    std::string Ping(const Host &h, const std::string &host, const std::string &service) {
        std::string out;
        orlotest::RunProgram(In(h, {orlotest::BuiltProgram("orlocomm-cat"), "--root", h.root, "--ping", host, service}),
                             &out);
        return out.substr(0, out.find(' '));
    }

    Host a_, b_;
    std::string nobody_;
    bool made_ = false;
    std::vector<pid_t> helpers_;
};

TEST_F(CommTwoHostTest, TenThousandCheckedMessagesEachWayAndEveryPingAnswer) {
    pid_t echo = Serve(b_, "echo", "echo.log");
    ASSERT_TRUE(AwaitLog(b_, "engine.log", "Adopt echo-", 10000)) << Slurp(b_.root + "/echo.log");
    std::string out;
    int64_t start = orlocomm::NowMs();
    ASSERT_EQ(Stream(a_, b_.addr, 10000, &out), 0) << out << Slurp(a_.root + "/engine.log").substr(0, 20000);
    printf("10000 round trips of 1..4012 bytes across the two hosts in %lld ms\n",
           static_cast<long long>(orlocomm::NowMs() - start));
    EXPECT_EQ(out, "ok 10000\n");
    std::string logA = Slurp(a_.root + "/engine.log"), logB = Slurp(b_.root + "/engine.log");
    EXPECT_NE(logA.find("Connect to " + b_.addr + " Successfully"), std::string::npos);
    EXPECT_NE(logB.find("Connected through local IP: " + b_.addr), std::string::npos);
    EXPECT_NE(logB.find("Connect to " + a_.addr + " Successfully"), std::string::npos);  // and back
    EXPECT_NE(logA.find("RECV 212 opcode 0x12"), std::string::npos);  // the application's RConn

    pid_t local = SpawnLogged(In(a_, {orlotest::BuiltProgram("orlocomm-cat"), "--root", a_.root, "--name", "localsvc"}),
                              a_.root + "/localsvc.log");
    helpers_.push_back(local);
    ASSERT_TRUE(AwaitLog(a_, "engine.log", "Adopt localsvc-", 10000));
    EXPECT_EQ(Ping(a_, "localhost", "localsvc"), "0x1022");
    EXPECT_EQ(Ping(a_, a_.addr, "nothing"), "0x1020");
    EXPECT_EQ(Ping(a_, b_.addr, "echo"), "0x2022");
    EXPECT_EQ(Ping(a_, b_.addr, "nothing"), "0x2020");
    EXPECT_EQ(Ping(b_, a_.addr, "localsvc"), "0x2022");
    EXPECT_EQ(Ping(a_, nobody_, "echo"), "0x2000");  // an address nobody holds

    kill(local, SIGTERM);
    EXPECT_EQ(WaitExit(local, 10000), 0);
    EXPECT_EQ(StopEngine(&b_), 0);
    EXPECT_EQ(WaitExit(echo, 10000), 0);
    EXPECT_NE(Slurp(b_.root + "/echo.log").find("engine gone"), std::string::npos);
}

TEST_F(CommTwoHostTest, AKilledEngineBreaksTheRoutesAndARestartedOneServesAgain) {
    pid_t echo = Serve(b_, "echo", "echo.log");
    ASSERT_TRUE(AwaitLog(b_, "engine.log", "Adopt echo-", 10000));
    std::string progress = a_.root + "/progress";
    pid_t streamer = SpawnLogged(In(a_, {orlotest::BuiltProgram("orlocomm-test-peer"), "--root", a_.root, "stream",
                                         b_.addr, "echo", "100000000", progress}),
                                 a_.root + "/stream.log");
    helpers_.push_back(streamer);
    for (int i = 0; i < 1500 && Slurp(progress).empty(); ++i) usleep(20000);
    ASSERT_FALSE(Slurp(progress).empty()) << Slurp(a_.root + "/stream.log");
    ASSERT_EQ(kill(b_.engine, SIGKILL), 0);
    EXPECT_EQ(WaitExit(b_.engine, 5000), 128 + SIGKILL);
    b_.engine = -1;

    EXPECT_EQ(WaitExit(streamer, 20000), 3) << Slurp(a_.root + "/stream.log");
    std::string out = Slurp(a_.root + "/stream.log");
    EXPECT_NE(out.find("broken route 0 after"), std::string::npos) << out;
    EXPECT_NE(out.find("send after break failed"), std::string::npos) << out;
    std::string logA = Slurp(a_.root + "/engine.log");
    EXPECT_NE(logA.find("Release pRApp echo-"), std::string::npos);
    EXPECT_NE(logA.find("Remove host"), std::string::npos);
    EXPECT_EQ(WaitExit(echo, 10000), 0);  // the service notices its engine went
    EXPECT_EQ(Ping(a_, b_.addr, "echo"), "0x2000");

    // The same root again: a stale pid file and FIFO are no obstacle.
    StartEngine(&b_);
    ASSERT_GT(b_.engine, 0);
    Serve(b_, "echo", "echo2.log");
    ASSERT_TRUE(AwaitLog(b_, "engine.log", "Adopt echo-", 10000));
    ASSERT_EQ(Stream(a_, b_.addr, 200, &out), 0) << out;
    EXPECT_EQ(out, "ok 200\n");
}

}  // namespace
