// Frames, message layouts, the command tables and the message builders.
#include <gtest/gtest.h>
#include <search.h>
#include <unistd.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "orlocomm.h"
#include "support/sandbox.h"

namespace {

const uint8_t kMagic[8] = {0x12, 0x18, 0x0D, 0x0E, 0x0B, 0x0E, 0x06, 0x18};

// A medium made of two byte strings: what was written, and what reads return.
struct Mem {
    std::string written;
    std::string input;
    size_t pos = 0;
};
int MemWrite(void *m, const void *buf, int len) {
    static_cast<Mem *>(m)->written.append(static_cast<const char *>(buf), static_cast<size_t>(len));
    return len;
}
int MemRead(void *m, void *buf, int len) {
    Mem *mem = static_cast<Mem *>(m);
    size_t n = std::min(static_cast<size_t>(len), mem->input.size() - mem->pos);
    memcpy(buf, mem->input.data() + mem->pos, n);
    mem->pos += n;
    return static_cast<int>(n);
}

std::string Frame(const std::string &payload, uint32_t announced) {
    std::string f(32, '\0');
    memcpy(&f[0], kMagic, 8);
    memcpy(&f[24], &announced, 4);
    return f + payload;
}

struct Freed {
    void operator()(void *p) const { free(p); }
};
using Msg = std::unique_ptr<uint8_t, Freed>;

TEST(CommLayout, OffsetsAndSizesMatchTheWireTables) {
    EXPECT_EQ(sizeof(ORLOCOMM_FRAME_HEADER), 32u);
    EXPECT_EQ(offsetof(ORLOCOMM_FRAME_HEADER, length), 24u);
    EXPECT_EQ(sizeof(ServiceID), 68u);
    EXPECT_EQ(offsetof(ServiceID, owner), 32u);
    EXPECT_EQ(offsetof(ServiceID, uuid), 36u);
    EXPECT_EQ(sizeof(ORLOCOMM_ROUTE_MSG), 212u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, src_ip), 4u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, src_host), 8u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, dst_ip), 40u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, dst_host), 44u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, src_id), 76u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, src_id) + offsetof(ServiceID, owner), 108u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, src_id) + offsetof(ServiceID, uuid), 112u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, dst_id), 144u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, dst_id) + offsetof(ServiceID, owner), 176u);
    EXPECT_EQ(offsetof(ORLOCOMM_ROUTE_MSG, dst_id) + offsetof(ServiceID, uuid), 180u);
    EXPECT_EQ(sizeof(ORLOCOMM_STATUS_MSG), 216u);
    EXPECT_EQ(offsetof(ORLOCOMM_STATUS_MSG, status), 212u);
    EXPECT_EQ(offsetof(ORLOCOMM_HOSTIPS_MSG, size), 212u);
    EXPECT_EQ(offsetof(ORLOCOMM_HOSTIPS_MSG, count), 216u);
    EXPECT_EQ(offsetof(ORLOCOMM_HOSTIPS_MSG, ips), 220u);
    EXPECT_EQ(sizeof(ORLOCOMM_REGISTER_MSG), 40u);
    EXPECT_EQ(offsetof(ORLOCOMM_REGISTER_MSG, service_name), 4u);
    EXPECT_EQ(offsetof(ORLOCOMM_REGISTER_MSG, owner), 36u);
    EXPECT_EQ(sizeof(ORLOCOMM_SERVICE_MSG), 72u);
    EXPECT_EQ(offsetof(ORLOCOMM_SERVICE_MSG, id) + offsetof(ServiceID, owner), 36u);
    EXPECT_EQ(offsetof(ORLOCOMM_SERVICE_MSG, id) + offsetof(ServiceID, uuid), 40u);
    EXPECT_EQ(sizeof(ORLOCOMM_GETAPPIP_MSG), 68u);
    EXPECT_EQ(offsetof(ORLOCOMM_GETAPPIP_MSG, wanted_uuid), 36u);
    EXPECT_EQ(sizeof(ORLOCOMM_GETAPPIPACK_MSG), 12u);
    EXPECT_EQ(offsetof(ORLOCOMM_GETAPPIPACK_MSG, found), 8u);
    EXPECT_EQ(sizeof(ORLOCOMM_DATA_MSG), 4096u);
    EXPECT_EQ(offsetof(ORLOCOMM_DATA_MSG, to_uuid), 36u);
    EXPECT_EQ(offsetof(ORLOCOMM_DATA_MSG, length), 76u);
    EXPECT_EQ(offsetof(ORLOCOMM_DATA_MSG, data), 84u);
}

