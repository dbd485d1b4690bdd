// Engine-side channel helpers: sending to a host, route kinds, connecting to another
// engine (the Conn/ConnAck hand-shake, then this host's addresses), the external-in
// channel of an accepted connection, the per-connection thread, and tearing down what a
// failed channel leaves behind (a host with its apps, or one application).
//
// Handlers decide under mCommMutex and send after releasing it (Outbox), so that no
// channel I/O, which may wait for a slow reader, ever happens under the state lock.
#include <arpa/inet.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

using orlocomm::MutexGuard;

namespace orlocomm {

std::atomic<bool> gEngStopRequested{false};

namespace {

std::string OutName(uint32_t ip) { return "SRqSn_" + IpText(ip); }
std::string InName(uint32_t ip) { return "SRqRx_" + IpText(ip); }

std::vector<ORLOCOMM_HOST *> HostsOf(ORLOCOMM_HOST_SET *set) {
    std::vector<ORLOCOMM_HOST *> v;
    if (set == nullptr) return v;
    MutexGuard g(&set->mutex);
    for (ORLOCOMM_LINK *l = set->hosts.next; l != &set->hosts; l = l->next)
        v.push_back(COMM_ENTRY(l, ORLOCOMM_HOST, link));
    return v;
}

// Every app of a set, each with a reference taken.
std::vector<ORLOCOMM_APP *> AppsOf(ORLOCOMM_HOST_SET *set) {
    std::vector<ORLOCOMM_APP *> v;
    if (set == nullptr) return v;
    MutexGuard g(&set->mutex);
    for (ORLOCOMM_LINK *l = set->hosts.next; l != &set->hosts; l = l->next) {
        ORLOCOMM_HOST *h = COMM_ENTRY(l, ORLOCOMM_HOST, link);
        MutexGuard gh(&h->mutex);
        for (ORLOCOMM_LINK *a = h->apps.next; a != &h->apps; a = a->next) {
            ORLOCOMM_APP *app = COMM_ENTRY(a, ORLOCOMM_APP, host_link);
            AppGet(app);
            v.push_back(app);
        }
    }
    return v;
}

void PutAll(const std::vector<ORLOCOMM_APP *> &apps) {
    for (ORLOCOMM_APP *a : apps) AppPut(a);
}

bool HasRuleTo(ORLOCOMM_APP *app, const ORLOCOMM_APP *peer) {
    MutexGuard g(&app->queue_mutex);
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules; l = l->next)
        if (COMM_ENTRY(l, ORLOCOMM_RULE, link)->peer == peer) return true;
    return false;
}

int RemoveRulesTo(ORLOCOMM_APP *app, const ORLOCOMM_APP *peer) {
    MutexGuard g(&app->queue_mutex);
    int n = 0;
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules;) {
        auto *r = COMM_ENTRY(l, ORLOCOMM_RULE, link);
        l = l->next;
        if (r->peer == peer) {
            LinkRemove(&r->link);
            free(r);
            --app->rule_count;
            ++n;
        }
    }
    return n;
}

void RouteFillApp(uint32_t *ip, char *host, ServiceID *id, ORLOCOMM_APP *app) {
    ORLOCOMM_HOST *h;
    {
        MutexGuard g(&app->mutex);
        h = app->host;
    }
    FillHostAddr(ip, host, h);
    *id = app->id;
}

// Closes one named external channel of the set.
void CloseNamed(int kind, const std::string &name) {
    ORLOCOMM_CHANNEL *ch = kind == ORLOCOMM_CH_EXTERNAL_OUT ? GetExternalOutChannel(pChannelSet, name.c_str())
                                                            : GetExternalInChannel(pChannelSet, name.c_str());
    if (ch == nullptr) return;
    RemoveChannel(pChannelSet, ch);
    SocketChannelShutdown(ch);
    ChannelFree(ch);
    ChannelPut(ch);
}

}  // namespace

// ---- Outbox ----

Outbox::~Outbox() {
    for (Item &it : items_) ChannelPut(it.ch);
}

void Outbox::Add(ORLOCOMM_CHANNEL *ch, const void *msg, int len) {
    if (ch == nullptr || msg == nullptr || len <= 0) return;
    ChannelGet(ch);
    const auto *b = static_cast<const uint8_t *>(msg);
    items_.push_back(Item{ch, std::vector<uint8_t>(b, b + len)});
}

