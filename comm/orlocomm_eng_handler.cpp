// The engine's handlers, one per message it receives, and the dispatch that checks a
// message's version and picks the handler.  A message comes either from the engine's
// request FIFO (a local application wrote it) or from an accepted connection (another
// engine sent it); every handler checks that its message came from where it may come
// from, that it is as long as its layout, and routes by the kind of its source and
// destination hosts.  Decisions are taken under mCommMutex; the messages they produce are
// sent after it is released.
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

using orlocomm::kRouteMsgSize;
using orlocomm::kStatusMsgSize;
using orlocomm::MutexGuard;
using orlocomm::Outbox;

namespace {

bool FromPipe(const ORLOCOMM_CHANNEL *from) { return orlocomm::IsPipeChannel(from); }
bool FromSocket(const ORLOCOMM_CHANNEL *from) {
    return orlocomm::IsSocketChannel(from) && from->registered != nullptr;
}

void Terminate(ServiceID *id) {
    id->service_name[ORLOCOMM_NAME_SIZE - 1] = '\0';
    id->uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
}

// A private copy of a routed (or status) message with every text field terminated.
struct Routed {
    uint8_t raw[kStatusMsgSize];
    ORLOCOMM_ROUTE_MSG *r() { return reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(raw); }
    ORLOCOMM_STATUS_MSG *s() { return reinterpret_cast<ORLOCOMM_STATUS_MSG *>(raw); }
};

bool CopyRouted(Routed *out, const void *msg, int len, int need, const char *what) {
    if (msg == nullptr || len < need) {
        COMM_ERR("%s of %d bytes refused (%d expected)", what, len, need);
        return false;
    }
    memset(out->raw, 0, sizeof(out->raw));
    memcpy(out->raw, msg, static_cast<size_t>(need));
    ORLOCOMM_ROUTE_MSG *r = out->r();
    r->src_host[ORLOCOMM_NAME_SIZE - 1] = '\0';
    r->dst_host[ORLOCOMM_NAME_SIZE - 1] = '\0';
    Terminate(&r->src_id);
    Terminate(&r->dst_id);
    return true;
}

int Kind(Routed *m) { return GetMsgRouteKind(m->raw); }

bool IsLocalAddr(uint32_t ip, const char *name) {
    if (ip != 0) return GetHostTypeBySIP(ip) == ORLOCOMM_HOST_LOCAL;
    return GetHostTypeByName(name) == ORLOCOMM_HOST_LOCAL;
}

// Answers a message that cannot be routed with an Exception carrying its addresses.
void RejectTo(Outbox *out, Routed *m, ORLOCOMM_CHANNEL *from) {
    uint8_t *rej = CreateRejectRouteMsg(m->raw);
    if (rej == nullptr) return;
    if (FromSocket(from)) {
        ORLOCOMM_HOST *host = orlocomm::EngHostOfChannel(from);
        if (host != nullptr) out->AddToHost(GetHostFirstIPV4(host), rej, kRouteMsgSize);
    } else if (ORLOCOMM_APP *x = SearchAppInLocalHostSetByUUID(m->r()->src_id.uuid)) {
        out->AddToApp(x, rej, kRouteMsgSize);
        AppPut(x);
    } else {
        COMM_ERR("Exception for %s has nobody to go to", m->r()->src_id.uuid);
    }
    free(rej);
}

// The copy of m with another code.
void Recode(Routed *dst, Routed *m, int code) {
    memcpy(dst->raw, m->raw, sizeof(dst->raw));
    dst->raw[0] = static_cast<uint8_t>(code);
    dst->raw[1] = 1;
    dst->raw[2] = 1;
}

void AddRulePair(ORLOCOMM_APP *a, ORLOCOMM_APP *b) {
    if (GetRuleIndexByAppServerUUID(a, b->id.uuid) < 0) AddAppRouteRule(a, b);
    if (GetRuleIndexByAppServerUUID(b, a->id.uuid) < 0) AddAppRouteRule(b, a);
}

void RemoveRulePair(ORLOCOMM_APP *a, ORLOCOMM_APP *b) {
    if (a != nullptr && b != nullptr) {
        RemoveAppRouteRule(a, b);
        RemoveAppRouteRule(b, a);
    }
}

// The engine's record of a remote app (found, or made on its host); a reference is taken.
ORLOCOMM_APP *RemoteRecord(const ServiceID *id, ORLOCOMM_HOST *host, bool client) {
    if (ORLOCOMM_APP *app = SearchAppInRemoteHostSetByID(id)) return app;
    if (host == nullptr) return nullptr;
    ORLOCOMM_APP *app = client ? CreateRemoteAppClient(id->service_name, id->owner)
                               : CreateRemoteAppServer(id->service_name, id->owner);
    if (app == nullptr) return nullptr;
    UpdateAppID(app, id);
    if (RemoteHostAdoptApp(host, app) != 0) {
        AppFree(app);
        return nullptr;
    }
    if (ORLOCOMM_CHANNEL *ch = orlocomm::HostOutChannel(host)) {
        BindAppChannel(app, ch);
        ChannelPut(ch);
    }
    AppGet(app);
    return app;
}

ORLOCOMM_HOST *SourceHost(Routed *m, ORLOCOMM_CHANNEL *from) {
    ORLOCOMM_HOST *h = orlocomm::EngHostOfChannel(from);
    return h != nullptr ? h : SearchRemoteHostByIPv4(m->r()->src_ip);
}

// Connects to the destination host of a message from a local app when it is not known yet.
bool EnsureDestination(Routed *m) {
    uint32_t ip = m->r()->dst_ip;
    if (ip == 0 || IsLocalAddr(ip, nullptr)) return false;
    return EngConnectHost(ip) == 0;
}

uint8_t *PongFor(Routed *m, int status) {
    ORLOCOMM_ROUTE_MSG *r = m->r();
    return CreatePongServiceMsg(&r->src_ip, r->src_host, &r->src_id, &r->dst_ip, r->dst_host, &r->dst_id, status);
}

// The uuid of whoever sent a message of the given code from a local app.
const char *RequesterUUID(const uint8_t *msg, int len, char *out) {
    int code = msg[0];
    int off;
    switch (code) {
        case ORLOCOMM_OP_REGISACK:
        case ORLOCOMM_OP_UNREGISTER:
        case ORLOCOMM_OP_UNREGISACK:
            off = 40;
            break;
        case ORLOCOMM_OP_GETAPPIP:
        case ORLOCOMM_OP_SENDMSG:
        case ORLOCOMM_OP_RECVMSG:
            off = 4;
            break;
        default:
            off = 112;  // a routed message's source identifier
    }
    if (len < off + ORLOCOMM_NAME_SIZE) return nullptr;
    memcpy(out, msg + off, ORLOCOMM_NAME_SIZE);
    out[ORLOCOMM_NAME_SIZE - 1] = '\0';
    return out;
}

}  // namespace