TEST(CommTables, CommandTableLookupsAndControlKinds) {
    // The table keeps its order, sizes and the signed 0xFF row.
    std::vector<std::pair<int, int>> rows;
    for (const ORLOCOMM_CMD_PATTERN *p = pCommCmdPatterns; p->name != nullptr; ++p) rows.push_back({p->code, p->size});
    ASSERT_EQ(rows.size(), 25u);
    EXPECT_EQ(rows.front(), std::make_pair(0x10, 212));
    EXPECT_EQ(rows[10], std::make_pair(0x20, 0));
    EXPECT_EQ(rows[19], std::make_pair(0x37, 220));
    EXPECT_EQ(rows.back(), std::make_pair(-1, 212));

    uint8_t m[4] = {0};
    auto name = [&](int code) {
        m[0] = static_cast<uint8_t>(code);
        const char *n = GetCommCmdNameExt(m);
        return std::string(n == nullptr ? "(null)" : n);
    };
    EXPECT_EQ(name(0xFF), "Exception");
    EXPECT_EQ(name(0x22), "(null)");
    EXPECT_EQ(name(0x14), "Register");
    EXPECT_EQ(name(0x01), "ABroken");
    EXPECT_EQ(GetCommCmdNameExt(nullptr), nullptr);

    auto control = [&](int code) {
        m[0] = static_cast<uint8_t>(code);
        return IsControlMsg(m);
    };
    for (int code : {0x10, 0x36, 0x37, 0x01, 0x50, 0xFF, 0x20, 0x21, 0x11, 0x13}) EXPECT_FALSE(control(code)) << code;
    for (int code : {0x14, 0x19, 0x30, 0x35, 0x40, 0x41}) EXPECT_TRUE(control(code)) << code;
    EXPECT_FALSE(IsControlMsg(nullptr));

    // The socket transport accepts exactly the codes of the table.
    EXPECT_TRUE(IsSocketValidOpcode(0xFF));
    EXPECT_TRUE(IsSocketValidOpcode(0x37));
    EXPECT_FALSE(IsSocketValidOpcode(0x22));
    EXPECT_FALSE(IsSocketValidOpcode(0x00));

    // The protocol table names its commands 1..18 in order.
    int code = 0;
    for (const ORLOCOMM_PROT_PATTERN *p = pCmdPatterns; p->name != nullptr; ++p) EXPECT_EQ(p->code, ++code);
    EXPECT_EQ(code, 18);
    EXPECT_STREQ(pCmdPatterns[4].name, "init_snapshot");
}

TEST(CommFrame, PacketWriteFramesThePayloadWhole) {
    Mem mem;
    std::string payload(100, 'x');
    EXPECT_EQ(PacketWrite(&mem, MemWrite, payload.data(), 100), 100);
    ASSERT_EQ(mem.written.size(), 132u);
    EXPECT_EQ(memcmp(mem.written.data(), kMagic, 8), 0);
    EXPECT_EQ(mem.written.substr(8, 16), std::string(16, '\0'));
    uint32_t len;
    memcpy(&len, mem.written.data() + 24, 4);
    EXPECT_EQ(len, 100u);
    EXPECT_EQ(mem.written.substr(28, 4), std::string(4, '\0'));
    EXPECT_EQ(mem.written.substr(32), payload);

    EXPECT_EQ(PacketWrite(&mem, MemWrite, payload.data(), 0), -1);
    EXPECT_EQ(PacketWrite(&mem, nullptr, payload.data(), 10), -1);
    EXPECT_EQ(PacketWrite(nullptr, MemWrite, payload.data(), 10), -1);
    uint8_t *out = nullptr;
    EXPECT_EQ(CreatePacket(&out, "ab", 2), 34);
    free(out);
    EXPECT_EQ(CreatePacket(nullptr, "ab", 2), -1);
}

