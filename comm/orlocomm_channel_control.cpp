// Builders of the control messages.  Each returns a new zeroed buffer of the message's
// size, owned by the caller (free() it), or null when memory runs out.  An app's address
// is its host's first IPv4 address and its host's name, with the app's service identifier.
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

using orlocomm::CopyName;
using orlocomm::FillHostAddr;
using orlocomm::FillRouteHeader;
using orlocomm::NewZeroed;

namespace {

uint8_t *NewRouted(int code, int size) {
    uint8_t *msg = NewZeroed(static_cast<size_t>(size));
    if (msg != nullptr) FillRouteHeader(msg, code);
    return msg;
}

// Routed message between two apps: both addresses and identifiers.
uint8_t *AppToApp(int code, const ORLOCOMM_APP *from, const ORLOCOMM_APP *to) {
    uint8_t *msg = NewRouted(code, orlocomm::kRouteMsgSize);
    if (msg == nullptr) return nullptr;
    auto *r = reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(msg);
    if (from != nullptr) {
        FillHostAddr(&r->src_ip, r->src_host, from->host);
        r->src_id = from->id;
    }
    if (to != nullptr) {
        FillHostAddr(&r->dst_ip, r->dst_host, to->host);
        r->dst_id = to->id;
    }
    return msg;
}

// Routed message from its six parts, each optional.
uint8_t *FromParts(int code, int size, const uint32_t *from_ip, const char *from_host, const ServiceID *from_id,
                   const uint32_t *to_ip, const char *to_host, const ServiceID *to_id) {
    uint8_t *msg = NewRouted(code, size);
    if (msg == nullptr) return nullptr;
    auto *r = reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(msg);
    if (from_ip != nullptr) r->src_ip = *from_ip;
    if (from_host != nullptr) CopyName(r->src_host, from_host);
    if (from_id != nullptr) r->src_id = *from_id;
    if (to_ip != nullptr) r->dst_ip = *to_ip;
    if (to_host != nullptr) CopyName(r->dst_host, to_host);
    if (to_id != nullptr) r->dst_id = *to_id;
    return msg;
}

uint8_t *HostToHost(int code, const ORLOCOMM_HOST *a, const ORLOCOMM_HOST *b) {
    uint8_t *msg = NewRouted(code, orlocomm::kRouteMsgSize);
    if (msg == nullptr) return nullptr;
    auto *r = reinterpret_cast<ORLOCOMM_ROUTE_MSG *>(msg);
    FillHostAddr(&r->src_ip, r->src_host, a);
    FillHostAddr(&r->dst_ip, r->dst_host, b);
    return msg;
}

uint8_t *ServiceMsg(int code, const ORLOCOMM_APP *app) {
    if (app == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    uint8_t *msg = NewRouted(code, orlocomm::kServiceMsgSize);
    if (msg == nullptr) return nullptr;
    auto *s = reinterpret_cast<ORLOCOMM_SERVICE_MSG *>(msg);
    CopyName(s->id.service_name, app->id.service_name);
    s->id.owner = app->id.owner;
    ServiceIDGenerateUUID(&s->id);
    return msg;
}

void LogStatus(const uint8_t *msg) {
    int code = msg[0];
    if (code == ORLOCOMM_OP_PING || code == ORLOCOMM_OP_PONG)
        COMM_INFO("********** opcode 0x%x, status = 0x%x", code,
                  reinterpret_cast<const ORLOCOMM_STATUS_MSG *>(msg)->status);
}

}  // namespace

extern "C" {

ORLO_EXPORT uint8_t *CreateConnectV4Msg(const ORLOCOMM_HOST *local_host, const ORLOCOMM_HOST *remote_host) {
    return HostToHost(ORLOCOMM_OP_CONN, local_host, remote_host);
}

ORLO_EXPORT uint8_t *CreateRConnectV4Msg(const ORLOCOMM_HOST *host_a, const ORLOCOMM_HOST *host_b) {
    return HostToHost(ORLOCOMM_OP_RCONN, host_a, host_b);
}

// The answer to a Conn: from the answering host back to the one that connected.
ORLO_EXPORT uint8_t *CreateConnAckMsg(const uint8_t *conn, uint32_t local_ip, const char *local_host, int status) {
    uint8_t *msg = NewRouted(ORLOCOMM_OP_CONNACK, orlocomm::kStatusMsgSize);
    if (msg == nullptr) return nullptr;
    auto *s = reinterpret_cast<ORLOCOMM_STATUS_MSG *>(msg);
    s->route.src_ip = local_ip;
    CopyName(s->route.src_host, local_host);
    if (conn != nullptr) {
        const auto *c = reinterpret_cast<const ORLOCOMM_ROUTE_MSG *>(conn);
        s->route.dst_ip = c->src_ip;
        memcpy(s->route.dst_host, c->src_host, ORLOCOMM_NAME_SIZE);
        s->route.dst_host[ORLOCOMM_NAME_SIZE - 1] = '\0';
    }
    s->status = status;
    return msg;
}

// The answer to an application's RConn: its addresses unchanged, with the outcome.
ORLO_EXPORT uint8_t *CreateRConnAckMsg(const uint8_t *rconn, int status) {
    uint8_t *msg = NewRouted(ORLOCOMM_OP_RCONNACK, orlocomm::kStatusMsgSize);
    if (msg == nullptr) return nullptr;
    if (rconn != nullptr) memcpy(msg + 4, rconn + 4, orlocomm::kRouteMsgSize - 4);
    reinterpret_cast<ORLOCOMM_STATUS_MSG *>(msg)->status = status;
    return msg;
}

ORLO_EXPORT uint8_t *CreateRegistryMsg(const ORLOCOMM_APP *app) {
    if (app == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    uint8_t *msg = NewRouted(ORLOCOMM_OP_REGISTER, orlocomm::kRegisterMsgSize);
    if (msg == nullptr) return nullptr;
    auto *r = reinterpret_cast<ORLOCOMM_REGISTER_MSG *>(msg);
    CopyName(r->service_name, app->id.service_name);
    r->owner = app->id.owner;
    return msg;
}

ORLO_EXPORT uint8_t *CreateRegisAckMsg(const ORLOCOMM_APP *app) { return ServiceMsg(ORLOCOMM_OP_REGISACK, app); }
ORLO_EXPORT uint8_t *CreateURegistryMsg(const ORLOCOMM_APP *app) { return ServiceMsg(ORLOCOMM_OP_UNREGISTER, app); }
ORLO_EXPORT uint8_t *CreateURegisAckMsg(const ORLOCOMM_APP *app) { return ServiceMsg(ORLOCOMM_OP_UNREGISACK, app); }

ORLO_EXPORT uint8_t *CreateGetAppIpMsg(const ORLOCOMM_APP *asking_app, const char *wanted_uuid) {
    if (asking_app == nullptr || wanted_uuid == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    uint8_t *msg = NewRouted(ORLOCOMM_OP_GETAPPIP, orlocomm::kGetAppIPMsgSize);
    if (msg == nullptr) return nullptr;
    auto *g = reinterpret_cast<ORLOCOMM_GETAPPIP_MSG *>(msg);
    CopyName(g->from_uuid, asking_app->id.uuid);
    CopyName(g->wanted_uuid, wanted_uuid);
    return msg;
}

ORLO_EXPORT uint8_t *CreateGetAppIpAckMsg(void) {
    return NewRouted(ORLOCOMM_OP_GETAPPIPACK, orlocomm::kGetAppIPAckMsgSize);
}

ORLO_EXPORT uint8_t *CreateBindServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app) {
    return AppToApp(ORLOCOMM_OP_BIND, from_app, to_app);
}

ORLO_EXPORT uint8_t *CreateBondServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app) {
    return AppToApp(ORLOCOMM_OP_BOND, from_app, to_app);
}

ORLO_EXPORT uint8_t *CreateBandServiceMsgEx(const uint32_t *from_ip, const char *from_host, const ServiceID *from_id,
                                            const uint32_t *to_ip, const char *to_host, const ServiceID *to_id) {
    return FromParts(ORLOCOMM_OP_BAND, orlocomm::kRouteMsgSize, from_ip, from_host, from_id, to_ip, to_host, to_id);
}

ORLO_EXPORT uint8_t *CreateUBindServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app) {
    return AppToApp(ORLOCOMM_OP_UBIND, from_app, to_app);
}

ORLO_EXPORT uint8_t *CreateUBondServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app) {
    return AppToApp(ORLOCOMM_OP_UBOND, from_app, to_app);
}