extern "C" {

ORLO_EXPORT int IssueRejectMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (msg == nullptr || len <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    uint8_t copy[kRouteMsgSize] = {0};
    memcpy(copy, msg, static_cast<size_t>(len < kRouteMsgSize ? len : kRouteMsgSize));
    uint8_t *rej = CreateRejectRouteMsg(copy);
    if (rej == nullptr) return -1;
    Outbox out;
    int r = 0;
    if (FromSocket(from)) {
        MutexGuard g(&mCommMutex);
        ORLOCOMM_HOST *host = orlocomm::EngHostOfChannel(from);
        if (host == nullptr || !out.AddToHost(GetHostFirstIPV4(host), rej, kRouteMsgSize)) r = -1;
    } else if (copy[0] == ORLOCOMM_OP_REGISTER && len >= orlocomm::kRegisterMsgSize) {
        // A refused registration is answered on the FIFO of the one that asked.
        int owner = reinterpret_cast<const ORLOCOMM_REGISTER_MSG *>(copy)->owner;
        ORLOCOMM_CHANNEL *ch = orlocomm_pipe_construct("Reject", owner, ORLOCOMM_SERVER_END, 0);
        if (owner < 0 || ch == nullptr || ch->transport->internal_response(ch, nullptr) != 0) {
            r = -1;
        } else {
            out.Add(ch, rej, kRouteMsgSize);
        }
        if (ch != nullptr) ChannelFree(ch);
    } else {
        char uuid[ORLOCOMM_NAME_SIZE];
        MutexGuard g(&mCommMutex);
        ORLOCOMM_APP *app = nullptr;
        if (RequesterUUID(copy, len, uuid) != nullptr) app = SearchAppInLocalHostSetByUUID(uuid);
        if (app == nullptr || !out.AddToApp(app, rej, kRouteMsgSize)) r = -1;
        AppPut(app);
    }
    free(rej);
    out.Flush();
    if (r != 0) COMM_ERR("Exception for opcode 0x%x has nobody to go to", copy[0]);
    return r;
}

ORLO_EXPORT int HandleRejectMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "Exception")) return -1;
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        if (kind == ORLOCOMM_ROUTE_LOCAL_LOCAL || kind == ORLOCOMM_ROUTE_LOCAL_REMOTE) {
            if (ORLOCOMM_APP *x = SearchAppInLocalHostSetByUUID(m.r()->src_id.uuid)) {
                if (out.AddToApp(x, m.raw, kRouteMsgSize)) r = 0;
                AppPut(x);
            }
        } else if (kind == ORLOCOMM_ROUTE_REMOTE_LOCAL && FromPipe(from)) {
            if (out.AddToHost(m.r()->src_ip, m.raw, kRouteMsgSize)) r = 0;
        }
        if (r != 0) COMM_ERR("Exception from %s (route %d) dropped", m.r()->src_id.uuid, kind);
    }
    out.Flush();
    return r;
}