TEST(CommFrame, PacketReadTakesOneFrameAndRefusesBadOnes) {
    orlotest::LogCapture log;
    char buf[64];
    {
        Mem mem;
        mem.input = Frame("hello", 5) + Frame("next!", 5);
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, sizeof(buf)), 5);
        EXPECT_EQ(std::string(buf, 5), "hello");
        EXPECT_EQ(mem.pos, 37u);  // exactly one frame was taken
    }
    {
        Mem mem;  // larger than the buffer: cut to it
        mem.input = Frame(std::string(100, 'y'), 100);
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, 10), 10);
    }
    {
        Mem mem;  // wrong magic
        std::string f = Frame("hello", 5);
        f[3] ^= 1;
        mem.input = f;
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, sizeof(buf)), 0);
        EXPECT_TRUE(log.Contains("orlocomm: Not match header")) << log.Dump();
    }
    {
        Mem mem;  // a hostile length: refused before anything is allocated or read
        mem.input = Frame("tiny", 0xFFFFFFF0u);
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, sizeof(buf)), 0);
        EXPECT_EQ(mem.pos, 32u);
        mem.input = Frame(std::string(4097, 'z'), 4097);
        mem.pos = 0;
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, sizeof(buf)), 0);
        mem.input = Frame(std::string(4096, 'z'), 4096);
        mem.pos = 0;
        std::vector<char> big(4096);
        EXPECT_EQ(PacketRead(&mem, MemRead, big.data(), 4096), 4096);
    }
    {
        Mem mem;  // the peer vanished mid-frame
        mem.input = Frame("abc", 10);
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, sizeof(buf)), 3);
        EXPECT_TRUE(log.Contains("orlocomm: Not complete packet(s) request 10, read 3")) << log.Dump();
    }
    {
        Mem mem;  // a header that never completes
        mem.input = std::string(reinterpret_cast<const char *>(kMagic), 8);
        EXPECT_EQ(PacketRead(&mem, MemRead, buf, sizeof(buf)), 0);
    }
    // Every line is in the engine's own format.
    for (const std::string &l : log.Lines()) EXPECT_NE(l.find(".cpp:"), std::string::npos) << l;
    for (const std::string &l : log.Lines()) EXPECT_EQ(l.back(), '\n') << l;
}

TEST(CommFrame, ExtractPacketRepeatsTheFirstFrame) {
    orlotest::LogCapture log;
    ORLOCOMM_CMD_PACKET queue;
    queue.next = queue.prev = &queue;
    // One packet already queued: new ones go after it.
    ORLOCOMM_CMD_PACKET *first = CreateCmdPacket("old", 3);
    insque(first, &queue);
    std::string buf = Frame("0123456789", 10) + Frame("abcdefghij", 10);
    EXPECT_EQ(ExtractPacket(buf.data(), static_cast<int>(buf.size()), &queue), 2);
    std::vector<std::string> got;
    for (ORLOCOMM_CMD_PACKET *p = queue.next; p != &queue; p = p->next)
        got.push_back(std::string(reinterpret_cast<char *>(p->data), p->len));
    EXPECT_EQ(got, (std::vector<std::string>{"old", "0123456789", "0123456789"}));
    EXPECT_TRUE(log.Contains(">>>>>>>>>> extract 2 packet(s)"));
    while (queue.next != &queue) {
        ORLOCOMM_CMD_PACKET *p = queue.next;
        remque(p);
        FreeCmdPacket(p);
    }
    std::string bad = buf;
    bad[0] = 0;
    EXPECT_EQ(ExtractPacket(bad.data(), static_cast<int>(bad.size()), &queue), -1);
    EXPECT_EQ(ExtractPacket(buf.data(), 0, &queue), -1);
    EXPECT_EQ(ExtractPacket(nullptr, 10, &queue), -1);
    EXPECT_TRUE(log.Contains(">>>>>>>>>> Fail to extract packet, -1"));
    // A frame announcing more than the buffer holds: one copy of what is there, a negative rest.
    std::string shortbuf = Frame("abc", 50);
    EXPECT_EQ(ExtractPacket(shortbuf.data(), static_cast<int>(shortbuf.size()), &queue), 1);
    EXPECT_EQ(queue.next->len, 3u);
    EXPECT_TRUE(log.Contains("Warnning remain -47 bytes")) << log.Dump();
    FreeCmdPacket(queue.next);
    FreeCmdPacket(nullptr);
}