bool Outbox::AddToHost(uint32_t ip, const void *msg, int len) {
    ORLOCOMM_HOST *host = SearchRemoteHostByIPv4(ip);
    ORLOCOMM_CHANNEL *ch = HostOutChannel(host);
    if (ch == nullptr) {
        COMM_ERR("No channel to host %s for '%s'", IpText(ip).c_str(), GetCommCmdNameExt(msg));
        return false;
    }
    Add(ch, msg, len);
    ChannelPut(ch);
    return true;
}

bool Outbox::AddToApp(ORLOCOMM_APP *app, const void *msg, int len) {
    if (app == nullptr || app->channel == nullptr) {
        COMM_ERR("App %s has no channel for '%s'", app == nullptr ? "(null)" : app->id.uuid, GetCommCmdNameExt(msg));
        return false;
    }
    Add(app->channel, msg, len);
    return true;
}

void Outbox::Flush() {
    std::vector<Item> items;
    items.swap(items_);
    std::vector<ORLOCOMM_CHANNEL *> failed;
    for (Item &it : items) {
        int len = static_cast<int>(it.msg.size());
        int n = ChannelSend(it.ch, it.msg.data(), len);
        if (n < len) {
            COMM_ERR("***** Fail Send '%s' to %s", GetCommCmdNameExt(it.msg.data()), it.ch->desc->id.service_name);
            if (std::find(failed.begin(), failed.end(), it.ch) == failed.end()) {
                failed.push_back(it.ch);
                continue;  // its reference goes with it
            }
        }
        ChannelPut(it.ch);
    }
    if (failed.empty()) return;
    Outbox more;
    {
        MutexGuard g(&mCommMutex);
        for (ORLOCOMM_CHANNEL *ch : failed) {
            int kind = ch->desc->kind;
            if (kind == ORLOCOMM_CH_PROCESS)
                EngDropAppByChannel(ch, &more);
            else if (kind == ORLOCOMM_CH_EXTERNAL_OUT || kind == ORLOCOMM_CH_EXTERNAL_IN)
                EngBreakHostByChannel(ch, &more);
        }
    }
    for (ORLOCOMM_CHANNEL *ch : failed) ChannelPut(ch);
    more.Flush();
}

// ---- Lookups ----

ORLOCOMM_CHANNEL *HostOutChannel(ORLOCOMM_HOST *host) {
    if (host == nullptr) return nullptr;
    uint32_t ips[ORLOCOMM_MAX_HOST_IPS];
    int n;
    {
        MutexGuard g(&host->mutex);
        n = host->ip_count;
        memcpy(ips, host->ips, sizeof(uint32_t) * static_cast<size_t>(n));
    }
    for (int i = 0; i < n; ++i)
        if (ORLOCOMM_CHANNEL *ch = GetExternalOutChannel(pChannelSet, OutName(ips[i]).c_str())) return ch;
    return nullptr;
}

ORLOCOMM_APP *LocalAppByChannel(ORLOCOMM_CHANNEL *ch) {
    std::vector<ORLOCOMM_APP *> apps = AppsOf(pLocalHostSet);
    ORLOCOMM_APP *found = nullptr;
    for (ORLOCOMM_APP *a : apps)
        if (found == nullptr && a->channel == ch) {
            found = a;
            AppGet(a);
        }
    PutAll(apps);
    return found;
}

ORLOCOMM_HOST *EngHostOfChannel(ORLOCOMM_CHANNEL *ch) {
    uint32_t peer = SocketChannelPeer(ch);
    return peer == 0 ? nullptr : SearchRemoteHostByIPv4(peer);
}

// ---- Tear-down (all under mCommMutex) ----