// The hand-shake of a new connection: the other engine says who it is; this one registers
// it with the connection as its external-in channel, answers ConnAck and connects back.
ORLO_EXPORT int HandleConnectV4(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (!orlocomm::IsSocketChannel(from) || from->registered != nullptr || from->request == nullptr) {
        COMM_ERR("Conn out of place on %s", from == nullptr ? "(null)" : from->desc->id.service_name);
        return -1;
    }
    ORLOCOMM_HOST *local = orlocomm::EnsureLocalHost();
    uint32_t local_ip = GetHostFirstIPV4(local);
    int status = ORLOCOMM_CONNACK_ACCEPTED;
    Routed m;
    memset(m.raw, 0, sizeof(m.raw));
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "Conn")) status = ORLOCOMM_CONNACK_MALFORMED;
    auto *sock = static_cast<ORLOCOMM_SOCKET *>(from->request);
    uint32_t peer = sock->addr.sin_addr.s_addr;
    uint32_t claimed = m.r()->src_ip;
    bool peer_local = GetHostTypeBySIP(peer) == ORLOCOMM_HOST_LOCAL;
    if (status == ORLOCOMM_CONNACK_ACCEPTED &&
        ((claimed != 0 && GetHostTypeBySIP(claimed) == ORLOCOMM_HOST_LOCAL) || (claimed == 0 && peer_local)))
        status = ORLOCOMM_CONNACK_SELF;
    Outbox out;
    ORLOCOMM_CHANNEL *registered = nullptr;
    uint32_t back = peer_local ? claimed : peer;
    if (status == ORLOCOMM_CONNACK_ACCEPTED) {
        MutexGuard g(&mCommMutex);
        ORLOCOMM_HOST *host = SearchRemoteHostByIPv4(peer);
        if (host == nullptr && claimed != 0) host = SearchRemoteHostByIPv4(claimed);
        if (host != nullptr) {
            // A host that says Conn again while its connection stands has restarted: what
            // this engine knew of it is stale.
            ORLOCOMM_CHANNEL *old = GetExternalInChannelByIPV4(peer);
            if (old != nullptr) {
                COMM_INFO("Host %s connects again: the old connection is dropped", host->name);
                ChannelPut(old);
                orlocomm::EngBreakHost(host, &out);
                host = nullptr;
            }
        }
        uint32_t ips[2];
        int n = 0;
        if (claimed != 0) ips[n++] = claimed;
        if (!peer_local && peer != claimed) ips[n++] = peer;
        if (host == nullptr)
            host = AddRemoteHost(m.r()->src_host[0] != '\0' ? m.r()->src_host : orlocomm::IpText(peer).c_str(), ips, n);
        else
            for (int i = 0; i < n; ++i) AddHostIPv4(host, ips[i]);
        if (host == nullptr) {
            status = ORLOCOMM_CONNACK_FULL;
        } else {
            registered = DupSocketRequestRxChannel(host, ips, n, sock);
            if (registered == nullptr) status = ORLOCOMM_CONNACK_FAILED;
        }
    }
    out.Flush();
    uint8_t *ack = CreateConnAckMsg(m.raw, local_ip, local == nullptr ? "" : local->name, status);
    if (ack != nullptr) {
        from->transport->external_response(from, ack, kStatusMsgSize);
        free(ack);
    }
    if (status != ORLOCOMM_CONNACK_ACCEPTED) {
        COMM_ERR("Conn from %s refused, status %d", orlocomm::IpText(peer).c_str(), status);
        if (registered != nullptr) ChannelPut(registered);
        return -1;
    }
    from->registered = registered;
    COMM_INFO("Host %s (%s) connected", m.r()->src_host, orlocomm::IpText(peer).c_str());
    if (back != 0 && EngConnectHost(back) != 0) COMM_ERR("Fail to connect back to %s", orlocomm::IpText(back).c_str());
    return 0;
}

// A local app asks its engine to connect to another host (the source identifier, when
// given, hears the outcome in an RConnAck).
ORLO_EXPORT int HandleRConnectV4(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!FromPipe(from)) {
        COMM_ERR("RConn only comes from a local app");
        return -1;
    }
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "RConn")) return -1;
    uint32_t ip = m.r()->dst_ip;
    int status = ORLOCOMM_CONNACK_ACCEPTED;
    if (ip == 0)
        status = ORLOCOMM_CONNACK_MALFORMED;
    else if (!IsLocalAddr(ip, nullptr) && EngConnectHost(ip) != 0)
        status = ORLOCOMM_CONNACK_FAILED;
    Outbox out;
    {
        MutexGuard g(&mCommMutex);
        if (ORLOCOMM_APP *x = SearchAppInLocalHostSetByUUID(m.r()->src_id.uuid)) {
            uint8_t *ack = CreateRConnAckMsg(m.raw, status);
            if (ack != nullptr) out.AddToApp(x, ack, kStatusMsgSize);
            free(ack);
            AppPut(x);
        }
    }
    out.Flush();
    return status == ORLOCOMM_CONNACK_ACCEPTED ? 0 : -1;
}

