// Applications, route rules, hosts, the channel set and the pipe and socket transports,
// exercised in one process without an engine.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "comm/orlocomm_internal.h"
#include "orlocomm.h"
#include "support/sandbox.h"

namespace {

int CountLines(const orlotest::LogCapture &log, const std::string &text) {
    int n = 0;
    for (const std::string &l : log.Lines()) n += l.find(text) != std::string::npos;
    return n;
}

uint32_t Ip(const char *text) {
    uint32_t v = 0;
    EXPECT_EQ(Str2Ipv4(text, &v), 0) << text;
    return v;
}

TEST(CommApp, AFreedAppThatIsStillHeldGoesAtTheLastPut) {
    orlotest::LogCapture log;
    ASSERT_NE(orlocomm::EnsureLocalHost(), nullptr);
    ORLOCOMM_APP *app = CreateLocalAppServer("held", 4242);
    ASSERT_NE(app, nullptr);
    EXPECT_TRUE(log.Contains("orlocomm: Create App held, pid 4242"));
    EXPECT_STREQ(app->id.uuid, "held-4242");
    ASSERT_EQ(LocalHostAdoptApp(app), 0);
    EXPECT_TRUE(log.Contains("Adopt held-4242 by "));

    // A second record with the same identifier is not adopted: the set stays as it was.
    ORLOCOMM_HOST *local = SearchLocalHost(nullptr);
    int before = local->app_count;
    ORLOCOMM_APP *dup = CreateLocalAppServer("held", 4242);
    EXPECT_EQ(LocalHostAdoptApp(dup), 0);
    EXPECT_EQ(dup->host, nullptr);
    EXPECT_EQ(local->app_count, before);
    EXPECT_TRUE(log.Contains("APP service_name held, pid 4242, uuid held-4242 exist"));
    AppFree(dup);

    ORLOCOMM_APP *found = SearchAppInLocalHostSetByName("held");
    ASSERT_EQ(found, app);
    EXPECT_EQ(GetAppRefCount(app), 2);
    log.Clear();
    AppFree(app);
    EXPECT_TRUE(log.Contains("held-4242: ref_count 1, to_be_deleted 1")) << log.Dump();
    EXPECT_EQ(CountLines(log, "Release Done"), 0);
    // Marked apps are no longer found, though still held.
    EXPECT_EQ(SearchAppInLocalHostSetByUUID("held-4242"), nullptr);
    EXPECT_EQ(found->host, local);
    AppPut(found);
    EXPECT_TRUE(log.Contains(">>>>>>>>>>>>>>>>> Release held-4242: ref_count 0, to_be_deleted 1")) << log.Dump();
    EXPECT_EQ(CountLines(log, ">>>>>>>>>>>>>>>>> Release Done"), 1);
    EXPECT_EQ(local->app_count, before - 1);

    // An app whose count reaches zero without the mark stays.
    ORLOCOMM_APP *kept = CreateLocalAppServer("kept", 1);
    AppGet(kept);
    AppPut(kept);
    AppPut(kept);
    EXPECT_EQ(GetAppRefCount(kept), 0);
    AppGet(kept);
    AppFreeOnOneAccess(kept);  // the one access left: freed
    EXPECT_EQ(CountLines(log, "Release Done"), 2);
}

TEST(CommRules, IndexesTakeTheSmallestFreeOneUpTo256) {
    orlotest::LogCapture log;
    ORLOCOMM_APP *app = CreateLocalAppServer("router", 1);
    ORLOCOMM_APP *a = CreateRemoteAppServer("peer-a", 2);
    ORLOCOMM_APP *b = CreateRemoteAppServer("peer-b", 3);
    EXPECT_EQ(AddAppRouteRule(app, a), 0);
    EXPECT_EQ(AddAppRouteRule(app, b), 1);
    EXPECT_EQ(AddAppRouteRule(app, a), 2);
    // Two rules to one peer: the later one is the one found.
    EXPECT_EQ(GetRuleIndexByAppServerUUID(app, "peer-a-2"), 2);
    EXPECT_TRUE(log.Contains("################### Search UUID peer-a-2"));
    EXPECT_EQ(GetRuleIndexByAppServerUUID(app, "nobody-1"), -1);
    EXPECT_EQ(GetToAppByRule(app, 1), b);
    EXPECT_EQ(GetFromAppByRule(app, 1), app);
    EXPECT_EQ(GetToAppByRule(app, 9), nullptr);

    EXPECT_EQ(RemoveAppRouteRuleByFD(app, 1), 1);
    EXPECT_EQ(AddAppRouteRule(app, b), 1);  // the hole is filled first
    EXPECT_EQ(RemoveAppRouteRule(app, a), 2);
    EXPECT_EQ(app->rule_count, 1);
    EXPECT_EQ(RemoveAppRouteRuleByID(app, &b->id), 1);
    EXPECT_EQ(app->rule_count, 0);

    for (int i = 0; i < ORLOCOMM_MAX_ROUTE_RULES; ++i) ASSERT_EQ(AddAppRouteRule(app, (i % 2) ? a : b), i);
    EXPECT_EQ(AddAppRouteRule(app, a), -1);
    EXPECT_TRUE(log.Contains("orlocomm: Fail to create routing index"));
    EXPECT_EQ(app->rule_count, 256);
    RemoveAppRouteRuleByFD(app, 200);
    EXPECT_EQ(AddAppRouteRule(app, a), 200);
    AppFree(a);
    AppFree(b);
    AppFree(app);
}

TEST(CommApp, BrokenRouteIndexesAreEncodedAsNegativeNumbers) {
    EXPECT_EQ(EnCryptBrokenAppFD(7), -(256 * 7 + 4));
    EXPECT_EQ(DeCryptBrokenAppFD(EnCryptBrokenAppFD(7)), 7);
    EXPECT_EQ(DeCryptBrokenAppFD(EnCryptBrokenAppFD(0)), 0);
    EXPECT_EQ(DeCryptBrokenAppFD(EnCryptBrokenAppFD(255)), 255);
    EXPECT_EQ(EnCryptBrokenAppFD(-1), -1);
    EXPECT_EQ(DeCryptBrokenAppFD(5), -1);
    EXPECT_EQ(DeCryptBrokenAppFD(0), -1);
    EXPECT_EQ(DeCryptBrokenAppFD(-1), -1);    // a plain failure is no broken route
    EXPECT_EQ(DeCryptBrokenAppFD(-261), -1);  // low byte 5
    EXPECT_EQ(DeCryptBrokenAppFD(INT32_MIN), -1);
}

TEST(CommHosts, TypesRouteKindsAndLocalNames) {
    orlotest::LogCapture log;
    ASSERT_NE(orlocomm::EnsureLocalHost(), nullptr);
    EXPECT_EQ(InitHostSet(), -1);
    ORLOCOMM_HOST *local = SearchLocalHost(nullptr);
    uint32_t lip = GetHostFirstIPV4(local);
    ASSERT_NE(lip, 0u);
    EXPECT_STREQ(GetGlobalHostIP(), orlocomm::IpText(lip).c_str());
    uint32_t ips[2] = {Ip("10.77.0.1"), Ip("10.77.0.2")};
    ORLOCOMM_HOST *remote = AddRemoteHost("far", ips, 2);
    ASSERT_NE(remote, nullptr);
    EXPECT_EQ(AddHostIPv4(remote, ips[0]), 0);  // known already: kept once
    EXPECT_EQ(remote->ip_count, 2);
    EXPECT_EQ(SearchRemoteHost("10.77.0.2"), remote);
    EXPECT_EQ(SearchRemoteHostByHostName("far"), remote);
    EXPECT_EQ(GetRemoteHostFirstIPV4("far"), ips[0]);

    EXPECT_EQ(GetHostTypeBySIP(lip), ORLOCOMM_HOST_LOCAL);
    EXPECT_EQ(GetHostTypeByIP("127.0.0.1"), ORLOCOMM_HOST_LOCAL);
    EXPECT_EQ(GetHostTypeByIP("10.77.0.2"), ORLOCOMM_HOST_REMOTE);
    EXPECT_EQ(GetHostTypeByIP("10.77.0.3"), ORLOCOMM_HOST_UNKNOWN);
    EXPECT_EQ(GetHostTypeByIP("not-an-ip"), ORLOCOMM_HOST_UNKNOWN);
    EXPECT_EQ(GetHostTypeByName(nullptr), ORLOCOMM_HOST_UNKNOWN);
    EXPECT_EQ(GetHostTypeByName("far"), ORLOCOMM_HOST_REMOTE);

    uint32_t unknown = Ip("10.66.0.1");
    EXPECT_EQ(GetRouteKind(lip, nullptr, lip, nullptr), 17);
    EXPECT_EQ(GetRouteKind(lip, nullptr, ips[1], nullptr), 18);
    EXPECT_EQ(GetRouteKind(ips[0], nullptr, lip, nullptr), 33);
    EXPECT_EQ(GetRouteKind(ips[0], nullptr, ips[1], nullptr), 34);
    EXPECT_EQ(GetRouteKind(unknown, nullptr, lip, nullptr), -1);
    // Without an address the host is typed by its name; with one, the name is not used.
    EXPECT_EQ(GetRouteKind(0, local->name, 0, "far"), 18);
    EXPECT_EQ(GetRouteKind(unknown, local->name, lip, nullptr), -1);

    EXPECT_TRUE(IsLocalService(nullptr));
    EXPECT_TRUE(IsLocalService("localhost"));
    EXPECT_TRUE(IsLocalService("127.0.0.5"));
    EXPECT_TRUE(IsLocalService(orlocomm::IpText(lip).c_str()));
    EXPECT_TRUE(IsLocalService(GetGlobalHostName()));
    EXPECT_FALSE(IsLocalService("10.77.0.1"));

    int pid = getrandpid();
    EXPECT_GE(pid, 1 << 22);
    char text[16];
    EXPECT_EQ(Ipv42Str(ips[1], text, sizeof(text)), 0);
    EXPECT_STREQ(text, "10.77.0.2");
    EXPECT_EQ(Ipv42Str(ips[1], text, 5), -1);

    // An app adopted by a host that goes is left without one, not pointing at freed memory.
    ORLOCOMM_APP *app = CreateRemoteAppServer("on-far", 1);
    ASSERT_EQ(RemoteHostAdoptApp(remote, app), 0);
    EXPECT_EQ(SearchAppInRemoteHostSetByName("on-far"), app);
    AppPut(app);
    EXPECT_EQ(RemoveHost(remote), 0);
    EXPECT_EQ(app->host, nullptr);
    EXPECT_EQ(GetHostTypeByIP("10.77.0.2"), ORLOCOMM_HOST_UNKNOWN);
    AppFree(app);
}

// A transport that notes when a channel is destroyed.
int gDestroyed = 0;
void NotingDestruct(ORLOCOMM_CHANNEL *ch) {
    ++gDestroyed;
    orlocomm_base_destruct(ch);
}
ORLOCOMM_TRANSPORT NotingTransport() {
    ORLOCOMM_TRANSPORT t = base_channel_transport;
    t.destruct = NotingDestruct;
    return t;
}

TEST(CommChannels, SetListsLookupsAndReferences) {
    orlotest::LogCapture log;
    ASSERT_EQ(orlocomm::EnsureInit(), 0);
    ORLOCOMM_CHANNEL_SET *set = pChannelSet;
    EXPECT_EQ(InitChannelSet(), -1);
    EXPECT_EQ(pChannelSet, set);
    EXPECT_TRUE(log.Contains("orlocomm: pChannelSet is NOT empty"));

    static ORLOCOMM_TRANSPORT t = NotingTransport();
    gDestroyed = 0;
    ORLOCOMM_CHANNEL *ch = orlocomm_base_construct("proc-one", 31, ORLOCOMM_SERVER_END, &t);
    ASSERT_NE(ch, nullptr);
    EXPECT_STREQ(GetChannelServiceName(ch), "proc-one");
    int processes = set->counts[ORLOCOMM_CH_PROCESS - 1];
    // A channel in no list cannot be removed.
    EXPECT_EQ(RemoveChannel(set, ch), -1);
    EXPECT_EQ(set->counts[ORLOCOMM_CH_PROCESS - 1], processes);
    ASSERT_EQ(AddProcessChannel(set, ch), 0);
    EXPECT_EQ(ch->desc->kind, ORLOCOMM_CH_PROCESS);
    EXPECT_EQ(AddInternalChannel(set, ch), -1);  // one list at a time
    EXPECT_EQ(set->counts[ORLOCOMM_CH_PROCESS - 1], processes + 1);
    EXPECT_EQ(GetInternalChannel(set, "proc-one"), nullptr);
    ORLOCOMM_CHANNEL *byName = GetProcessChannel(set, "proc-one");
    ORLOCOMM_CHANNEL *byUuid = GetProcessChannelByUUID(set, "proc-one-31");
    EXPECT_EQ(byName, ch);
    EXPECT_EQ(byUuid, ch);
    EXPECT_EQ(ch->ref_count, 3);
    EXPECT_EQ(ListProcessChannel(set), processes + 1);
    EXPECT_TRUE(log.Contains("Process channel proc-one"));

    ASSERT_EQ(RemoveChannel(set, ch), 0);
    EXPECT_EQ(ch->desc->kind, 0);
    EXPECT_EQ(GetProcessChannel(set, "proc-one"), nullptr);
    ChannelFree(ch);
    EXPECT_EQ(gDestroyed, 0);  // two lookups still hold it
    ChannelPut(byName);
    EXPECT_EQ(gDestroyed, 0);
    ChannelPut(byUuid);
    EXPECT_EQ(gDestroyed, 1);

    EXPECT_EQ(GetTransportByType(ORLOCOMM_TRANSPORT_PIPE), &pipe_channel_transport);
    EXPECT_EQ(GetTransportByType(ORLOCOMM_TRANSPORT_SOCKET), &socket_channel_transport);
    EXPECT_EQ(GetTransportByType(ORLOCOMM_TRANSPORT_BASE), nullptr);
}

TEST(CommChannels, AHostsOutChannelIsFoundByAnyOfItsAddresses) {
    orlotest::LogCapture log;
    ASSERT_EQ(orlocomm::EnsureInit(), 0);
    uint32_t ips[2] = {Ip("10.88.0.1"), Ip("10.88.0.2")};
    ORLOCOMM_HOST *host = AddRemoteHost("twofaced", ips, 2);
    ASSERT_NE(host, nullptr);
    EXPECT_EQ(GetExternalOutChannelByHostName("twofaced"), nullptr);
    ORLOCOMM_CHANNEL *ch = orlocomm_base_construct("SRqSn_10.88.0.2", 0, ORLOCOMM_CLIENT_END, nullptr);
    ASSERT_EQ(AddExternalOutChannel(pChannelSet, ch), 0);
    ORLOCOMM_CHANNEL *found = GetExternalOutChannelByHostName("twofaced");
    EXPECT_EQ(found, ch);
    EXPECT_TRUE(log.Contains("^^^^^ Found SRqSn_10.88.0.2 is 10.88.0.2")) << log.Dump();
    EXPECT_EQ(GetExternalOutChannelByHostName("nobody"), nullptr);
    EXPECT_EQ(GetExternalInChannelByIPV4(ips[0]), nullptr);
    EXPECT_TRUE(log.Contains("SRqRx_10.88.0.1 Not Found"));
    ChannelPut(found);
    RemoveChannel(pChannelSet, ch);
    ChannelFree(ch);
    RemoveHost(host);
}

TEST(CommSocket, LivenessFollowsTheLastFramesBothWays) {
    orlotest::LogCapture log;
    ORLOCOMM_CHANNEL *ch = orlocomm_socket_construct("SRqSn_10.1.1.1", 0, ORLOCOMM_CLIENT_END, 0);
    auto *s = static_cast<ORLOCOMM_SOCKET *>(calloc(1, sizeof(ORLOCOMM_SOCKET)));
    s->sock_fd = s->conn_fd = -1;
    ASSERT_EQ(orlocomm_socket_internal_request_media(ch, s), 0);
    time_t now = time(nullptr);
    s->last_send = now - 5;
    s->last_recv = now - 60;
    EXPECT_EQ(IsSocketAlive(ch), 1);
    EXPECT_TRUE(log.Contains("SRqSn_10.1.1.1 UPDATED"));
    s->last_send = now - 11;
    s->last_recv = now - 11;
    EXPECT_EQ(IsSocketAlive(ch), 0);
    EXPECT_TRUE(log.Contains("SRqSn_10.1.1.1 ISN'T UPDATED"));
    s->last_recv = now;
    EXPECT_EQ(IsSocketAlive(ch), 1);
    // A frame whose code the engine does not know is never sent.
    uint8_t *frame = nullptr;
    uint8_t bad[4] = {0x22, 1, 1, 0};
    int n = CreatePacket(&frame, bad, 4);
    EXPECT_EQ(orlocomm_socket_write(s, frame, n), -1);
    EXPECT_TRUE(log.Contains("invalid opcode: 0X22"));
    free(frame);
    ChannelFree(ch);
}

class CommPipeTest : public orlotest::SandboxTest {};

TEST_F(CommPipeTest, FramesCrossAFifoAndANestedChannelSendsThroughItsBase) {
    ORLOCOMM_CHANNEL *server = orlocomm_pipe_construct("srv", 77, ORLOCOMM_SERVER_END, 0);
    ASSERT_EQ(server->transport->internal_request(server, nullptr), 0);
    struct stat st;
    ASSERT_EQ(lstat(Real("/tmp/orlocomm_pipe_req_77").c_str(), &st), 0);
    EXPECT_TRUE(S_ISFIFO(st.st_mode));
    EXPECT_EQ(st.st_mode & 07777, 0620u);
    EXPECT_TRUE(log_.Contains("SERVER_END request_channel, name=/tmp/orlocomm_pipe_req_77")) << log_.Dump();

    ORLOCOMM_CHANNEL *client = orlocomm_pipe_construct("cli", 77, ORLOCOMM_CLIENT_END, 0);
    ASSERT_EQ(client->transport->internal_request(client, nullptr), 0);
    EXPECT_TRUE(log_.Contains("Client /tmp/orlocomm_pipe_req_77 open success"));
    ORLOCOMM_CHANNEL *outer = orlocomm_base_construct("outer", 5, ORLOCOMM_CLIENT_END, nullptr);
    outer->base = client;
    ChannelGet(client);

    uint8_t msg[300];
    for (int i = 0; i < 300; ++i) msg[i] = static_cast<uint8_t>(i);
    msg[0] = ORLOCOMM_OP_BIND;
    EXPECT_EQ(outer->transport->send_msg(outer, msg, 212), 212);
    EXPECT_EQ(client->transport->send_msg(client, msg, 300), 300);
    uint8_t got[4096];
    EXPECT_EQ(server->transport->recv_msg(server, got, sizeof(got)), 212);
    EXPECT_EQ(memcmp(got, msg, 212), 0);
    EXPECT_EQ(server->transport->recv_msg(server, got, sizeof(got)), 300);
    EXPECT_EQ(memcmp(got, msg, 300), 0);

    // A truncated frame on a private FIFO fails the channel after the frame time-out.
    static_cast<ORLOCOMM_PIPE *>(server->request)->read_timeout_ms = 100;
    uint8_t *frame = nullptr;
    int n = CreatePacket(&frame, msg, 100);
    ASSERT_EQ(write(static_cast<ORLOCOMM_PIPE *>(client->request)->write_fd, frame, 60), 60);
    free(frame);
    EXPECT_EQ(server->transport->recv_msg(server, got, sizeof(got)), -1);
    EXPECT_EQ(server->failed, 1);
    EXPECT_TRUE(log_.Contains("Not complete packet(s) request 100, read 28")) << log_.Dump();
    (void)n;

    ChannelFree(outer);
    ChannelFree(client);
    EXPECT_TRUE(Exists("/tmp/orlocomm_pipe_req_77"));  // the writer never removes it
    ChannelFree(server);
    EXPECT_FALSE(Exists("/tmp/orlocomm_pipe_req_77"));
    EXPECT_TRUE(log_.Contains(">>>>>>>>>>>>>>>>>>>>> unlink /tmp/orlocomm_pipe_req_77"));

    // Without a reader a client end does not open; a plain file is no FIFO.
    ORLOCOMM_CHANNEL *lonely = orlocomm_pipe_construct("lonely", 78, ORLOCOMM_CLIENT_END, 0);
    EXPECT_EQ(lonely->transport->internal_request(lonely, nullptr), -1);
    EXPECT_TRUE(log_.Contains("Client /tmp/orlocomm_pipe_req_78 open fail"));
    WriteFile("/tmp/orlocomm_pipe_req_79", "not a fifo");
    ORLOCOMM_CHANNEL *fake = orlocomm_pipe_construct("fake", 79, ORLOCOMM_SERVER_END, 0);
    EXPECT_EQ(fake->transport->internal_request(fake, nullptr), -1);
    EXPECT_TRUE(log_.Contains("/tmp/orlocomm_pipe_req_79 is not a FIFO"));
    EXPECT_EQ(ReadFile("/tmp/orlocomm_pipe_req_79"), "not a fifo");
    ChannelFree(lonely);
    ChannelFree(fake);
}

TEST_F(CommPipeTest, TheSharedRequestFifoDropsWhatFollowsABadFrameAndReadsOn) {
    ORLOCOMM_CHANNEL *rx = orlocomm_pipe_construct("PRqRx", 0, ORLOCOMM_SERVER_END, ORLOCOMM_PIPE_TYPE_MSG_SERVER);
    ASSERT_EQ(rx->transport->internal_request(rx, nullptr), 0);
    auto *medium = static_cast<ORLOCOMM_PIPE *>(rx->request);
    EXPECT_EQ(medium->shared, 1);
    medium->read_timeout_ms = 100;
    int fd = open(Real(ORLOCOMM_PIPE_SVR_MSG_REQ).c_str(), O_WRONLY);
    ASSERT_GE(fd, 0);
    std::string junk(500, '\x5a');
    ASSERT_EQ(write(fd, junk.data(), junk.size()), 500);
    uint8_t msg[212] = {ORLOCOMM_OP_PING, 1, 1};
    uint8_t *frame = nullptr;
    int n = CreatePacket(&frame, msg, 212);
    std::thread later([&] {
        usleep(200000);
        ssize_t w = write(fd, frame, static_cast<size_t>(n));
        (void)w;
    });
    uint8_t got[4096];
    EXPECT_EQ(rx->transport->recv_msg(rx, got, sizeof(got)), 212);
    EXPECT_EQ(got[0], ORLOCOMM_OP_PING);
    later.join();
    EXPECT_TRUE(log_.Contains("PRqRx: bad frame on /tmp/orlocomm_pipe_svr_msg_req, 468 byte(s) behind it dropped"))
        << log_.Dump();
    EXPECT_EQ(rx->failed, 0);
    // A frame cut short is dropped the same way once its time is up.
    ASSERT_EQ(write(fd, frame, 40), 40);
    std::thread rest([&] {
        usleep(300000);
        ssize_t w = write(fd, frame, static_cast<size_t>(n));
        (void)w;
    });
    EXPECT_EQ(rx->transport->recv_msg(rx, got, sizeof(got)), 212);
    rest.join();
    free(frame);
    close(fd);
    ChannelFree(rx);
}

}  // namespace