TEST(CommMessage, DataPacketsHoldUpTo4012BytesAndUUIDsMoveInAndOut) {
    orlotest::LogCapture log;
    std::vector<uint8_t> data(4013, 0xAB);
    uint8_t buf[4096];
    memset(buf, 0x77, sizeof(buf));
    ASSERT_EQ(CreateSendDataPacket(buf, "from-1", "to-2", data.data(), 4012), buf);
    const auto *d = reinterpret_cast<const ORLOCOMM_DATA_MSG *>(buf);
    EXPECT_EQ(buf[0], 0x20);
    EXPECT_EQ(buf[1], 1);
    EXPECT_EQ(buf[2], 1);
    EXPECT_EQ(buf[3], 0);
    EXPECT_STREQ(d->from_uuid, "from-1");
    EXPECT_STREQ(d->to_uuid, "to-2");
    EXPECT_EQ(d->length, 4012u);
    EXPECT_EQ(std::vector<uint8_t>(buf + 68, buf + 76), std::vector<uint8_t>(8, 0));
    EXPECT_EQ(std::vector<uint8_t>(buf + 80, buf + 84), std::vector<uint8_t>(4, 0));
    EXPECT_EQ(memcmp(buf + 84, data.data(), 4012), 0);

    EXPECT_EQ(CreateSendDataPacket(buf, "a", "b", data.data(), 4013), nullptr);
    EXPECT_EQ(CreateRecvDataPacket(nullptr, "a", "b", nullptr, 1), nullptr);
    EXPECT_EQ(CreateRecvDataPacket(nullptr, nullptr, "b", data.data(), 1), nullptr);
    EXPECT_TRUE(log.Contains("orlocomm: Invalid parameter"));

    Msg fresh(CreateRecvDataPacket(nullptr, "x-1", "y-2", "hi", 2));
    ASSERT_NE(fresh, nullptr);
    EXPECT_EQ(fresh.get()[0], 0x21);
    char uuid[32];
    EXPECT_EQ(ExtractFromUUIDByDataPacket(fresh.get(), uuid), 0);
    EXPECT_STREQ(uuid, "x-1");
    EXPECT_EQ(ExtractToUUIDByDataPacket(fresh.get(), uuid), 0);
    EXPECT_STREQ(uuid, "y-2");
    char other[32] = "other-9";
    EXPECT_EQ(FillInFromUUID(fresh.get(), other), 0);
    EXPECT_EQ(FillInToUUID(fresh.get(), "x-1\0padding.........................."), 0);
    ExtractFromUUIDByDataPacket(fresh.get(), uuid);
    EXPECT_STREQ(uuid, "other-9");
    EXPECT_EQ(FillInToUUID(nullptr, "a"), -1);
    EXPECT_EQ(ExtractToUUIDByDataPacket(fresh.get(), nullptr), -1);
}

