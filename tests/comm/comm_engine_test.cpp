// Applications on one host talking through a running engine.
#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "comm_engine_fixture.h"

namespace {

using commtest::CommEngineTest;

const ORLOCOMM_DATA_MSG *AsData(const std::vector<uint8_t> &b) {
    return reinterpret_cast<const ORLOCOMM_DATA_MSG *>(b.data());
}

TEST_F(CommEngineTest, ServicesRegisterConnectAndExchangeThroughTheEngine) {
    PORLOCOMM svc = CreateOrloComm("echo");
    ASSERT_NE(svc, nullptr) << log_.Dump();
    PORLOCOMM cli = CreateOrloComm("client");
    ASSERT_NE(cli, nullptr) << log_.Dump();
    EXPECT_EQ(CountValue(), 2);
    EXPECT_EQ(svc->app->id.owner, getpid());
    EXPECT_NE(cli->app->id.owner, getpid());  // a second app of one process gets a number of its own
    EXPECT_TRUE(log_.Contains("............................. Generate commpid " + std::to_string(cli->app->id.owner)));
    EXPECT_TRUE(Exists("/tmp/orlocomm_pipe_rep_" + std::to_string(getpid())));
    EXPECT_TRUE(EngineLogged("Add Process Channel echo"));

    int idx = OrloCommConnect(cli, "localhost", "echo");
    ASSERT_GE(idx, 0) << log_.Dump() << EngineLog();
    EXPECT_EQ(OrloCommIsConnect(cli, "localhost", "echo"), idx);
    EXPECT_EQ(OrloCommIsConnect(cli, "localhost", "other"), -1);
    EXPECT_EQ(OrloCommConnect(cli, "localhost", "nobody"), -1);
    EXPECT_EQ(OrloCommConnect(nullptr, "localhost", "echo"), -1);

    std::vector<uint8_t> data(MAX_DATA_PACKETS + 1);
    for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i * 7);
    EXPECT_EQ(CommSendMessage(cli, idx, data.data(), MAX_DATA_PACKETS + 1), -1);
    EXPECT_EQ(CommSendMessage(cli, 99, data.data(), 10), -1);
    EXPECT_TRUE(log_.Contains("No such routing info [99] in " + std::string(cli->app->id.uuid) + "."));
    EXPECT_EQ(CommSendMessage(cli, idx, data.data(), MAX_DATA_PACKETS), MAX_DATA_PACKETS);

    PORLOCOMM_EVLP e = CreateOrloCommEvlp();
    ASSERT_NE(e, nullptr);
    EXPECT_EQ(CommGetEvlpDataLen(e), -1);
    EXPECT_EQ(CommGetEvlpData(e), nullptr);
    ASSERT_EQ(CommRecvEvlp(svc, e), MAX_DATA_PACKETS);
    EXPECT_EQ(memcmp(CommGetEvlpData(e), data.data(), MAX_DATA_PACKETS), 0);
    EXPECT_EQ(e->buf[0], ORLOCOMM_OP_RECVMSG);
    // The service learnt of its client when it bound: the sender has a route index.
    int back = CommGetEvlpFD(svc, e);
    EXPECT_GE(back, 0);
    EXPECT_EQ(GetToAppByRule(svc->app, back)->id.owner, cli->app->id.owner);
    EXPECT_EQ(CommRetEvlp(svc, e, "pong", 4), 0);
    char from[32];
    ExtractFromUUIDByDataPacket(e->buf, from);
    EXPECT_STREQ(from, cli->app->id.uuid);  // the envelope keeps its identifiers
    EXPECT_EQ(CommRetEvlp(svc, e, data.data(), MAX_DATA_PACKETS + 1), -1);
    EXPECT_TRUE(log_.Contains("Data length(4013) exceed MAX_DATA_PACKETS(4012)"));

    std::vector<uint8_t> reply(4096);
    int n = CommRecvMessage(cli, reply.data(), 4096);
    EXPECT_EQ(n, ORLOCOMM_DATA_OFFSET + 4);
    EXPECT_EQ(std::string(reinterpret_cast<const char *>(AsData(reply)->data), 4), "pong");
    EXPECT_STREQ(AsData(reply)->from_uuid, svc->app->id.uuid);

    // The service answers by index too, and an unknown receiver gets nothing.
    EXPECT_EQ(CommSendMessage(svc, back, "by-index", 8), 8);
    ASSERT_GT(CommRecvMessage(cli, reply.data(), 4096), 0);
    EXPECT_EQ(std::string(reinterpret_cast<const char *>(AsData(reply)->data), 8), "by-index");
    EXPECT_EQ(CommUSendMessage(cli, "nobody-1", "lost", 4), 4);
    EXPECT_TRUE(AwaitEngineLog("No Routing Rule", 5000)) << EngineLog();
    EXPECT_EQ(AppRecvMessageTimed(svc->app, reply.data(), 4096, 300), 0);