ORLO_EXPORT uint8_t *CreateUBandServiceMsgEx(const uint32_t *from_ip, const char *from_host, const ServiceID *from_id,
                                             const uint32_t *to_ip, const char *to_host, const ServiceID *to_id) {
    return FromParts(ORLOCOMM_OP_UBAND, orlocomm::kRouteMsgSize, from_ip, from_host, from_id, to_ip, to_host, to_id);
}

ORLO_EXPORT uint8_t *CreateHostNotifyMsg(const uint32_t *from_ip, const char *from_host, const uint32_t *to_ip,
                                         const char *to_host) {
    return FromParts(ORLOCOMM_OP_HOSTNTY, orlocomm::kRouteMsgSize, from_ip, from_host, nullptr, to_ip, to_host,
                     nullptr);
}

ORLO_EXPORT uint8_t *CreateHostNotIPsMsg(const uint32_t *from_ip, const char *from_host, const uint32_t *to_ip,
                                         const char *to_host, const ORLOCOMM_HOST *host) {
    if (host == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    int n = host->ip_count;
    if (n < 0) n = 0;
    if (n > ORLOCOMM_MAX_HOST_IPS) n = ORLOCOMM_MAX_HOST_IPS;
    int size = orlocomm::kHostIPsBaseSize + 4 * n;
    uint8_t *msg = FromParts(ORLOCOMM_OP_HOSTIPS, size, from_ip, from_host, nullptr, to_ip, to_host, nullptr);
    if (msg == nullptr) return nullptr;
    auto *h = reinterpret_cast<ORLOCOMM_HOSTIPS_MSG *>(msg);
    h->size = static_cast<uint32_t>(size);
    h->count = static_cast<uint32_t>(n);
    memcpy(msg + orlocomm::kHostIPsBaseSize, host->ips, 4 * static_cast<size_t>(n));
    return msg;
}

ORLO_EXPORT uint8_t *CreatePingServiceMsg(const ORLOCOMM_APP *app, const ORLOCOMM_APP *target_app) {
    uint8_t *msg = NewRouted(ORLOCOMM_OP_PING, orlocomm::kStatusMsgSize);
    if (msg == nullptr) return nullptr;
    uint8_t *route = AppToApp(ORLOCOMM_OP_PING, app, target_app);
    if (route == nullptr) {
        free(msg);
        return nullptr;
    }
    memcpy(msg, route, orlocomm::kRouteMsgSize);
    free(route);
    LogStatus(msg);
    return msg;
}

ORLO_EXPORT uint8_t *CreatePongServiceMsg(const uint32_t *from_ip, const char *from_host, const ServiceID *from_id,
                                          const uint32_t *to_ip, const char *to_host, const ServiceID *to_id,
                                          int status) {
    uint8_t *msg = FromParts(ORLOCOMM_OP_PONG, orlocomm::kStatusMsgSize, from_ip, from_host, from_id, to_ip, to_host,
                             to_id);
    if (msg == nullptr) return nullptr;
    reinterpret_cast<ORLOCOMM_STATUS_MSG *>(msg)->status = status;
    LogStatus(msg);
    return msg;
}

ORLO_EXPORT uint8_t *CreateAppBroken(const uint32_t *ip, const ORLOCOMM_APP *app) {
    return CreateServiceNotifySerialServiceMsg(ip, app == nullptr ? nullptr : &app->id, ORLOCOMM_OP_ABROKEN);
}

ORLO_EXPORT uint8_t *CreateServiceNotifySerialServiceMsg(const uint32_t *ip, const ServiceID *id, int code) {
    return FromParts(code, orlocomm::kRouteMsgSize, nullptr, nullptr, nullptr, ip, nullptr, id);
}

ORLO_EXPORT uint8_t *CreateServicePipeServerStop(void) {
    return NewRouted(ORLOCOMM_OP_SSTOP, orlocomm::kRouteMsgSize);
}

// The rejected message's four addresses and two identifiers, unchanged (not swapped), so
// that the Exception finds its way back to whoever sent the original.
ORLO_EXPORT uint8_t *CreateRejectRouteMsg(const void *msg) {
    if (msg == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    uint8_t *out = NewRouted(ORLOCOMM_OP_EXCEPTION, orlocomm::kRouteMsgSize);
    if (out == nullptr) return nullptr;
    memcpy(out + 4, static_cast<const uint8_t *>(msg) + 4, orlocomm::kRouteMsgSize - 4);
    return out;
}

}  // extern "C"