ORLO_EXPORT int HandleHostIPs(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (!FromSocket(from) || msg == nullptr || len < orlocomm::kHostIPsBaseSize) {
        COMM_ERR("HostIPs of %d bytes refused", len);
        return -1;
    }
    const auto *h = static_cast<const ORLOCOMM_HOSTIPS_MSG *>(msg);
    uint32_t count = h->count;
    if (count > ORLOCOMM_MAX_HOST_IPS || h->size != orlocomm::kHostIPsBaseSize + 4 * count ||
        static_cast<uint32_t>(len) < h->size) {
        COMM_ERR("HostIPs says %u addresses in %u bytes, %d came: refused", count, h->size, len);
        return -1;
    }
    MutexGuard g(&mCommMutex);
    ORLOCOMM_HOST *host = orlocomm::EngHostOfChannel(from);
    if (host == nullptr) return -1;
    for (uint32_t i = 0; i < count; ++i) {
        uint32_t ip;
        memcpy(&ip, static_cast<const uint8_t *>(msg) + orlocomm::kHostIPsBaseSize + 4 * i, sizeof(ip));
        // An address this engine knows as another host's, or as its own, is not taken.
        if (ip != 0 && GetHostTypeBySIP(ip) == ORLOCOMM_HOST_UNKNOWN) AddHostIPv4(host, ip);
    }
    ListHostIP(host);
    return 0;
}

ORLO_EXPORT int HandleHostNotify(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!FromSocket(from) || !CopyRouted(&m, msg, len, kRouteMsgSize, "HostNty")) return -1;
    MutexGuard g(&mCommMutex);
    ORLOCOMM_HOST *host = orlocomm::EngHostOfChannel(from);
    if (host == nullptr || m.r()->src_host[0] == '\0') return -1;
    return UpdateHostName(host, m.r()->src_host);
}

ORLO_EXPORT int HandleAppRegister(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (!FromPipe(from) || msg == nullptr || len < orlocomm::kRegisterMsgSize) {
        COMM_ERR("Register of %d bytes refused", len);
        return -1;
    }
    ORLOCOMM_REGISTER_MSG reg;
    memcpy(&reg, msg, sizeof(reg));
    reg.service_name[ORLOCOMM_NAME_SIZE - 1] = '\0';
    if (reg.service_name[0] == '\0' || reg.owner == ORLOCOMM_OWNER_MSG_SERVER || reg.owner == ORLOCOMM_OWNER_CTL_SERVER) {
        COMM_ERR("Register of \"%s\" by %d refused", reg.service_name, reg.owner);
        return -1;
    }
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        orlocomm::EngReapDeadApps(&out);
        ServiceID id;
        memset(&id, 0, sizeof(id));
        orlocomm::CopyName(id.service_name, reg.service_name);
        id.owner = reg.owner;
        ServiceIDGenerateUUID(&id);
        if (ORLOCOMM_APP *old = SearchAppInLocalHostSetByID(&id)) {
            COMM_INFO("%s registers again: the old registration is dropped", id.uuid);
            orlocomm::EngAppGone(old, &out);
            ReleaseApp(old, 0);
            AppPut(old);
        }
        ORLOCOMM_APP *app = CreateEngLocalAppServer(reg.service_name, reg.owner);
        if (app != nullptr) {
            uint8_t *ack = CreateRegisAckMsg(app);
            if (ack != nullptr && out.AddToApp(app, ack, orlocomm::kServiceMsgSize)) r = 0;
            free(ack);
        }
    }
    out.Flush();
    if (r != 0) COMM_ERR("Register %s-%d failed", reg.service_name, reg.owner);
    return r;
}

ORLO_EXPORT int HandleAppURegister(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (!FromPipe(from) || msg == nullptr || len < orlocomm::kServiceMsgSize) {
        COMM_ERR("UnRegister of %d bytes refused", len);
        return -1;
    }
    ORLOCOMM_SERVICE_MSG s;
    memcpy(&s, msg, sizeof(s));
    Terminate(&s.id);
    Outbox out;
    {
        MutexGuard g(&mCommMutex);
        ORLOCOMM_APP *app = SearchAppInLocalHostSetByUUID(s.id.uuid);
        if (app == nullptr) {
            COMM_ERR("App %s is not registered", s.id.uuid);
            return -1;
        }
        uint8_t *ack = CreateURegisAckMsg(app);
        if (ack != nullptr) out.AddToApp(app, ack, orlocomm::kServiceMsgSize);
        free(ack);
        orlocomm::EngAppGone(app, &out);
        ReleaseApp(app, 0);
        AppPut(app);
    }
    out.Flush();
    return 0;
}

ORLO_EXPORT int HandleAppGetAppIp(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (!FromPipe(from) || msg == nullptr || len < orlocomm::kGetAppIPMsgSize) {
        COMM_ERR("GetAppIP of %d bytes refused", len);
        return -1;
    }
    ORLOCOMM_GETAPPIP_MSG q;
    memcpy(&q, msg, sizeof(q));
    q.from_uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
    q.wanted_uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
    Outbox out;
    int r = 0;
    {
        MutexGuard g(&mCommMutex);
        uint32_t ip = 0;
        int found = 0;
        ORLOCOMM_APP *wanted = SearchAppInLocalHostSetByUUID(q.wanted_uuid);
        if (wanted == nullptr) wanted = SearchAppInRemoteHostSetByUUID(q.wanted_uuid);
        if (wanted != nullptr) {
            ORLOCOMM_HOST *h;
            {
                MutexGuard ga(&wanted->mutex);
                h = wanted->host;
            }
            ip = GetHostFirstIPV4(h);
            found = 1;
            AppPut(wanted);
        }
        ORLOCOMM_APP *asker = SearchAppInRemoteHostSetByUUID(q.from_uuid);
        if (asker == nullptr) asker = SearchAppInLocalHostSetByUUID(q.from_uuid);
        if (asker == nullptr) {
            COMM_ERR("from_uuid(%s) is not found", q.from_uuid);
            r = -1;
        } else {
            uint8_t *ack = CreateGetAppIpAckMsg();
            if (ack != nullptr) {
                auto *a = reinterpret_cast<ORLOCOMM_GETAPPIPACK_MSG *>(ack);
                a->ip = ip;
                a->found = found;
                out.AddToApp(asker, ack, orlocomm::kGetAppIPAckMsgSize);
                free(ack);
            }
            AppPut(asker);
        }
    }
    out.Flush();
    return r;
}

