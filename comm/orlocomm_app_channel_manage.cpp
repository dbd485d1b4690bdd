// Applications and their channels: registering with the engine, connecting to services,
// sending and receiving data and control messages, on the application's side; and the
// engine-side record of a registered application with its response FIFO.
//
// An application reads one FIFO (its response FIFO) that carries everything the engine
// sends it.  What it reads while waiting for something else is kept: data in the data
// queue, control messages in the control queue; route notices (a client bound, a route
// torn down, a peer broken, the engine stopping) change its rules at once.  Readers take
// the app's second mutex around waiting and reading, so two threads never split a frame
// and a waiter never sleeps on a FIFO another thread emptied.
#include <netdb.h>
#include <search.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "comm/orlocomm_internal.h"

using orlocomm::MutexGuard;

namespace {

constexpr int kReadSliceMs = 200;
// A queued notice that a peer broke: the reserved byte marks it, the rule index follows
// the routed message.
constexpr uint8_t kEventMark = 0xEB;

ORLOCOMM_RULE *RuleOf(ORLOCOMM_LINK *l) { return COMM_ENTRY(l, ORLOCOMM_RULE, link); }

bool IsData(int code) { return code == ORLOCOMM_OP_SENDMSG || code == ORLOCOMM_OP_RECVMSG; }

bool EngineGone(ORLOCOMM_APP *app) {
    if (app->engine_pid <= 0) return false;
    return kill(app->engine_pid, 0) != 0 && errno == ESRCH;
}

int Send(ORLOCOMM_APP *app, const void *msg, int len) {
    if (app == nullptr || app->channel == nullptr) return -1;
    return app->channel->transport->send_msg(app->channel, msg, len);
}

// Removes the rules of app that pred selects; each peer loses the reference its rule held.
// The index of the first rule removed, or -1.
template <typename Pred>
int RemovePeerRules(ORLOCOMM_APP *app, Pred pred) {
    std::vector<ORLOCOMM_APP *> peers;
    int first = -1;
    {
        MutexGuard g(&app->queue_mutex);
        for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules;) {
            ORLOCOMM_RULE *r = RuleOf(l);
            l = l->next;
            if (!pred(r)) continue;
            if (first < 0) first = r->index;
            peers.push_back(r->peer);
            orlocomm::LinkRemove(&r->link);
            free(r);
            --app->rule_count;
        }
    }
    for (ORLOCOMM_APP *p : peers) AppFreeOnOneAccess(p);
    return first;
}

bool QueueBounded(ORLOCOMM_APP *app, ORLOCOMM_CMD_PACKET *head, int32_t *count, const void *msg, int len) {
    ORLOCOMM_CMD_PACKET *p = CreateCmdPacket(msg, len);
    if (p == nullptr) return false;
    MutexGuard g(&app->queue_mutex);
    if (*count >= orlocomm::kMaxQueued) {
        // The oldest gives way: an application that never reads cannot make this grow.
        FreeCmdPacket(orlocomm::QueuePopFront(head));
        --*count;
        COMM_ERR("%s: queue full, the oldest message dropped", app->id.uuid);
    }
    orlocomm::QueueAppend(head, p);
    ++*count;
    return true;
}

void QueueEvent(ORLOCOMM_APP *app, const uint8_t *msg, int index) {
    uint8_t ev[orlocomm::kStatusMsgSize];
    memcpy(ev, msg, orlocomm::kRouteMsgSize);
    ev[3] = kEventMark;
    int32_t idx = index;
    memcpy(ev + orlocomm::kRouteMsgSize, &idx, sizeof(idx));
    QueueBounded(app, &app->control_queue, &app->control_count, ev, sizeof(ev));
}

// The host record of this process for an address (the local host, or a remote one made on
// first use); null when it cannot be had.
ORLOCOMM_HOST *HostForAddr(uint32_t ip, const char *name) {
    if (ip == 0 || GetHostTypeBySIP(ip) == ORLOCOMM_HOST_LOCAL) return orlocomm::EnsureLocalHost();
    if (ORLOCOMM_HOST *h = SearchRemoteHostByIPv4(ip)) return h;
    return AddRemoteHost(name != nullptr && name[0] != '\0' ? name : orlocomm::IpText(ip).c_str(), &ip, 1);
}