void EngAppGone(ORLOCOMM_APP *app, Outbox *out) {
    if (app == nullptr) return;
    std::vector<ORLOCOMM_APP *> all = AppsOf(pLocalHostSet);
    std::vector<ORLOCOMM_APP *> remote = AppsOf(pRemoteHostSet);
    all.insert(all.end(), remote.begin(), remote.end());
    uint32_t gone_ip;
    char gone_host[ORLOCOMM_NAME_SIZE];
    ServiceID gone_id;
    RouteFillApp(&gone_ip, gone_host, &gone_id, app);
    for (ORLOCOMM_APP *r : all) {
        if (r == app || !HasRuleTo(r, app)) continue;
        RemoveRulesTo(r, app);
        uint32_t r_ip;
        char r_host[ORLOCOMM_NAME_SIZE];
        ServiceID r_id;
        RouteFillApp(&r_ip, r_host, &r_id, r);
        if (r->type == ORLOCOMM_APP_LOCAL) {
            // The related app hears which peer went: the gone app is the source.
            uint8_t *msg = CreateAppBroken(&r_ip, r);
            if (msg != nullptr) {
                auto *m = reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(msg);
                m->src_ip = gone_ip;
                memcpy(m->src_host, gone_host, ORLOCOMM_NAME_SIZE);
                m->src_id = gone_id;
                memcpy(m->dst_host, r_host, ORLOCOMM_NAME_SIZE);
                out->AddToApp(r, msg, kRouteMsgSize);
                free(msg);
            }
        } else {
            // A remote client hears its service is gone (UBond); a remote service hears its
            // client left (UBind).
            bool client = (r->comm_flags & kCommFlagClient) != 0;
            uint8_t *msg = client ? CreateUBondServiceMsg(r, app) : CreateUBindServiceMsg(app, r);
            if (msg != nullptr) {
                out->AddToHost(r_ip, msg, kRouteMsgSize);
                free(msg);
            }
            EngForgetRemoteAppIfUnused(r);
        }
    }
    PutAll(all);
}

void EngForgetRemoteAppIfUnused(ORLOCOMM_APP *app) {
    if (app == nullptr || app->type != ORLOCOMM_APP_REMOTE) return;
    {
        MutexGuard g(&app->queue_mutex);
        if (app->rule_count > 0) return;
    }
    std::vector<ORLOCOMM_APP *> locals = AppsOf(pLocalHostSet);
    bool used = false;
    for (ORLOCOMM_APP *l : locals) used = used || HasRuleTo(l, app);
    PutAll(locals);
    if (!used) ReleaseApp(app, 1);
}

void EngBreakHost(ORLOCOMM_HOST *host, Outbox *out) {
    if (host == nullptr) return;
    std::vector<ORLOCOMM_APP *> apps;
    uint32_t ips[ORLOCOMM_MAX_HOST_IPS];
    int n;
    char name[ORLOCOMM_NAME_SIZE];
    {
        MutexGuard g(&host->mutex);
        for (ORLOCOMM_LINK *a = host->apps.next; a != &host->apps; a = a->next) {
            ORLOCOMM_APP *app = COMM_ENTRY(a, ORLOCOMM_APP, host_link);
            AppGet(app);
            apps.push_back(app);
        }
        n = host->ip_count;
        memcpy(ips, host->ips, sizeof(uint32_t) * static_cast<size_t>(n));
        memcpy(name, host->name, sizeof(name));
    }
    for (ORLOCOMM_APP *app : apps) {
        EngAppGone(app, out);
        COMM_INFO("Release pRApp %s from host %s", app->id.uuid, name);
        ReleaseApp(app, 1);
    }
    PutAll(apps);
    for (int i = 0; i < n; ++i) {
        CloseNamed(ORLOCOMM_CH_EXTERNAL_OUT, OutName(ips[i]));
        CloseNamed(ORLOCOMM_CH_EXTERNAL_IN, InName(ips[i]));
    }
    COMM_INFO("Remove host %s (%s)", name, n > 0 ? IpText(ips[0]).c_str() : "-");
    RemoveHost(host);
}

void EngBreakHostByChannel(ORLOCOMM_CHANNEL *ch, Outbox *out) {
    if (ch == nullptr || ch->desc->kind == 0) return;  // already taken down
    ORLOCOMM_HOST *host = SearchHostByChannelName(ch->desc->id.service_name);
    if (host == nullptr) {
        RemoveChannel(pChannelSet, ch);
        SocketChannelShutdown(ch);
        ChannelFree(ch);
        return;
    }
    EngBreakHost(host, out);
}

void EngDropAppByChannel(ORLOCOMM_CHANNEL *ch, Outbox *out) {
    ORLOCOMM_APP *app = LocalAppByChannel(ch);
    if (app == nullptr) return;
    COMM_ERR("App %s is gone, released", app->id.uuid);
    EngAppGone(app, out);
    ReleaseApp(app, 0);
    AppPut(app);
}