    int status = 0;
    EXPECT_EQ(AppPing(cli->app, "localhost", "echo", &status), 0);
    EXPECT_EQ(status, ORLOCOMM_PONG_LOCAL_FOUND);
    EXPECT_EQ(AppPing(cli->app, "127.0.0.1", "nobody", &status), 0);
    EXPECT_EQ(status, ORLOCOMM_PONG_LOCAL_MISSING);
    EXPECT_EQ(AppGetAppIp(cli->app, svc->app->id.uuid), GetHostFirstIPV4(SearchLocalHost(nullptr)));
    EXPECT_EQ(AppGetAppIp(cli->app, "nobody-1"), 0u);

    // Disconnecting ends the route on both sides.
    EXPECT_EQ(OrloCommDisconnect(cli, idx), 0);
    EXPECT_EQ(OrloCommIsConnect(cli, "localhost", "echo"), -1);
    EXPECT_EQ(CommSendMessage(cli, idx, "x", 1), -1);
    EXPECT_EQ(AppRecvMessageTimed(svc->app, reply.data(), 4096, 300), 0);
    EXPECT_EQ(svc->app->rule_count, 0);
    EXPECT_EQ(OrloCommDisconnect(cli, idx), -1);

    ReleaseOrloCommEvlp(e);
    EXPECT_EQ(DestroyOrloComm(cli), 0);
    EXPECT_EQ(DestroyOrloComm(svc), 0);
    EXPECT_EQ(CountValue(), 0);
    EXPECT_FALSE(Exists("/tmp/orlocomm_pipe_rep_" + std::to_string(getpid())));
    EXPECT_TRUE(AwaitEngineLog(">>>>>>>>>>>>>>>>> Release Done", 5000));
    EXPECT_EQ(DestroyOrloComm(nullptr), -1);
    EXPECT_EQ(CreateOrloComm(nullptr), nullptr);
}

TEST_F(CommEngineTest, AServiceThatLeavesOrDiesBreaksItsClientsRoutes) {
    PORLOCOMM svc = CreateOrloComm("leaving");
    PORLOCOMM cli = CreateOrloComm("staying");
    ASSERT_NE(svc, nullptr);
    ASSERT_NE(cli, nullptr);
    int idx = OrloCommConnect(cli, "localhost", "leaving");
    ASSERT_GE(idx, 0);
    ASSERT_EQ(DestroyOrloComm(svc), 0);
    std::vector<uint8_t> buf(4096);
    int n = CommRecvMessage(cli, buf.data(), 4096);
    EXPECT_EQ(DeCryptBrokenAppFD(n), idx) << n;
    EXPECT_EQ(CommSendMessage(cli, idx, "late", 4), -1);
    ASSERT_EQ(DestroyOrloComm(cli), 0);

    // A process that ends without a word: the engine lets it go when the next app joins.
    pid_t child = fork();
    if (child == 0) {
        PORLOCOMM ghost = CreateOrloComm("ghost");
        _exit(ghost == nullptr ? 1 : 0);
    }
    ASSERT_EQ(commtest::WaitExit(child, 30000), 0);
    EXPECT_TRUE(EngineLogged("Adopt ghost-"));
    EXPECT_EQ(CountValue(), 1);  // the ghost still holds its count
    PORLOCOMM after = CreateOrloComm("after");
    ASSERT_NE(after, nullptr);
    EXPECT_TRUE(AwaitEngineLog("has no reader any more, released", 5000)) << EngineLog();
    int status = 0;
    EXPECT_EQ(AppPing(after->app, "localhost", "ghost", &status), 0);
    EXPECT_EQ(status, ORLOCOMM_PONG_LOCAL_MISSING);
    DestroyOrloComm(after);
    EXPECT_EQ(CountValue(), 1);
}

TEST_F(CommEngineTest, ACleanStopTellsEveryAppAndRemovesTheEngineFiles) {
    PORLOCOMM cli = CreateOrloComm("listener");
    ASSERT_NE(cli, nullptr);
    EXPECT_TRUE(Exists(ORLOCOMM_PIPE_SVR_MSG_REQ));
    EXPECT_TRUE(static_cast<ORLOCOMM_PIPE *>(cli->app->channel->request)->shared);
    EXPECT_EQ(ReadFile(ORLOCOMM_PID_FILE), std::to_string(engine_) + "\n");
    std::atomic<int> got{1};
    std::thread reader([&] {
        std::vector<uint8_t> buf(4096);
        got = CommRecvMessage(cli, buf.data(), 4096);
    });
    usleep(200000);
    EXPECT_EQ(StopEngine(), 0);
    reader.join();
    EXPECT_EQ(got.load(), -1);
    EXPECT_FALSE(Exists(ORLOCOMM_PIPE_SVR_MSG_REQ));
    EXPECT_FALSE(Exists(ORLOCOMM_PID_FILE));
    std::string log = EngineLog();
    for (const char *line : {"Send service stop to PRqRx thread .......", ">>>>> STOP SERVICE",
                             "Stopping the PRqRx thread .......", "PRqRx thread exit.......",
                             "Stopping the SRqLn thread .......", "Broacast opcode [0x50]"})
        EXPECT_NE(log.find(line), std::string::npos) << line << "\n" << log;
    EXPECT_LT(log.find(">>>>> STOP SERVICE"), log.find("PRqRx thread exit......."));
    int64_t start = orlocomm::NowMs();
    EXPECT_EQ(DestroyOrloComm(cli), 0);
    EXPECT_LT(orlocomm::NowMs() - start, 5000);
}