ORLO_EXPORT int HandleSendMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (!FromPipe(from)) {
        COMM_ERR("SendMsg only comes from a local app");
        return -1;
    }
    if (msg == nullptr || len < ORLOCOMM_DATA_OFFSET) {
        COMM_ERR("SendMsg of %d bytes refused", len);
        return -1;
    }
    uint8_t buf[ORLOCOMM_MSG_BUF_SIZE];
    memcpy(buf, msg, static_cast<size_t>(len < ORLOCOMM_MSG_BUF_SIZE ? len : ORLOCOMM_MSG_BUF_SIZE));
    auto *d = reinterpret_cast<ORLOCOMM_DATA_MSG *>(buf);
    if (d->length > MAX_DATA_PACKETS || static_cast<int>(d->length) + ORLOCOMM_DATA_OFFSET > len) {
        COMM_ERR("Data length(%u) exceed MAX_DATA_PACKETS(%d) or the %d bytes that came", d->length, MAX_DATA_PACKETS,
                 len);
        return -1;
    }
    d->from_uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
    d->to_uuid[ORLOCOMM_NAME_SIZE - 1] = '\0';
    COMM_INFO("From uuid %s to uuid %s", d->from_uuid, d->to_uuid);
    int total = static_cast<int>(d->length) + ORLOCOMM_DATA_OFFSET;
    buf[0] = ORLOCOMM_OP_RECVMSG;
    buf[1] = 1;
    buf[2] = 1;
    Outbox out;
    int r = 0;
    {
        MutexGuard g(&mCommMutex);
        if (ORLOCOMM_APP *remote = SearchAppInRemoteHostSetByUUID(d->to_uuid)) {
            ORLOCOMM_HOST *host;
            {
                MutexGuard ga(&remote->mutex);
                host = remote->host;
            }
            ORLOCOMM_CHANNEL *ch = orlocomm::HostOutChannel(host);
            if (ch != remote->channel && ch != nullptr) {
                COMM_INFO(">>>>>>>>>>>>>>>>>>>>>>> Update pRApp %s with new %s, %p", remote->id.uuid,
                          ch->desc->id.service_name, static_cast<void *>(ch));
                BindAppChannel(remote, ch);
            }
            if (ch != nullptr) {
                out.Add(ch, buf, total);
                ChannelPut(ch);
            } else {
                COMM_ERR("Remove %s related host %s", remote->id.uuid, host == nullptr ? "(none)" : host->name);
                if (host != nullptr) orlocomm::EngBreakHost(host, &out);
                r = -1;
            }
            AppPut(remote);
        } else if (ORLOCOMM_APP *local = SearchAppInLocalHostSetByUUID(d->to_uuid)) {
            out.AddToApp(local, buf, total);
            AppPut(local);
        } else {
            COMM_ERR("No Routing Rule");
            r = -1;
        }
    }
    out.Flush();
    return r;
}

ORLO_EXPORT int HandleRecvMsg(const void *msg, int len, ORLOCOMM_CHANNEL *) {
    if (msg == nullptr || len < ORLOCOMM_DATA_OFFSET) {
        COMM_ERR("RecvMsg of %d bytes refused", len);
        return -1;
    }
    const auto *d = static_cast<const ORLOCOMM_DATA_MSG *>(msg);
    if (d->length > MAX_DATA_PACKETS || static_cast<int>(d->length) + ORLOCOMM_DATA_OFFSET > len) {
        COMM_ERR("Data length(%u) exceed MAX_DATA_PACKETS(%d) or the %d bytes that came", d->length, MAX_DATA_PACKETS,
                 len);
        return -1;
    }
    char to[ORLOCOMM_NAME_SIZE];
    memcpy(to, d->to_uuid, sizeof(to));
    to[ORLOCOMM_NAME_SIZE - 1] = '\0';
    Outbox out;
    {
        MutexGuard g(&mCommMutex);
        ORLOCOMM_APP *local = SearchAppInLocalHostSetByUUID(to);
        if (local == nullptr) {
            COMM_ERR("No Routing Rule");
            return -1;
        }
        out.AddToApp(local, msg, static_cast<int>(d->length) + ORLOCOMM_DATA_OFFSET);
        AppPut(local);
    }
    out.Flush();
    return 0;
}