void EngReapDeadApps(Outbox *out) {
    std::vector<ORLOCOMM_APP *> apps = AppsOf(pLocalHostSet);
    for (ORLOCOMM_APP *app : apps) {
        ORLOCOMM_CHANNEL *ch = app->channel;
        if (ch == nullptr || !IsPipeChannel(ch)) continue;
        auto *p = static_cast<ORLOCOMM_PIPE *>(SendMedium(ch));
        if (p == nullptr || p->write_fd < 0) continue;
        struct pollfd pfd = {p->write_fd, POLLOUT, 0};
        // A FIFO whose reader has gone polls as an error.
        if (poll(&pfd, 1, 0) == 1 && (pfd.revents & POLLERR)) {
            COMM_INFO("App %s has no reader any more, released", app->id.uuid);
            EngAppGone(app, out);
            ReleaseApp(app, 0);
        }
    }
    PutAll(apps);
}

void EngReleaseAll() {
    MutexGuard g(&mCommMutex);
    Outbox ignored;
    for (ORLOCOMM_HOST *h : HostsOf(pRemoteHostSet)) EngBreakHost(h, &ignored);
    std::vector<ORLOCOMM_APP *> apps = AppsOf(pLocalHostSet);
    for (ORLOCOMM_APP *app : apps) ReleaseApp(app, 0);
    PutAll(apps);
}

void EngCloseExternalChannels() {
    if (pChannelSet == nullptr) return;
    std::vector<ORLOCOMM_CHANNEL *> chans;
    {
        MutexGuard g(&pChannelSet->mutex);
        for (int kind : {ORLOCOMM_CH_EXTERNAL_IN, ORLOCOMM_CH_EXTERNAL_OUT}) {
            ORLOCOMM_LINK *head = &pChannelSet->lists[kind - 1];
            for (ORLOCOMM_LINK *l = head->next; l != head; l = l->next) {
                ORLOCOMM_CHANNEL *ch = COMM_ENTRY(l, ORLOCOMM_CHANNEL_DESC, link)->channel;
                ChannelGet(ch);
                chans.push_back(ch);
            }
        }
    }
    for (ORLOCOMM_CHANNEL *ch : chans) {
        SocketChannelShutdown(ch);
        ChannelPut(ch);
    }
}

// ---- The per-connection thread of the socket server ----
//
// A new connection must open with Conn within kFirstFrameTimeoutMs; after the hand-shake
// its frames go to the engine's handlers in the order they came.  Whatever ends the
// connection (the peer leaving, a bad frame, an unknown code) breaks the host it carried.
void *SocketConnThread(void *arg) {
    auto *sock = static_cast<ORLOCOMM_SOCKET *>(arg);
    std::string name = "SRqAc_" + IpText(sock->addr.sin_addr.s_addr);
    ORLOCOMM_CHANNEL *ch = orlocomm_socket_construct(name.c_str(), 0, ORLOCOMM_SERVER_END, 0);
    if (ch == nullptr || orlocomm_socket_internal_request_media(ch, sock) != 0) {
        close(sock->conn_fd);
        free(sock);
        if (ch != nullptr) ChannelFree(ch);
        ConnSlotRelease();
        return nullptr;
    }
    auto *buf = static_cast<uint8_t *>(malloc(ORLOCOMM_MSG_BUF_SIZE));
    int64_t deadline = NowMs() + kFirstFrameTimeoutMs;
    while (buf != nullptr) {
        int timeout = -1;
        if (ch->registered == nullptr) {
            int64_t left = deadline - NowMs();
            if (left <= 0) {
                COMM_ERR("%s said nothing within %d ms", name.c_str(), kFirstFrameTimeoutMs);
                break;
            }
            timeout = static_cast<int>(left);
        }
        if (ChannelWaitReadable(ch, timeout) != 1) break;
        int n = ch->transport->recv_msg(ch, buf, ORLOCOMM_MSG_BUF_SIZE);
        if (n < 1) break;
        int code = buf[0];
        if (ch->registered == nullptr) {
            if (code != ORLOCOMM_OP_CONN) {
                COMM_ERR("%s: first message 0x%x is not Conn", name.c_str(), code);
                break;
            }
            EngDispatchMessage(buf, n, ch);
            if (ch->registered == nullptr) break;
            continue;
        }
        if (code == ORLOCOMM_OP_HOSTIPS)
            HandleHostIPs(buf, n, ch);
        else if (code == ORLOCOMM_OP_HOSTNTY)
            HandleHostNotify(buf, n, ch);
        else
            EngDispatchMessage(buf, n, ch);
    }
    free(buf);
    COMM_INFO("%s closed", name.c_str());
    if (ch->registered != nullptr) {
        Outbox out;
        {
            MutexGuard g(&mCommMutex);
            ORLOCOMM_CHANNEL *current = GetExternalInChannel(pChannelSet, ch->registered->desc->id.service_name);
            if (current == ch->registered) EngBreakHostByChannel(ch->registered, &out);
            ChannelPut(current);
        }
        out.Flush();
        ChannelPut(ch->registered);
        ch->registered = nullptr;
    }
    ChannelFree(ch);
    ConnSlotRelease();
    return nullptr;
}

}  // namespace orlocomm