TEST_F(CommEngineTest, InitWaitsTwelveSecondsForAnEngineThatIsNotThere) {
    ASSERT_EQ(StopEngine(), 0);
    ORLOCOMM handle = {nullptr};
    int64_t start = orlocomm::NowMs();
    EXPECT_EQ(InitOrloComm(&handle, "early"), -1);
    int64_t waited = orlocomm::NowMs() - start;
    EXPECT_GE(waited, 11500);
    EXPECT_LT(waited, 20000);
    EXPECT_TRUE(log_.Contains(">>>>>>>>>>>>>>>>>>>>>>> Wait Service /var/run/iscsi_snapshot_comm_core.pid time out"));
    EXPECT_EQ(handle.app, nullptr);
    EXPECT_EQ(InitOrloComm(nullptr, "x"), -1);
}

TEST_F(CommEngineTest, ConnectingToAHostThatNeverAnswersGivesUpAfterTenSeconds) {
    // Packets to 10.55.0.2 leave by a veth without ARP whose other end holds no address:
    // they vanish, with neither an answer nor an error.
    for (const std::vector<std::string> &cmd : std::vector<std::vector<std::string>>{
             {"/usr/sbin/ip", "link", "add", "ocx0", "type", "veth", "peer", "name", "ocx1"},
             {"/usr/sbin/ip", "addr", "add", "10.55.0.1/24", "dev", "ocx0"},
             {"/usr/sbin/ip", "link", "set", "ocx0", "arp", "off"},
             {"/usr/sbin/ip", "link", "set", "ocx0", "up"},
             {"/usr/sbin/ip", "link", "set", "ocx1", "up"}})
        ASSERT_EQ(orlotest::RunProgram(cmd), 0) << cmd[1];
    PORLOCOMM cli = CreateOrloComm("patient");
    ASSERT_NE(cli, nullptr);
    int status = 0;
    int64_t start = orlocomm::NowMs();
    EXPECT_EQ(AppPing(cli->app, "10.55.0.2", "anything", &status), 0);
    int64_t waited = orlocomm::NowMs() - start;
    EXPECT_EQ(status, ORLOCOMM_PONG_UNREACHABLE);
    EXPECT_GE(waited, 9500);
    EXPECT_LT(waited, 20000);
    EXPECT_TRUE(EngineLogged("Try to connect ip 10.55.0.2"));
    EXPECT_TRUE(EngineLogged("Connect InProgress"));
    EXPECT_TRUE(EngineLogged("Connect Failed, Timeout or 110 - Connection timed out")) << EngineLog();
    EXPECT_EQ(DestroyOrloComm(cli), 0);
}

TEST_F(CommEngineTest, TheCountFileAdmitsTwoClientsAndAThirdWaits) {
    PORLOCOMM one = CreateOrloComm("one");
    PORLOCOMM two = CreateOrloComm("two");
    ASSERT_NE(one, nullptr);
    ASSERT_NE(two, nullptr);
    EXPECT_EQ(ReadFile(ORLOCOMM_COUNT_FILE), "local_orlocomm_count=2\n");
    std::atomic<PORLOCOMM> third{nullptr};
    std::atomic<bool> done{false};
    std::thread t([&] {
        third = CreateOrloComm("three");
        done = true;
    });
    usleep(1500000);
    EXPECT_FALSE(done.load());
    EXPECT_EQ(CountValue(), 2);
    ASSERT_EQ(DestroyOrloComm(one), 0);
    for (int i = 0; i < 100 && !done.load(); ++i) usleep(50000);
    EXPECT_TRUE(done.load());
    t.join();
    ASSERT_NE(third.load(), nullptr);
    EXPECT_EQ(CountValue(), 2);
    EXPECT_TRUE(log_.Contains("Increment orlocomm count to 2"));
    EXPECT_TRUE(log_.Contains("Decrease orlocomm count to 1"));
    DestroyOrloComm(third.load());
    DestroyOrloComm(two);
    EXPECT_EQ(CountValue(), 0);
}

}  // namespace