TEST(CommTypes, ServiceIdentifiersAndComparisons) {
    orlotest::LogCapture log;
    char uuid[32];
    EXPECT_EQ(ServiceUUIDGenerate("backup", 12, uuid, sizeof(uuid)), 0);
    EXPECT_STREQ(uuid, "backup-12");
    EXPECT_EQ(ServiceUUIDGenerate(nullptr, 12, uuid, sizeof(uuid)), -1);
    std::string forty(40, 'n');
    EXPECT_EQ(ServiceUUIDGenerate(forty.c_str(), 7, uuid, sizeof(uuid)), 0);
    EXPECT_EQ(strlen(uuid), 31u);

    ServiceID *id = GenServiceID(forty.c_str(), 7, nullptr);
    ASSERT_NE(id, nullptr);
    EXPECT_EQ(strlen(id->service_name), 31u);
    EXPECT_EQ(id->owner, 7);
    EXPECT_EQ(id->uuid[0], '\0');
    EXPECT_EQ(ServiceIDGenerateUUID(id), 0);
    EXPECT_EQ(std::string(id->uuid), std::string(31, 'n'));  // the owner falls off the end

    ServiceID a = {}, b = {};
    strcpy(a.service_name, "svc");
    a.owner = 3;
    ServiceIDGenerateUUID(&a);
    b = a;
    EXPECT_EQ(CompareSID(&a, &b), 0);
    b.owner = 4;
    EXPECT_EQ(CompareSID(&a, &b), 1);  // same name and UUID, another owner
    b = a;
    strcpy(b.uuid, "svc-4");
    EXPECT_EQ(CompareSID(&a, &b), 1);
    EXPECT_EQ(CompareSID(&a, nullptr), -1);
    EXPECT_EQ(CompareUUID("a-1", "a-1"), 0);
    EXPECT_EQ(CompareUUID("a-1", "a-2"), 1);
    EXPECT_EQ(CompareUUID(nullptr, "a-2"), -1);
    EXPECT_TRUE(log.Contains("orlocomm: Invalid parameter"));
    free(id);
}