ORLO_EXPORT int HandleBindMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "Bind")) return -1;
    if (FromPipe(from) && !IsLocalAddr(m.r()->dst_ip, m.r()->dst_host) && Kind(&m) != ORLOCOMM_ROUTE_LOCAL_REMOTE)
        EnsureDestination(&m);
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        ORLOCOMM_ROUTE_MSG *rm = m.r();
        if (FromPipe(from) && kind == ORLOCOMM_ROUTE_LOCAL_REMOTE) {
            if (out.AddToHost(rm->dst_ip, m.raw, kRouteMsgSize))
                r = 0;
            else
                RejectTo(&out, &m, from);
        } else if ((FromPipe(from) && kind == ORLOCOMM_ROUTE_LOCAL_LOCAL) ||
                   (FromSocket(from) && kind == ORLOCOMM_ROUTE_REMOTE_LOCAL)) {
            ORLOCOMM_APP *service = SearchAppInLocalHostSetByName(rm->dst_id.service_name);
            ORLOCOMM_APP *client = kind == ORLOCOMM_ROUTE_LOCAL_LOCAL
                                       ? SearchAppInLocalHostSetByUUID(rm->src_id.uuid)
                                       : RemoteRecord(&rm->src_id, SourceHost(&m, from), true);
            if (service == nullptr || client == nullptr || service == client) {
                COMM_ERR("Bind %s -> %s: %s", rm->src_id.uuid, rm->dst_id.service_name,
                         client == nullptr ? "no such client" : "no such service");
                RejectTo(&out, &m, from);
                if (client != nullptr && kind == ORLOCOMM_ROUTE_REMOTE_LOCAL) {
                    AppPut(client);
                    orlocomm::EngForgetRemoteAppIfUnused(client);
                    client = nullptr;
                }
            } else {
                AddRulePair(client, service);
                rm->dst_id = service->id;
                Routed bond, band;
                Recode(&bond, &m, ORLOCOMM_OP_BOND);
                Recode(&band, &m, ORLOCOMM_OP_BAND);
                if (kind == ORLOCOMM_ROUTE_LOCAL_LOCAL)
                    out.AddToApp(client, bond.raw, kRouteMsgSize);
                else
                    out.AddToHost(rm->src_ip, bond.raw, kRouteMsgSize);
                out.AddToApp(service, band.raw, kRouteMsgSize);
                r = 0;
            }
            AppPut(service);
            AppPut(client);
        } else {
            COMM_ERR("Bind %s -> %s: route %d refused", rm->src_id.uuid, rm->dst_id.service_name, kind);
            RejectTo(&out, &m, from);
        }
    }
    out.Flush();
    return r;
}

// A remote engine confirms a route its service accepted: this engine records it and hands
// the confirmation to the local client.
ORLO_EXPORT int HandleBondMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "Bond")) return -1;
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        ORLOCOMM_ROUTE_MSG *rm = m.r();
        if (!FromSocket(from) || kind != ORLOCOMM_ROUTE_LOCAL_REMOTE) {
            COMM_ERR("Bond %s -> %s: route %d refused", rm->src_id.uuid, rm->dst_id.uuid, kind);
            return -1;
        }
        ORLOCOMM_APP *client = SearchAppInLocalHostSetByUUID(rm->src_id.uuid);
        ORLOCOMM_HOST *host = SearchRemoteHostByIPv4(rm->dst_ip);
        if (host == nullptr) host = orlocomm::EngHostOfChannel(from);
        ORLOCOMM_APP *service = client == nullptr ? nullptr : RemoteRecord(&rm->dst_id, host, false);
        if (client != nullptr && service != nullptr) {
            AddRulePair(client, service);
            out.AddToApp(client, m.raw, kRouteMsgSize);
            r = 0;
        } else {
            COMM_ERR("Bond %s -> %s has nobody to go to", rm->src_id.uuid, rm->dst_id.uuid);
        }
        AppPut(client);
        AppPut(service);
    }
    out.Flush();
    return r;
}

// A route notice for a local app (its service side): handed over as it is.
ORLO_EXPORT int HandleBandMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "Band")) return -1;
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        bool ok = (FromPipe(from) && kind == ORLOCOMM_ROUTE_LOCAL_LOCAL) ||
                  (FromSocket(from) && kind == ORLOCOMM_ROUTE_REMOTE_LOCAL);
        ORLOCOMM_APP *app = ok ? SearchAppInLocalHostSetByUUID(m.r()->dst_id.uuid) : nullptr;
        if (app != nullptr && out.AddToApp(app, m.raw, kRouteMsgSize)) r = 0;
        if (r != 0) COMM_ERR("Band %s -> %s: route %d refused", m.r()->src_id.uuid, m.r()->dst_id.uuid, kind);
        AppPut(app);
    }
    out.Flush();
    return r;
}