// Records a client that bound to this (service) app, with a rule to it.
void AddClientRule(ORLOCOMM_APP *app, const ORLOCOMM_ROUTE_MSG *r) {
    ORLOCOMM_HOST *host = HostForAddr(r->src_ip, r->src_host);
    if (host == nullptr) return;
    ORLOCOMM_APP *client = SearchAppInHostByIDExt(host, &r->src_id);
    if (client == nullptr) {
        bool local = host->type == ORLOCOMM_HOST_LOCAL;
        client = local ? CreateLocalAppClient(r->src_id.service_name, r->src_id.owner)
                       : CreateRemoteAppClient(r->src_id.service_name, r->src_id.owner);
        if (client == nullptr) return;
        UpdateAppID(client, &r->src_id);
        if (HostAdoptApp(host, client) != 0) {
            AppFree(client);
            return;
        }
    }
    if (GetRuleIndexByAppServerUUID(app, client->id.uuid) >= 0 || AddAppRouteRule(app, client) < 0)
        AppFreeOnOneAccess(client);
}

int ResolveHost(const char *host, uint32_t *ip) {
    if (Str2Ipv4(host, ip) == 0) return 0;
    struct addrinfo hints;
    memset(&hints, 0, sizeof(hints));
    hints.ai_family = AF_INET;
    struct addrinfo *res = nullptr;
    if (getaddrinfo(host, nullptr, &hints, &res) != 0 || res == nullptr) {
        COMM_ERR("Host %s cannot be resolved", host);
        return -1;
    }
    *ip = reinterpret_cast<struct sockaddr_in *>(res->ai_addr)->sin_addr.s_addr;
    freeaddrinfo(res);
    return 0;
}

struct AnswerMatch {
    int code1;
    int code2;
    const char *src_uuid;
    const char *dst_name;  // service name, or null
    const char *dst_uuid;  // or null
};

int AcceptAnswer(void *ctx, const void *msg, int len) {
    const auto *m = static_cast<const AnswerMatch *>(ctx);
    const auto *b = static_cast<const uint8_t *>(msg);
    if (len < orlocomm::kRouteMsgSize || (b[0] != m->code1 && b[0] != m->code2)) return 0;
    const auto *r = static_cast<const ORLOCOMM_ROUTE_MSG *>(msg);
    if (strncmp(r->src_id.uuid, m->src_uuid, ORLOCOMM_NAME_SIZE - 1) != 0) return 0;
    if (m->dst_name != nullptr && strncmp(r->dst_id.service_name, m->dst_name, ORLOCOMM_NAME_SIZE - 1) != 0) return 0;
    if (m->dst_uuid != nullptr && strncmp(r->dst_id.uuid, m->dst_uuid, ORLOCOMM_NAME_SIZE - 1) != 0) return 0;
    return 1;
}

}  // namespace