extern "C" {

ORLO_EXPORT ORLOCOMM_CHANNEL *EngSendMsgToHost(const char *host, const void *msg, int len) {
    if ((msg == nullptr) != (len <= 0) || msg == nullptr) {
        COMM_ERR("Invalid paremeter pMsg %p, len %d", msg, len);
        return nullptr;
    }
    ORLOCOMM_CHANNEL *ch = orlocomm::HostOutChannel(SearchRemoteHostByHostName(host));
    if (ch == nullptr) {
        COMM_ERR("No channel to host %s", host == nullptr ? "(null)" : host);
        return nullptr;
    }
    if (ch->transport->send_msg(ch, msg, len) < len) {
        COMM_ERR("***** Fail Send '%s' to %s", GetCommCmdNameExt(msg), ch->desc->id.service_name);
        ch->transport->stop_service(ch);
        if (ch->desc->kind != 0) RemoveChannel(pChannelSet, ch);
        ChannelFree(ch);
        ChannelPut(ch);
        return nullptr;
    }
    COMM_INFO("***** Successfully to Send '%s' to %s", GetCommCmdNameExt(msg), ch->desc->id.service_name);
    ChannelPut(ch);
    return ch;
}

// 17 local to local, 18 local to remote, 33 remote to local, 34 remote to remote, -1 when
// either host is neither.  A host is typed by its address, by its name only when the
// message carries no address.
ORLO_EXPORT int GetRouteKind(uint32_t src_ip, const char *src_host, uint32_t dst_ip, const char *dst_host) {
    int st = src_ip != 0 ? GetHostTypeBySIP(src_ip) : GetHostTypeByName(src_host);
    int dt = dst_ip != 0 ? GetHostTypeBySIP(dst_ip) : GetHostTypeByName(dst_host);
    if (st == ORLOCOMM_HOST_UNKNOWN || dt == ORLOCOMM_HOST_UNKNOWN) return -1;
    return st * 16 + dt;
}

// Makes the external-in channel of an accepted connection from another engine (its own
// descriptor of the same socket), finding or adding the host first.  A reference is taken
// for the caller.
ORLO_EXPORT ORLOCOMM_CHANNEL *DupSocketRequestRxChannel(ORLOCOMM_HOST *host, const uint32_t *ips, int count,
                                                        ORLOCOMM_SOCKET *sock) {
    if (sock == nullptr || sock->conn_fd < 0) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    struct sockaddr_in local;
    socklen_t len = sizeof(local);
    if (getsockname(sock->conn_fd, reinterpret_cast<struct sockaddr *>(&local), &len) == 0)
        COMM_INFO("Connected through local IP: %s", orlocomm::IpText(local.sin_addr.s_addr).c_str());
    uint32_t peer = sock->addr.sin_addr.s_addr;
    if (host == nullptr) {
        for (int i = 0; host == nullptr && ips != nullptr && i < count; ++i) host = SearchRemoteHostByIPv4(ips[i]);
        if (host == nullptr) host = AddRemoteHost(orlocomm::IpText(peer).c_str(), ips, count);
        if (host == nullptr) return nullptr;
    }
    AddHostIPv4(host, peer);
    int fd = dup(sock->conn_fd);
    if (fd < 0) {
        COMM_ERR("dup(%d) failed, err=%m", sock->conn_fd);
        return nullptr;
    }
    std::string name = "SRqRx_" + orlocomm::IpText(peer);
    ORLOCOMM_CHANNEL *ch = orlocomm_socket_construct(name.c_str(), 0, ORLOCOMM_SERVER_END, 0);
    ORLOCOMM_SOCKET *s = orlocomm::NewAcceptedSocket(fd, &sock->addr);
    if (ch == nullptr || s == nullptr || orlocomm_socket_internal_request_media(ch, s) != 0 ||
        AddExternalInChannel(pChannelSet, ch) != 0) {
        COMM_ERR("Fail to make %s", name.c_str());
        if (s != nullptr && ch != nullptr && ch->request == s) s = nullptr;
        if (s != nullptr) {
            free(s);
        }
        if (ch == nullptr || ch->request == nullptr) close(fd);
        if (ch != nullptr) ChannelFree(ch);
        return nullptr;
    }
    ChannelGet(ch);
    return ch;
}

// Connects this engine to the one at ip: TCP, Conn, ConnAck, then this host's addresses.
// 0 when connected (also when it already was), -1 otherwise.
ORLO_EXPORT int EngConnectHost(uint32_t ip) {
    if (ip == 0 || GetHostTypeBySIP(ip) == ORLOCOMM_HOST_LOCAL) {
        COMM_ERR("Invalid parameter %s", orlocomm::IpText(ip).c_str());
        return -1;
    }
    std::string text = orlocomm::IpText(ip);
    std::string name = "SRqSn_" + text;
    if (ORLOCOMM_CHANNEL *have = GetExternalOutChannel(pChannelSet, name.c_str())) {
        ChannelPut(have);
        return 0;
    }
    ORLOCOMM_HOST *local = orlocomm::EnsureLocalHost();
    ORLOCOMM_CHANNEL *ch = orlocomm_socket_construct(name.c_str(), 0, ORLOCOMM_CLIENT_END, 0);
    if (local == nullptr || ch == nullptr) {
        if (ch != nullptr) ChannelFree(ch);
        return -1;
    }
    if (ch->transport->internal_request(ch, text.c_str()) != 0) {
        ChannelFree(ch);
        return -1;
    }
    uint8_t *conn = CreateConnectV4Msg(local, nullptr);
    if (conn == nullptr) {
        ChannelFree(ch);
        return -1;
    }
    auto *c = reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(conn);
    c->dst_ip = ip;
    orlocomm::CopyName(c->dst_host, text.c_str());
    uint8_t reply[ORLOCOMM_MSG_BUF_SIZE];
    int n = ch->transport->external_request(ch, conn, orlocomm::kRouteMsgSize, reply, sizeof(reply));
    free(conn);
    const auto *ack = reinterpret_cast<const ORLOCOMM_STATUS_MSG *>(reply);
    if (n < orlocomm::kStatusMsgSize || reply[0] != ORLOCOMM_OP_CONNACK || ack->status != ORLOCOMM_CONNACK_ACCEPTED) {
        COMM_ERR("Conn to %s refused, answer 0x%x (%d bytes), status %d", text.c_str(), n > 0 ? reply[0] : 0, n,
                 n >= orlocomm::kStatusMsgSize ? ack->status : -1);
        ChannelFree(ch);
        return -1;
    }
    char peer_name[ORLOCOMM_NAME_SIZE];
    orlocomm::CopyName(peer_name, ack->route.src_host);
    uint32_t claimed = ack->route.src_ip;
    ORLOCOMM_HOST *host = nullptr;
    {
        MutexGuard g(&mCommMutex);
        if (ORLOCOMM_CHANNEL *have = GetExternalOutChannel(pChannelSet, name.c_str())) {
            ChannelPut(have);  // another thread connected meanwhile
            ChannelFree(ch);
            return 0;
        }
        host = SearchRemoteHostByIPv4(ip);
        if (host == nullptr) {
            uint32_t ips[2] = {ip, claimed};
            bool claimed_ok = claimed != 0 && claimed != ip && GetHostTypeBySIP(claimed) == ORLOCOMM_HOST_UNKNOWN;
            host = AddRemoteHost(peer_name[0] != '\0' ? peer_name : text.c_str(), ips, claimed_ok ? 2 : 1);
        }
        if (host == nullptr || AddExternalOutChannel(pChannelSet, ch) != 0) {
            ChannelFree(ch);
            return -1;
        }
    }
    uint32_t local_ip = GetHostFirstIPV4(local);
    uint8_t *ips = CreateHostNotIPsMsg(&local_ip, local->name, &ip, peer_name, local);
    if (ips != nullptr) {
        orlocomm::Outbox out;
        out.Add(ch, ips, static_cast<int>(reinterpret_cast<ORLOCOMM_HOSTIPS_MSG *>(ips)->size));
        free(ips);
        out.Flush();
    }
    COMM_INFO("Connected to host %s (%s)", peer_name, text.c_str());
    return 0;
}

}  // extern "C"