ORLO_EXPORT int HandleUBindMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "UBind")) return -1;
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        ORLOCOMM_ROUTE_MSG *rm = m.r();
        Routed ubond, uband;
        Recode(&ubond, &m, ORLOCOMM_OP_UBOND);
        Recode(&uband, &m, ORLOCOMM_OP_UBAND);
        if (FromPipe(from) && kind == ORLOCOMM_ROUTE_LOCAL_REMOTE) {
            if (out.AddToHost(rm->dst_ip, m.raw, kRouteMsgSize)) {
                r = 0;
            } else {
                // The other host is out of reach: the route ends here.
                ORLOCOMM_APP *client = SearchAppInLocalHostSetByUUID(rm->src_id.uuid);
                ORLOCOMM_APP *service = SearchAppInRemoteHostSetByID(&rm->dst_id);
                RemoveRulePair(client, service);
                if (client != nullptr) out.AddToApp(client, ubond.raw, kRouteMsgSize);
                AppPut(client);
                AppPut(service);
                orlocomm::EngForgetRemoteAppIfUnused(service);
                r = 0;
            }
        } else if ((FromPipe(from) && kind == ORLOCOMM_ROUTE_LOCAL_LOCAL) ||
                   (FromSocket(from) && kind == ORLOCOMM_ROUTE_REMOTE_LOCAL)) {
            ORLOCOMM_APP *service = SearchAppInLocalHostSetByUUID(rm->dst_id.uuid);
            ORLOCOMM_APP *client = kind == ORLOCOMM_ROUTE_LOCAL_LOCAL ? SearchAppInLocalHostSetByUUID(rm->src_id.uuid)
                                                                      : SearchAppInRemoteHostSetByID(&rm->src_id);
            RemoveRulePair(client, service);
            if (service != nullptr) out.AddToApp(service, uband.raw, kRouteMsgSize);
            if (kind == ORLOCOMM_ROUTE_LOCAL_LOCAL) {
                if (client != nullptr) out.AddToApp(client, ubond.raw, kRouteMsgSize);
            } else {
                out.AddToHost(rm->src_ip, ubond.raw, kRouteMsgSize);
            }
            AppPut(service);
            AppPut(client);
            if (kind == ORLOCOMM_ROUTE_REMOTE_LOCAL) orlocomm::EngForgetRemoteAppIfUnused(client);
            r = 0;
        } else {
            COMM_ERR("UBind %s -> %s: route %d refused", rm->src_id.uuid, rm->dst_id.uuid, kind);
            RejectTo(&out, &m, from);
        }
    }
    out.Flush();
    return r;
}

// The end of a route between a local client and a remote service, confirmed (or announced)
// by the service's host.
ORLO_EXPORT int HandleUBondMsg(const void *msg, int len, ORLOCOMM_CHANNEL *) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kRouteMsgSize, "UBond")) return -1;
    Outbox out;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        ORLOCOMM_ROUTE_MSG *rm = m.r();
        if (kind != ORLOCOMM_ROUTE_LOCAL_REMOTE) {
            COMM_ERR("UBond %s -> %s: route %d is not local to remote", rm->src_id.uuid, rm->dst_id.uuid, kind);
            return -1;
        }
        const auto *b = reinterpret_cast<const uint8_t *>(&rm->src_ip);
        COMM_INFO("ip %d.%d.%d.%d is Local Host", b[0], b[1], b[2], b[3]);
        ORLOCOMM_APP *service = SearchAppInHostByIDExt(SearchRemoteHostByIPv4(rm->dst_ip), &rm->dst_id);
        ORLOCOMM_APP *client = SearchAppInLocalHostSetByID(&rm->src_id);
        if (client != nullptr) {
            COMM_INFO("Send UBOND to LocalAppClient - %s", client->id.uuid);
            out.AddToApp(client, m.raw, kRouteMsgSize);
        }
        RemoveRulePair(client, service);
        AppPut(client);
        AppPut(service);
        orlocomm::EngForgetRemoteAppIfUnused(service);
    }
    out.Flush();
    return 0;
}

ORLO_EXPORT int HandleUBandMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    return HandleUBondMsg(msg, len, from);
}

ORLO_EXPORT int HandlePingMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kStatusMsgSize, "Ping")) return -1;
    bool remote_target = FromPipe(from) && !IsLocalAddr(m.r()->dst_ip, m.r()->dst_host);
    bool reached = remote_target && EnsureDestination(&m);
    Outbox out;
    int r = 0;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        ORLOCOMM_ROUTE_MSG *rm = m.r();
        if (FromPipe(from)) {
            ORLOCOMM_APP *sender = SearchAppInLocalHostSetByUUID(rm->src_id.uuid);
            if (sender == nullptr) {
                COMM_ERR("Ping from %s, who is not registered", rm->src_id.uuid);
                return -1;
            }
            uint8_t *pong = nullptr;
            if (!remote_target) {
                ORLOCOMM_APP *target = SearchAppInLocalHostSetByName(rm->dst_id.service_name);
                pong = PongFor(&m, target != nullptr ? ORLOCOMM_PONG_LOCAL_FOUND : ORLOCOMM_PONG_LOCAL_MISSING);
                AppPut(target);
            } else if (!reached || kind != ORLOCOMM_ROUTE_LOCAL_REMOTE ||
                       !out.AddToHost(rm->dst_ip, m.raw, kStatusMsgSize)) {
                pong = PongFor(&m, ORLOCOMM_PONG_UNREACHABLE);
            }
            if (pong != nullptr) out.AddToApp(sender, pong, kStatusMsgSize);
            free(pong);
            AppPut(sender);
        } else if (FromSocket(from) && kind == ORLOCOMM_ROUTE_REMOTE_LOCAL) {
            ORLOCOMM_APP *target = SearchAppInLocalHostSetByName(rm->dst_id.service_name);
            uint8_t *pong = PongFor(&m, target != nullptr ? ORLOCOMM_PONG_REMOTE_FOUND : ORLOCOMM_PONG_REMOTE_MISSING);
            AppPut(target);
            ORLOCOMM_HOST *host = SourceHost(&m, from);
            if (pong != nullptr && host != nullptr) out.AddToHost(GetHostFirstIPV4(host), pong, kStatusMsgSize);
            free(pong);
        } else {
            COMM_ERR("Ping %s -> %s: route %d refused", rm->src_id.uuid, rm->dst_id.service_name, kind);
            r = -1;
        }
    }
    out.Flush();
    return r;
}