namespace orlocomm {

int AppReadOne(ORLOCOMM_APP *app, void *buf, int size, int timeoutMs) {
    if (app == nullptr || app->channel == nullptr) return -1;
    MutexGuard g(&app->queue_mutex2);
    int r = ChannelWaitReadable(app->channel, timeoutMs);
    if (r < 0) return -1;
    if (r == 0) {
        if (timeoutMs > 0 && EngineGone(app)) {
            COMM_ERR("The engine (pid %d) of %s is gone", static_cast<int>(app->engine_pid), app->id.uuid);
            app->stopped = 1;
            return -1;
        }
        return 0;
    }
    return app->channel->transport->recv_msg(app->channel, buf, size);
}

int AppIngest(ORLOCOMM_APP *app, const uint8_t *msg, int len) {
    int code = msg[0];
    if (IsData(code)) return QueueBounded(app, &app->data_queue, &app->data_count, msg, len) ? 0 : -1;
    if (len >= kRouteMsgSize) {
        ORLOCOMM_ROUTE_MSG r;
        memcpy(&r, msg, sizeof(r));
        r.src_id.uuid[ORLOCOMM_NAME_SIZE - 1] = r.dst_id.uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
        r.src_id.service_name[ORLOCOMM_NAME_SIZE - 1] = r.dst_id.service_name[ORLOCOMM_NAME_SIZE - 1] = '\0';
        r.src_host[ORLOCOMM_NAME_SIZE - 1] = r.dst_host[ORLOCOMM_NAME_SIZE - 1] = '\0';
        switch (code) {
            case ORLOCOMM_OP_BAND:
                AddClientRule(app, &r);
                return 0;
            case ORLOCOMM_OP_UBAND:
                RemovePeerRules(app, [&](ORLOCOMM_RULE *x) { return CompareUUID(x->peer->id.uuid, r.src_id.uuid) == 0; });
                return 0;
            case ORLOCOMM_OP_ABROKEN:
            case ORLOCOMM_OP_UBOND: {
                // The peer is the source of ABroken and the destination of a UBond.
                const char *peer = code == ORLOCOMM_OP_ABROKEN ? r.src_id.uuid : r.dst_id.uuid;
                int idx = RemovePeerRules(app, [&](ORLOCOMM_RULE *x) { return CompareUUID(x->peer->id.uuid, peer) == 0; });
                if (idx >= 0) {
                    COMM_INFO("%s: route [%d] to %s is broken", app->id.uuid, idx, peer);
                    QueueEvent(app, msg, idx);
                    return 0;
                }
                break;  // an answer somebody waits for
            }
            case ORLOCOMM_OP_SSTOP:
                COMM_INFO("%s: the engine stops", app->id.uuid);
                app->stopped = 1;
                return 0;
            default:
                break;
        }
    }
    return QueueBounded(app, &app->control_queue, &app->control_count, msg, len) ? 0 : -1;
}

ORLOCOMM_APP *AppPeerFor(const char *host, const char *service, bool *remote) {
    *remote = !IsLocalService(host);
    ORLOCOMM_HOST *h;
    if (*remote) {
        uint32_t ip;
        if (ResolveHost(host, &ip) != 0) return nullptr;
        *remote = GetHostTypeBySIP(ip) != ORLOCOMM_HOST_LOCAL;
        h = HostForAddr(ip, host);
    } else {
        h = EnsureLocalHost();
    }
    if (h == nullptr) return nullptr;
    ORLOCOMM_APP *peer = *remote ? CreateRemoteAppServer(service, 0) : CreateLocalAppServer(service, 0);
    if (peer == nullptr) return nullptr;
    peer->comm_flags |= kCommFlagVirtual;
    if (HostAdoptApp(h, peer) != 0) {
        AppFree(peer);
        return nullptr;
    }
    return peer;
}

void AppReleaseAll(ORLOCOMM_APP *app) {
    if (app == nullptr) return;
    RemovePeerRules(app, [](ORLOCOMM_RULE *) { return true; });
    ReleaseApp(app, 0);
}

}  // namespace orlocomm