TEST(CommBuilders, ControlMessagesCarryTheirFields) {
    orlotest::LogCapture log;
    ORLOCOMM_APP app = {}, peer = {};
    ORLOCOMM_HOST host = {}, other = {};
    pthread_mutex_init(&host.mutex, nullptr);
    pthread_mutex_init(&other.mutex, nullptr);
    strcpy(host.name, "alpha");
    host.ips[0] = 0x0100000A;  // 10.0.0.1
    host.ips[1] = 0x0200000A;
    host.ips[2] = 0x0300000A;
    host.ip_count = 3;
    strcpy(other.name, "beta");
    other.ips[0] = 0x0101A8C0;  // 192.168.1.1
    other.ip_count = 1;
    std::string longname(40, 'q');
    snprintf(app.id.service_name, sizeof(app.id.service_name), "%s", longname.c_str());
    app.id.owner = 12;
    app.host = &host;
    strcpy(peer.id.service_name, "backup");
    peer.id.owner = 12;
    ServiceIDGenerateUUID(&peer.id);
    peer.host = &other;

    Msg reg(CreateRegistryMsg(&app));
    ASSERT_NE(reg, nullptr);
    const auto *r = reinterpret_cast<const ORLOCOMM_REGISTER_MSG *>(reg.get());
    EXPECT_EQ(reg.get()[0], 0x14);
    EXPECT_EQ(strlen(r->service_name), 31u);
    EXPECT_EQ(r->owner, 12);

    Msg ack(CreateRegisAckMsg(&peer));
    const auto *s = reinterpret_cast<const ORLOCOMM_SERVICE_MSG *>(ack.get());
    EXPECT_EQ(ack.get()[0], 0x15);
    EXPECT_STREQ(s->id.uuid, "backup-12");
    EXPECT_EQ(Msg(CreateURegisAckMsg(&peer)).get()[0], 0x17);

    Msg bind(CreateBindServiceMsg(&app, &peer));
    const auto *b = reinterpret_cast<const ORLOCOMM_ROUTE_MSG *>(bind.get());
    EXPECT_EQ(bind.get()[0], 0x30);
    EXPECT_EQ(b->src_ip, 0x0100000Au);
    EXPECT_STREQ(b->src_host, "alpha");
    EXPECT_EQ(b->dst_ip, 0x0101A8C0u);
    EXPECT_STREQ(b->dst_host, "beta");
    EXPECT_STREQ(b->dst_id.uuid, "backup-12");
    EXPECT_EQ(b->dst_id.owner, 12);

    Msg ips(CreateHostNotIPsMsg(&host.ips[0], "alpha", &other.ips[0], "beta", &host));
    const auto *h = reinterpret_cast<const ORLOCOMM_HOSTIPS_MSG *>(ips.get());
    EXPECT_EQ(ips.get()[0], 0x37);
    EXPECT_EQ(h->size, 232u);
    EXPECT_EQ(h->count, 3u);
    EXPECT_EQ(h->ips[2], 0x0300000Au);
    EXPECT_EQ(CreateHostNotIPsMsg(nullptr, nullptr, nullptr, nullptr, nullptr), nullptr);

    Msg ping(CreatePingServiceMsg(&app, &peer));
    EXPECT_EQ(reinterpret_cast<const ORLOCOMM_STATUS_MSG *>(ping.get())->status, 0);
    EXPECT_TRUE(log.Contains("********** opcode 0x40, status = 0x0")) << log.Dump();
    Msg pong(CreatePongServiceMsg(&host.ips[0], "alpha", &app.id, nullptr, "beta", &peer.id, 0x2022));
    EXPECT_EQ(reinterpret_cast<const ORLOCOMM_STATUS_MSG *>(pong.get())->status, 0x2022);
    EXPECT_EQ(reinterpret_cast<const ORLOCOMM_ROUTE_MSG *>(pong.get())->dst_ip, 0u);
    EXPECT_TRUE(log.Contains("********** opcode 0x41, status = 0x2022"));

    Msg broken(CreateAppBroken(&other.ips[0], &peer));
    const auto *k = reinterpret_cast<const ORLOCOMM_ROUTE_MSG *>(broken.get());
    EXPECT_EQ(broken.get()[0], 0x01);
    EXPECT_EQ(k->dst_ip, 0x0101A8C0u);
    EXPECT_STREQ(k->dst_id.uuid, "backup-12");
    EXPECT_EQ(k->src_ip, 0u);
    EXPECT_EQ(k->src_id.service_name[0], '\0');

    // A reject keeps the four addresses and two identifiers where they were.
    Msg rej(CreateRejectRouteMsg(bind.get()));
    EXPECT_EQ(rej.get()[0], 0xFF);
    EXPECT_EQ(memcmp(rej.get() + 4, bind.get() + 4, 208), 0);

    Msg stop(CreateServicePipeServerStop());
    EXPECT_EQ(stop.get()[0], 0x50);
    EXPECT_EQ(std::vector<uint8_t>(stop.get() + 3, stop.get() + 212), std::vector<uint8_t>(209, 0));
    Msg ask(CreateGetAppIpMsg(&peer, "wanted-1"));
    EXPECT_STREQ(reinterpret_cast<const ORLOCOMM_GETAPPIP_MSG *>(ask.get())->from_uuid, "backup-12");
    EXPECT_STREQ(reinterpret_cast<const ORLOCOMM_GETAPPIP_MSG *>(ask.get())->wanted_uuid, "wanted-1");
    Msg band(CreateBandServiceMsgEx(nullptr, "alpha", nullptr, &other.ips[0], nullptr, &peer.id));
    const auto *bd = reinterpret_cast<const ORLOCOMM_ROUTE_MSG *>(band.get());
    EXPECT_EQ(band.get()[0], 0x32);
    EXPECT_EQ(bd->src_ip, 0u);
    EXPECT_STREQ(bd->src_host, "alpha");
    EXPECT_EQ(bd->dst_ip, 0x0101A8C0u);
    EXPECT_EQ(bd->dst_host[0], '\0');

    // The diagnostic dump reads the addresses back.
    log.Clear();
    EXPECT_EQ(GetCommCmdDetail(bind.get()), 0);
    EXPECT_TRUE(log.Contains("Bind Msg should be 212 bytes"));
    EXPECT_TRUE(log.Contains("From 10.0.0.1, service_name " + std::string(31, 'q') + ", owner 12"));
    EXPECT_TRUE(log.Contains("To   192.168.1.1, service_name backup, owner 12, uuid backup-12 @host beta"));
    EXPECT_EQ(GetCommCmdDetail(reg.get()), 0);
    EXPECT_TRUE(log.Contains("Register is not a routable Msg with 40 bytes"));
    EXPECT_EQ(GetCommCmdDetail(nullptr), -1);
    pthread_mutex_destroy(&host.mutex);
    pthread_mutex_destroy(&other.mutex);
}

}  // namespace