ORLO_EXPORT int HandlePongMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    Routed m;
    if (!CopyRouted(&m, msg, len, kStatusMsgSize, "Pong")) return -1;
    Outbox out;
    int r = -1;
    {
        MutexGuard g(&mCommMutex);
        int kind = Kind(&m);
        if (FromSocket(from) && kind == ORLOCOMM_ROUTE_LOCAL_REMOTE) {
            if (ORLOCOMM_APP *sender = SearchAppInLocalHostSetByUUID(m.r()->src_id.uuid)) {
                if (out.AddToApp(sender, m.raw, kStatusMsgSize)) r = 0;
                AppPut(sender);
            }
        }
        if (r != 0) COMM_ERR("Pong for %s (route %d) dropped", m.r()->src_id.uuid, kind);
    }
    out.Flush();
    return r;
}

}  // extern "C"

namespace {

typedef int (*Handler)(const void *, int, ORLOCOMM_CHANNEL *);
struct Dispatch {
    int code;
    Handler handler;
};
const Dispatch kDispatch[] = {
    {ORLOCOMM_OP_EXCEPTION, HandleRejectMsg}, {ORLOCOMM_OP_CONN, HandleConnectV4},
    {ORLOCOMM_OP_RCONN, HandleRConnectV4},    {ORLOCOMM_OP_REGISTER, HandleAppRegister},
    {ORLOCOMM_OP_UNREGISTER, HandleAppURegister}, {ORLOCOMM_OP_GETAPPIP, HandleAppGetAppIp},
    {ORLOCOMM_OP_SENDMSG, HandleSendMsg},     {ORLOCOMM_OP_RECVMSG, HandleRecvMsg},
    {ORLOCOMM_OP_BIND, HandleBindMsg},        {ORLOCOMM_OP_BOND, HandleBondMsg},
    {ORLOCOMM_OP_BAND, HandleBandMsg},        {ORLOCOMM_OP_UBIND, HandleUBindMsg},
    {ORLOCOMM_OP_UBOND, HandleUBondMsg},      {ORLOCOMM_OP_UBAND, HandleUBandMsg},
    {ORLOCOMM_OP_PING, HandlePingMsg},        {ORLOCOMM_OP_PONG, HandlePongMsg},
};

}  // namespace

extern "C" ORLO_EXPORT int EngDispatchMessage(const void *msg, int len, ORLOCOMM_CHANNEL *from) {
    if (msg == nullptr || len < 1) {
        COMM_ERR("Invalid parameter");
        return 0;
    }
    const auto *b = static_cast<const uint8_t *>(msg);
    int code = b[0];
    int major = len > 1 ? b[1] : 0;
    int minor = len > 2 ? b[2] : 0;
    COMM_INFO("RECV %d opcode 0x%x", len, code);
    COMM_INFO(">>>>>>>>>>>>>>>>>>>>>>>>> MAJOR 0x%x MINOR 0x%x", major, minor);
    if (major != ORLOCOMM_MAJOR && code != ORLOCOMM_OP_CONN && code != ORLOCOMM_OP_EXCEPTION) {
        COMM_ERR("Version (0x%x) not compatible", major * 256 + minor);
        IssueRejectMsg(msg, len, from);
        return 0;
    }
    COMM_INFO("Version (0x%x) compatible", major * 256 + minor);
    if (code == ORLOCOMM_OP_SSTOP) {
        COMM_INFO(">>>>> STOP SERVICE");
        // Only the engine itself stops its loop; an SStop from anyone else changes nothing.
        if (orlocomm::IsPipeChannel(from) && orlocomm::gEngStopRequested.load()) return 1;
        COMM_ERR("SStop not asked by this engine, ignored");
        return 0;
    }
    if (code == ORLOCOMM_OP_EXCEPTION) COMM_INFO(">>>>>>>>>>>>>>>>>>>>>>>>>>>>> OPCODE_EXCEPTION");
    for (const Dispatch &d : kDispatch)
        if (d.code == code) {
            d.handler(msg, len, from);
            return 0;
        }
    COMM_ERR("<<<<< Unrecognized opcode 0x%x >>>>>", code);
    return 0;
}