extern "C" {

// Engine side: the record of an application that registered, with the channel the engine
// answers it on (its response FIFO, opened for writing).
ORLO_EXPORT ORLOCOMM_APP *CreateEngLocalAppServer(const char *name, int pid) {
    ORLOCOMM_APP *app = CreateLocalAppServer(name, pid);
    if (app == nullptr) return nullptr;
    ORLOCOMM_CHANNEL *ch = orlocomm_pipe_construct(app->id.service_name, pid, ORLOCOMM_SERVER_END, 0);
    if (ch == nullptr || ch->transport->internal_response(ch, nullptr) != 0) {
        if (ch != nullptr) ChannelFree(ch);
        AppFree(app);
        return nullptr;
    }
    // The channel answers to the app's identifier.
    ch->desc->id = app->id;
    if (AddProcessChannel(pChannelSet, ch) != 0) {
        ChannelFree(ch);
        AppFree(app);
        return nullptr;
    }
    COMM_INFO("Add Process Channel %s, %p", ch->desc->id.service_name, static_cast<void *>(ch));
    BindAppChannel(app, ch);
    ChannelPut(ch);
    if (LocalHostAdoptApp(app) != 0 || app->host == nullptr) {
        ReleaseApp(app, 0);
        return nullptr;
    }
    return app;
}

// Application side: the app with its FIFOs to the engine (it writes the engine's request
// FIFO and reads a response FIFO of its own), registered with the engine.
ORLO_EXPORT ORLOCOMM_APP *CreateAppLocalAppServer(const char *name, int pid) {
    ORLOCOMM_APP *app = CreateLocalAppServer(name, pid);
    if (app == nullptr) return nullptr;
    ORLOCOMM_CHANNEL *ch = orlocomm_pipe_construct(app->id.service_name, pid, ORLOCOMM_CLIENT_END, 0);
    ORLOCOMM_CHANNEL *req = orlocomm_pipe_construct("request", ORLOCOMM_OWNER_MSG_SERVER, ORLOCOMM_CLIENT_END,
                                                    ORLOCOMM_PIPE_TYPE_MSG_SERVER);
    bool ok = ch != nullptr && req != nullptr && ch->transport->internal_response(ch, nullptr) == 0 &&
              req->transport->internal_request(req, nullptr) == 0;
    if (ok) {
        // The engine's request FIFO, opened once, becomes this channel's request medium.
        void *medium = req->request;
        req->request = nullptr;
        req->has_request = 0;
        ok = ch->transport->internal_request_media(ch, medium) == 0;
    }
    if (req != nullptr) ChannelFree(req);
    if (ok) {
        ch->desc->id = app->id;
        BindAppChannel(app, ch);
    }
    if (ch != nullptr) ChannelPut(ch);
    ok = ok && LocalHostAdoptApp(app) == 0 && app->host != nullptr && AppRegister2Engine(app) == 0;
    if (!ok) {
        COMM_ERR("Create AppSite %s Fail", app->id.uuid);
        ReleaseApp(app, 0);
        return nullptr;
    }
    return app;
}

ORLO_EXPORT int AppRegister2Engine(ORLOCOMM_APP *app) {
    uint8_t *msg = CreateRegistryMsg(app);
    if (msg == nullptr) return -1;
    int n = AppSendControl(app, msg, orlocomm::kRegisterMsgSize);
    free(msg);
    if (n != orlocomm::kRegisterMsgSize) return -1;
    uint8_t answer[ORLOCOMM_MSG_BUF_SIZE];
    auto accept = [](void *ctx, const void *m, int len) -> int {
        const auto *b = static_cast<const uint8_t *>(m);
        if (b[0] == ORLOCOMM_OP_EXCEPTION) return 1;
        const auto *s = static_cast<const ORLOCOMM_SERVICE_MSG *>(m);
        return len >= orlocomm::kServiceMsgSize && s->opcode == ORLOCOMM_OP_REGISACK &&
               CompareUUID(s->id.uuid, static_cast<const char *>(ctx)) == 0;
    };
    n = AppWaitControl(app, answer, sizeof(answer), accept, app->id.uuid);
    if (n < 0 || answer[0] != ORLOCOMM_OP_REGISACK) {
        COMM_ERR("%s: the engine did not take the registration", app->id.uuid);
        return -1;
    }
    return 0;
}

ORLO_EXPORT int AppSendControl(ORLOCOMM_APP *app, const void *msg, int len) {
    if (app == nullptr || app->channel == nullptr || msg == nullptr || len <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return Send(app, msg, len);
}

ORLO_EXPORT int AppSendBlockingControl(ORLOCOMM_APP *app, const void *msg, int len) {
    return AppSendControl(app, msg, len);
}

ORLO_EXPORT int AppRecvControl(ORLOCOMM_APP *app, void *buf, int size) {
    if (app == nullptr || buf == nullptr || size <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    for (;;) {
        int n = orlocomm::AppReadOne(app, buf, size, kReadSliceMs);
        if (n != 0) return n;
    }
}

ORLO_EXPORT int AppWaitControl(ORLOCOMM_APP *app, void *buf, int size, ORLOCOMM_ACCEPT_FN accept, void *ctx) {
    if (app == nullptr || buf == nullptr || size <= 0 || accept == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    int wait = orlocomm::gControlWaitMs.load();
    int64_t deadline = orlocomm::NowMs() + wait;
    uint8_t msg[ORLOCOMM_MSG_BUF_SIZE];
    for (;;) {
        {
            MutexGuard g(&app->queue_mutex);
            for (ORLOCOMM_CMD_PACKET *p = app->control_queue.next; p != &app->control_queue; p = p->next) {
                if (p->data[3] == kEventMark || !accept(ctx, p->data, static_cast<int>(p->len))) continue;
                remque(p);
                --app->control_count;
                int n = static_cast<int>(p->len) < size ? static_cast<int>(p->len) : size;
                memcpy(buf, p->data, static_cast<size_t>(n));
                FreeCmdPacket(p);
                return n;
            }
        }
        if (app->stopped) return -1;
        if (orlocomm::NowMs() >= deadline) {
            COMM_ERR("%s: no answer within %d ms", app->id.uuid, wait);
            return -1;
        }
        int n = orlocomm::AppReadOne(app, msg, sizeof(msg), kReadSliceMs);
        if (n < 0) return -1;
        if (n == 0) continue;
        if (!IsData(msg[0]) && accept(ctx, msg, n)) {
            int c = n < size ? n : size;
            memcpy(buf, msg, static_cast<size_t>(c));
            return c;
        }
        if (orlocomm::AppIngest(app, msg, n) != 0) return -1;
    }
}

// Takes in whatever already waits on the app's FIFO, so that a broken route is known
// before anything is sent on it.
static void DrainPending(ORLOCOMM_APP *app) {
    // At most once a millisecond: a sender in a tight loop does not pay a poll per message.
    int64_t now = orlocomm::NowMs();
    if (__atomic_load_n(&app->last_drain_ms, __ATOMIC_RELAXED) == now) return;
    __atomic_store_n(&app->last_drain_ms, now, __ATOMIC_RELAXED);
    uint8_t msg[ORLOCOMM_MSG_BUF_SIZE];
    for (int i = 0; i < orlocomm::kMaxQueued; ++i) {
        int n = orlocomm::AppReadOne(app, msg, sizeof(msg), 0);
        if (n <= 0 || orlocomm::AppIngest(app, msg, n) != 0) return;
    }
}

static int SendData(ORLOCOMM_APP *app, const char *from, const char *to, const void *data, int len) {
    uint8_t buf[ORLOCOMM_MSG_BUF_SIZE];
    if (CreateSendDataPacket(buf, from, to, data, len) == nullptr) return -1;
    int total = len + ORLOCOMM_DATA_OFFSET;
    return Send(app, buf, total) == total ? len : -1;
}

ORLO_EXPORT int AppSendMessage(ORLOCOMM_APP *app, int index, const void *data, int len) {
    if (app == nullptr || data == nullptr || len < 0 || len > MAX_DATA_PACKETS) {
        COMM_ERR("Invalid parameter app %p, data %p, len %d", static_cast<void *>(app), data, len);
        return -1;
    }
    if (app->stopped) return -1;
    DrainPending(app);
    char from[ORLOCOMM_NAME_SIZE], to[ORLOCOMM_NAME_SIZE];
    {
        MutexGuard g(&app->queue_mutex);
        ORLOCOMM_RULE *rule = nullptr;
        for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules && rule == nullptr; l = l->next)
            if (RuleOf(l)->index == index) rule = RuleOf(l);
        if (rule == nullptr) {
            COMM_ERR("No such routing info [%d] in %s.", index, app->id.uuid);
            return -1;
        }
        memcpy(from, rule->owner->id.uuid, sizeof(from));
        memcpy(to, rule->peer->id.uuid, sizeof(to));
    }
    return SendData(app, from, to, data, len);
}

ORLO_EXPORT int AppUSendMessage(ORLOCOMM_APP *app, const char *to_uuid, const void *data, int len) {
    if (app == nullptr || to_uuid == nullptr || data == nullptr || len < 0 || len > MAX_DATA_PACKETS) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (app->stopped) return -1;
    DrainPending(app);
    return SendData(app, app->id.uuid, to_uuid, data, len);
}

// The next data message (its whole length), or EnCryptBrokenAppFD(index) when a route
// broke, or -1 when the engine stopped or went away.
ORLO_EXPORT int AppRecvMessage(ORLOCOMM_APP *app, void *buf, int size) { return AppRecvMessageTimed(app, buf, size, -1); }

ORLO_EXPORT int AppRecvMessageTimed(ORLOCOMM_APP *app, void *buf, int size, int timeout_ms) {
    if (app == nullptr || buf == nullptr || size <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    uint8_t msg[ORLOCOMM_MSG_BUF_SIZE];
    int64_t deadline = timeout_ms < 0 ? 0 : orlocomm::NowMs() + timeout_ms;
    for (bool first = true;; first = false) {
        if (!first && timeout_ms >= 0 && orlocomm::NowMs() >= deadline) return 0;
        {
            MutexGuard g(&app->queue_mutex);
            if (app->control_count < 0 || app->data_count < 0)
                COMM_ERR("Warnning, Invalid ccount %d, dcount %d", app->control_count, app->data_count);
            for (ORLOCOMM_CMD_PACKET *p = app->control_queue.next; p != &app->control_queue; p = p->next) {
                if (p->data[3] != kEventMark) continue;
                int32_t idx;
                memcpy(&idx, p->data + orlocomm::kRouteMsgSize, sizeof(idx));
                remque(p);
                --app->control_count;
                FreeCmdPacket(p);
                return EnCryptBrokenAppFD(idx);
            }
            if (ORLOCOMM_CMD_PACKET *p = orlocomm::QueuePopFront(&app->data_queue)) {
                --app->data_count;
                int len = static_cast<int>(p->len);
                int n = len < size ? len : size;
                memcpy(buf, p->data, static_cast<size_t>(n));
                memset(static_cast<uint8_t *>(buf) + n, 0, static_cast<size_t>(size - n));
                FreeCmdPacket(p);
                return len;
            }
        }
        if (app->stopped) return -1;
        int slice = kReadSliceMs;
        if (timeout_ms >= 0) {
            int64_t left = deadline - orlocomm::NowMs();
            slice = left < 0 ? 0 : (left < slice ? static_cast<int>(left) : slice);
        }
        int n = orlocomm::AppReadOne(app, msg, sizeof(msg), slice);
        if (n < 0) return -1;
        if (n == 0) continue;
        if (IsData(msg[0])) {
            int c = n < size ? n : size;
            memcpy(buf, msg, static_cast<size_t>(c));
            memset(static_cast<uint8_t *>(buf) + c, 0, static_cast<size_t>(size - c));
            return n;
        }
        if (orlocomm::AppIngest(app, msg, n) != 0) return -1;
    }
}

// Answers a received data message in its own buffer: sender and receiver swap, the data
// goes in, it is sent, and the original identifiers are written back.  0 once they are
// back, whatever the send gave.
ORLO_EXPORT int AppRetMessage(ORLOCOMM_APP *app, void *msg, const void *data, int len) {
    if (len > MAX_DATA_PACKETS) {
        COMM_ERR("Data length(%d) exceed MAX_DATA_PACKETS(%d)", len, MAX_DATA_PACKETS);
        return -1;
    }
    if (app == nullptr || msg == nullptr || data == nullptr || len < 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    auto *d = static_cast<ORLOCOMM_DATA_MSG *>(msg);
    char from[ORLOCOMM_NAME_SIZE], to[ORLOCOMM_NAME_SIZE];
    ExtractFromUUIDByDataPacket(msg, from);
    ExtractToUUIDByDataPacket(msg, to);
    FillInFromUUID(msg, to);
    FillInToUUID(msg, from);
    d->opcode = ORLOCOMM_OP_SENDMSG;
    d->major = 1;
    d->minor = 1;
    memmove(d->data, data, static_cast<size_t>(len));
    d->length = static_cast<uint32_t>(len);
    Send(app, msg, len + ORLOCOMM_DATA_OFFSET);
    if (FillInFromUUID(msg, from) != 0 || FillInToUUID(msg, to) != 0) {
        COMM_ERR("Fail to restore From To UUID");
        return -1;
    }
    return 0;
}

ORLO_EXPORT int AppGetMessageFromFD(ORLOCOMM_APP *app, const void *msg) {
    if (app == nullptr || msg == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    char from[ORLOCOMM_NAME_SIZE];
    ExtractFromUUIDByDataPacket(msg, from);
    from[ORLOCOMM_NAME_SIZE - 1] = '\0';
    return GetRuleIndexByAppServerUUID(app, from);
}

ORLO_EXPORT int AppConnect(ORLOCOMM_APP *app, const char *host, const char *service) {
    if (app == nullptr || service == nullptr || service[0] == '\0') {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    bool remote = false;
    ORLOCOMM_APP *peer = orlocomm::AppPeerFor(host, service, &remote);
    if (peer == nullptr) return -1;
    if (remote) {
        uint8_t *rconn = CreateRConnectV4Msg(app->host, peer->host);
        if (rconn == nullptr) {
            ReleaseApp(peer, 1);
            return -1;
        }
        reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(rconn)->src_id = app->id;
        COMM_INFO("############### %s Send RConnect to %s@%s", app->id.uuid, service, host);
        int n = Send(app, rconn, orlocomm::kRouteMsgSize);
        free(rconn);
        if (n != orlocomm::kRouteMsgSize) {
            ReleaseApp(peer, 1);
            return -1;
        }
        sleep(orlocomm::kRConnectSleepSec);
        uint8_t ack[ORLOCOMM_MSG_BUF_SIZE];
        AnswerMatch m{ORLOCOMM_OP_RCONNACK, ORLOCOMM_OP_RCONNACK, app->id.uuid, nullptr, nullptr};
        if (AppWaitControl(app, ack, sizeof(ack), AcceptAnswer, &m) < orlocomm::kStatusMsgSize ||
            reinterpret_cast<ORLOCOMM_STATUS_MSG *>(ack)->status != ORLOCOMM_CONNACK_ACCEPTED) {
            COMM_ERR("%s: host %s cannot be reached", app->id.uuid, host);
            ReleaseApp(peer, 1);
            return -1;
        }
    }
    uint8_t *bind = CreateBindServiceMsg(app, peer);
    int n = bind == nullptr ? -1 : Send(app, bind, orlocomm::kRouteMsgSize);
    free(bind);
    uint8_t answer[ORLOCOMM_MSG_BUF_SIZE];
    AnswerMatch m{ORLOCOMM_OP_BOND, ORLOCOMM_OP_EXCEPTION, app->id.uuid, peer->id.service_name, nullptr};
    if (n != orlocomm::kRouteMsgSize || AppWaitControl(app, answer, sizeof(answer), AcceptAnswer, &m) < 0 ||
        answer[0] != ORLOCOMM_OP_BOND) {
        COMM_ERR("%s: %s@%s refused the connection", app->id.uuid, service, host == nullptr ? "" : host);
        ReleaseApp(peer, 1);
        return -1;
    }
    ServiceID real = reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(answer)->dst_id;
    real.service_name[ORLOCOMM_NAME_SIZE - 1] = real.uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
    // A service this process already talks to keeps one record.
    if (ORLOCOMM_APP *known = SearchAppInHostByIDExt(peer->host, &real)) {
        ReleaseApp(peer, 1);
        peer = known;
    } else {
        UpdateAppID(peer, &real);
    }
    int index = AddAppRouteRule(app, peer);
    if (index < 0) AppFreeOnOneAccess(peer);
    return index;
}

// The route index of a connection of app to service on host, -1 when there is none.
ORLO_EXPORT int AppIsConnect(ORLOCOMM_APP *app, const char *host, const char *service) {
    if (app == nullptr || service == nullptr) return -1;
    bool remote = !IsLocalService(host);
    uint32_t ip = 0;
    if (remote && ResolveHost(host, &ip) != 0) return -1;
    MutexGuard g(&app->queue_mutex);
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules; l = l->next) {
        ORLOCOMM_RULE *r = RuleOf(l);
        if (strncmp(r->peer->id.service_name, service, ORLOCOMM_NAME_SIZE - 1) != 0) continue;
        ORLOCOMM_HOST *h = r->peer->host;
        bool peer_remote = h != nullptr && h->type == ORLOCOMM_HOST_REMOTE;
        if (peer_remote != remote) continue;
        if (remote) {
            MutexGuard gh(&h->mutex);
            bool has = false;
            for (int i = 0; i < h->ip_count; ++i) has = has || h->ips[i] == ip;
            if (!has) continue;
        }
        return r->index;
    }
    return -1;
}

ORLO_EXPORT int AppDisconnect(ORLOCOMM_APP *app, int index) {
    if (app == nullptr || index < 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    ORLOCOMM_APP *peer = GetToAppByRule(app, index);
    if (peer == nullptr) {
        COMM_ERR("No such routing info [%d] in %s.", index, app->id.uuid);
        return -1;
    }
    char peer_uuid[ORLOCOMM_NAME_SIZE];
    memcpy(peer_uuid, peer->id.uuid, sizeof(peer_uuid));
    uint8_t *ubind = CreateUBindServiceMsg(app, peer);
    int n = ubind == nullptr ? -1 : Send(app, ubind, orlocomm::kRouteMsgSize);
    free(ubind);
    if (n == orlocomm::kRouteMsgSize) {
        uint8_t answer[ORLOCOMM_MSG_BUF_SIZE];
        AnswerMatch m{ORLOCOMM_OP_UBOND, ORLOCOMM_OP_EXCEPTION, app->id.uuid, nullptr, peer_uuid};
        if (AppWaitControl(app, answer, sizeof(answer), AcceptAnswer, &m) < 0)
            COMM_ERR("%s: no confirmation of the end of route [%d]", app->id.uuid, index);
    }
    RemovePeerRules(app, [&](ORLOCOMM_RULE *r) { return r->index == index; });
    return 0;
}

ORLO_EXPORT uint32_t AppGetAppIp(ORLOCOMM_APP *app, const char *uuid) {
    uint8_t *msg = CreateGetAppIpMsg(app, uuid);
    if (msg == nullptr) return 0;
    int n = AppSendControl(app, msg, orlocomm::kGetAppIPMsgSize);
    free(msg);
    if (n != orlocomm::kGetAppIPMsgSize) return 0;
    uint8_t answer[ORLOCOMM_MSG_BUF_SIZE];
    auto accept = [](void *, const void *m, int len) -> int {
        return len >= orlocomm::kGetAppIPAckMsgSize && static_cast<const uint8_t *>(m)[0] == ORLOCOMM_OP_GETAPPIPACK;
    };
    if (AppWaitControl(app, answer, sizeof(answer), accept, nullptr) < orlocomm::kGetAppIPAckMsgSize) return 0;
    const auto *a = reinterpret_cast<const ORLOCOMM_GETAPPIPACK_MSG *>(answer);
    return a->found ? a->ip : 0;
}

ORLO_EXPORT int AppPing(ORLOCOMM_APP *app, const char *host, const char *service, int *status) {
    if (app == nullptr || service == nullptr || service[0] == '\0' || status == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    bool remote = false;
    ORLOCOMM_APP *target = orlocomm::AppPeerFor(host, service, &remote);
    if (target == nullptr) return -1;
    uint8_t *ping = CreatePingServiceMsg(app, target);
    int n = ping == nullptr ? -1 : Send(app, ping, orlocomm::kStatusMsgSize);
    free(ping);
    int r = -1;
    if (n == orlocomm::kStatusMsgSize) {
        uint8_t answer[ORLOCOMM_MSG_BUF_SIZE];
        AnswerMatch m{ORLOCOMM_OP_PONG, ORLOCOMM_OP_PONG, app->id.uuid, target->id.service_name, nullptr};
        if (AppWaitControl(app, answer, sizeof(answer), AcceptAnswer, &m) >= orlocomm::kStatusMsgSize) {
            *status = reinterpret_cast<ORLOCOMM_STATUS_MSG *>(answer)->status;
            r = 0;
        }
    }
    ReleaseApp(target, 1);
    return r;
}

}  // extern "C"
