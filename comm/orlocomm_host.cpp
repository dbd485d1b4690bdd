// Hosts: the local host set (this appliance) and the remote host set (the engines this one
// talks to), each host with its IPv4 addresses in the order they were learnt (the first is
// the host's address in every message), its name and the applications it adopted.
//
// Lock order: a set's mutex, then a host's, then an application's.
#include <arpa/inet.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>

#include "comm/orlocomm_internal.h"


extern "C" {
ORLO_EXPORT ORLOCOMM_HOST_SET *pLocalHostSet = nullptr;
ORLO_EXPORT ORLOCOMM_HOST_SET *pRemoteHostSet = nullptr;
}

namespace {

using orlocomm::LinkAddTail;
using orlocomm::LinkInit;
using orlocomm::LinkRemove;
using orlocomm::MutexGuard;

ORLOCOMM_HOST_SET *NewSet(int type) {
    auto *set = static_cast<ORLOCOMM_HOST_SET *>(calloc(1, sizeof(ORLOCOMM_HOST_SET)));
    if (set == nullptr) return nullptr;
    LinkInit(&set->hosts);
    set->type = type;
    pthread_mutex_init(&set->mutex, nullptr);
    return set;
}

ORLOCOMM_HOST *HostOf(ORLOCOMM_LINK *l) { return COMM_ENTRY(l, ORLOCOMM_HOST, link); }
ORLOCOMM_APP *AppOfHostLink(ORLOCOMM_LINK *l) { return COMM_ENTRY(l, ORLOCOMM_APP, host_link); }

bool HostHasIp(const ORLOCOMM_HOST *h, uint32_t ip) {
    for (int i = 0; i < h->ip_count; ++i)
        if (h->ips[i] == ip) return true;
    return false;
}

bool IsLoopback(uint32_t ip) { return reinterpret_cast<const uint8_t *>(&ip)[0] == 127; }

template <typename Pred>
ORLOCOMM_HOST *FindHost(ORLOCOMM_HOST_SET *set, Pred pred) {
    if (set == nullptr) return nullptr;
    MutexGuard g(&set->mutex);
    for (ORLOCOMM_LINK *l = set->hosts.next; l != &set->hosts; l = l->next) {
        ORLOCOMM_HOST *h = HostOf(l);
        MutexGuard gh(&h->mutex);
        if (pred(h)) return h;
    }
    return nullptr;
}

ORLOCOMM_HOST *AddHost(ORLOCOMM_HOST_SET *set, int type, const char *name, const uint32_t *ips, int count) {
    if (set == nullptr) {
        COMM_ERR("Host set is not initialised");
        return nullptr;
    }
    auto *host = static_cast<ORLOCOMM_HOST *>(calloc(1, sizeof(ORLOCOMM_HOST)));
    if (host == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    host->type = type;
    orlocomm::CopyName(host->name, name);
    LinkInit(&host->link);
    LinkInit(&host->apps);
    pthread_mutex_init(&host->mutex, nullptr);
    for (int i = 0; ips != nullptr && i < count; ++i) AddHostIPv4(host, ips[i]);
    MutexGuard g(&set->mutex);
    if (type == ORLOCOMM_HOST_REMOTE && set->count >= orlocomm::kMaxRemoteHosts) {
        COMM_ERR("Too many remote hosts (%d), %s refused", set->count, host->name);
        pthread_mutex_destroy(&host->mutex);
        free(host);
        return nullptr;
    }
    LinkAddTail(&set->hosts, &host->link);
    ++set->count;
    return host;
}

template <typename Pred>
ORLOCOMM_APP *FindAppInHost(ORLOCOMM_HOST *host, Pred pred) {
    if (host == nullptr) return nullptr;
    MutexGuard g(&host->mutex);
    for (ORLOCOMM_LINK *l = host->apps.next; l != &host->apps; l = l->next) {
        ORLOCOMM_APP *app = AppOfHostLink(l);
        if (pred(app)) {
            AppGet(app);
            return app;
        }
    }
    return nullptr;
}

template <typename Pred>
ORLOCOMM_APP *FindAppInSet(ORLOCOMM_HOST_SET *set, Pred pred) {
    if (set == nullptr) return nullptr;
    MutexGuard g(&set->mutex);
    for (ORLOCOMM_LINK *l = set->hosts.next; l != &set->hosts; l = l->next)
        if (ORLOCOMM_APP *app = FindAppInHost(HostOf(l), pred)) return app;
    return nullptr;
}

bool SameName(const ORLOCOMM_APP *app, const char *name) {
    return strncmp(app->id.service_name, name, ORLOCOMM_NAME_SIZE - 1) == 0;
}
bool SameUUID(const ORLOCOMM_APP *app, const char *uuid) {
    return strncmp(app->id.uuid, uuid, ORLOCOMM_NAME_SIZE - 1) == 0;
}
// Applications an engine learnt of but never saw register (an application's picture of a
// peer) are found by name only when nothing real has the name.
bool IsUsable(const ORLOCOMM_APP *app) { return app->to_be_deleted == 0; }

int ChannelNameIp(const char *name, uint32_t *ip) {
    if (name == nullptr || strlen(name) < 7) return -1;
    if (strncmp(name, "SRqRx_", 6) != 0 && strncmp(name, "SRqSn_", 6) != 0) return -1;
    return Str2Ipv4(name + 6, ip);
}

}  // namespace

extern "C" {

ORLO_EXPORT int InitHostSet(void) {
    if (pLocalHostSet != nullptr || pRemoteHostSet != nullptr) {
        COMM_ERR("Host set is NOT empty");
        return -1;
    }
    pRemoteHostSet = NewSet(ORLOCOMM_HOST_REMOTE);
    pLocalHostSet = NewSet(ORLOCOMM_HOST_LOCAL);
    if (pRemoteHostSet == nullptr || pLocalHostSet == nullptr) {
        COMM_ERR("Out of memory");
        return -1;
    }
    return 0;
}

ORLO_EXPORT ORLOCOMM_HOST *AddLocalHost(const char *name, const uint32_t *ips, int count) {
    return AddHost(pLocalHostSet, ORLOCOMM_HOST_LOCAL, name, ips, count);
}

ORLO_EXPORT ORLOCOMM_HOST *AddRemoteHost(const char *name, const uint32_t *ips, int count) {
    return AddHost(pRemoteHostSet, ORLOCOMM_HOST_REMOTE, name, ips, count);
}

ORLO_EXPORT int AddRemoteHostIPV4(const char *name, uint32_t ip) {
    ORLOCOMM_HOST *host = SearchRemoteHostByHostName(name);
    if (host == nullptr) {
        COMM_ERR("Remote host %s not found", name == nullptr ? "(null)" : name);
        return -1;
    }
    return AddHostIPv4(host, ip);
}

ORLO_EXPORT int AddHostIPv4(ORLOCOMM_HOST *host, uint32_t ip) {
    if (host == nullptr || ip == 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&host->mutex);
    if (HostHasIp(host, ip)) return 0;
    if (host->ip_count >= ORLOCOMM_MAX_HOST_IPS) {
        COMM_ERR("Host %s has %d addresses, %s not kept", host->name, host->ip_count,
                 orlocomm::IpText(ip).c_str());
        return -1;
    }
    host->ips[host->ip_count++] = ip;
    return 0;
}

ORLO_EXPORT int RemoveHost(ORLOCOMM_HOST *host) {
    if (host == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    ORLOCOMM_HOST_SET *set = host->type == ORLOCOMM_HOST_LOCAL ? pLocalHostSet : pRemoteHostSet;
    {
        MutexGuard g(&set->mutex);
        LinkRemove(&host->link);
        --set->count;
    }
    {
        // Whatever the host still holds is orphaned rather than left pointing at it.
        MutexGuard g(&host->mutex);
        while (!orlocomm::LinkEmpty(&host->apps)) {
            ORLOCOMM_APP *app = AppOfHostLink(host->apps.next);
            MutexGuard ga(&app->mutex);
            LinkRemove(&app->host_link);
            app->host = nullptr;
        }
    }
    pthread_mutex_destroy(&host->mutex);
    free(host);
    return 0;
}

ORLO_EXPORT int UpdateHostName(ORLOCOMM_HOST *host, const char *name) {
    if (host == nullptr || name == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&host->mutex);
    orlocomm::CopyName(host->name, name);
    return 0;
}

ORLO_EXPORT ORLOCOMM_HOST *SearchLocalHost(const char *ip) {
    if (ip == nullptr) return FindHost(pLocalHostSet, [](ORLOCOMM_HOST *) { return true; });
    uint32_t v;
    if (Str2Ipv4(ip, &v) != 0) return nullptr;
    return SearchLocalHostByIPv4(v);
}

ORLO_EXPORT ORLOCOMM_HOST *SearchRemoteHost(const char *ip) {
    uint32_t v;
    if (ip == nullptr || Str2Ipv4(ip, &v) != 0) return nullptr;
    return SearchRemoteHostByIPv4(v);
}

ORLO_EXPORT ORLOCOMM_HOST *SearchLocalHostByHostName(const char *name) {
    if (name == nullptr) return nullptr;
    return FindHost(pLocalHostSet, [&](ORLOCOMM_HOST *h) { return strncmp(h->name, name, ORLOCOMM_NAME_SIZE - 1) == 0; });
}

ORLO_EXPORT ORLOCOMM_HOST *SearchRemoteHostByHostName(const char *name) {
    if (name == nullptr) return nullptr;
    return FindHost(pRemoteHostSet, [&](ORLOCOMM_HOST *h) { return strncmp(h->name, name, ORLOCOMM_NAME_SIZE - 1) == 0; });
}

ORLO_EXPORT ORLOCOMM_HOST *SearchLocalHostByIPv4(uint32_t ip) {
    if (IsLoopback(ip)) return SearchLocalHost(nullptr);
    return FindHost(pLocalHostSet, [&](ORLOCOMM_HOST *h) { return HostHasIp(h, ip); });
}

ORLO_EXPORT ORLOCOMM_HOST *SearchRemoteHostByIPv4(uint32_t ip) {
    return FindHost(pRemoteHostSet, [&](ORLOCOMM_HOST *h) { return HostHasIp(h, ip); });
}

ORLO_EXPORT ORLOCOMM_HOST *SearchHostByChannelName(const char *name) {
    uint32_t ip;
    if (ChannelNameIp(name, &ip) != 0) return nullptr;
    return SearchRemoteHostByIPv4(ip);
}

ORLO_EXPORT int HostBreakByChannelName(const char *name) {
    orlocomm::Outbox out;
    {
        MutexGuard g(&mCommMutex);
        ORLOCOMM_HOST *host = SearchHostByChannelName(name);
        if (host == nullptr) {
            COMM_ERR("%s Not Found", name == nullptr ? "(null)" : name);
            return -1;
        }
        orlocomm::EngBreakHost(host, &out);
    }
    out.Flush();
    return 0;
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInHostByIDExt(ORLOCOMM_HOST *host, const ServiceID *id) {
    if (id == nullptr) return nullptr;
    return FindAppInHost(host, [&](ORLOCOMM_APP *a) { return IsUsable(a) && CompareSID(&a->id, id) == 0; });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInHostByNameExt(ORLOCOMM_HOST *host, const char *name) {
    if (name == nullptr) return nullptr;
    return FindAppInHost(host, [&](ORLOCOMM_APP *a) { return IsUsable(a) && SameName(a, name); });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInLocalHostSetByName(const char *name) {
    if (name == nullptr) return nullptr;
    return FindAppInSet(pLocalHostSet, [&](ORLOCOMM_APP *a) { return IsUsable(a) && SameName(a, name); });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInRemoteHostSetByName(const char *name) {
    if (name == nullptr) return nullptr;
    return FindAppInSet(pRemoteHostSet, [&](ORLOCOMM_APP *a) { return IsUsable(a) && SameName(a, name); });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInLocalHostSetByID(const ServiceID *id) {
    if (id == nullptr) return nullptr;
    return FindAppInSet(pLocalHostSet, [&](ORLOCOMM_APP *a) { return IsUsable(a) && CompareSID(&a->id, id) == 0; });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInRemoteHostSetByID(const ServiceID *id) {
    if (id == nullptr) return nullptr;
    return FindAppInSet(pRemoteHostSet, [&](ORLOCOMM_APP *a) { return IsUsable(a) && CompareSID(&a->id, id) == 0; });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInLocalHostSetByUUID(const char *uuid) {
    if (uuid == nullptr) return nullptr;
    return FindAppInSet(pLocalHostSet, [&](ORLOCOMM_APP *a) { return IsUsable(a) && SameUUID(a, uuid); });
}

ORLO_EXPORT ORLOCOMM_APP *SearchAppInRemoteHostSetByUUID(const char *uuid) {
    if (uuid == nullptr) return nullptr;
    return FindAppInSet(pRemoteHostSet, [&](ORLOCOMM_APP *a) { return IsUsable(a) && SameUUID(a, uuid); });
}

ORLO_EXPORT int HostAdoptApp(ORLOCOMM_HOST *host, ORLOCOMM_APP *app) {
    if (host == nullptr || app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard gh(&host->mutex);
    if (host->app_count >= orlocomm::kMaxAppsPerHost) {
        COMM_ERR("Host %s already holds %d apps, %s refused", host->name, host->app_count, app->id.uuid);
        return -1;
    }
    MutexGuard ga(&app->mutex);
    if (app->host != nullptr) {
        COMM_ERR("%s already adopted", app->id.uuid);
        return -1;
    }
    LinkAddTail(&host->apps, &app->host_link);
    app->host = host;
    ++host->app_count;
    COMM_INFO("Adopt %s by %s", app->id.uuid, host->name);
    return 0;
}

ORLO_EXPORT int HostAbandonApp(ORLOCOMM_HOST *host, ORLOCOMM_APP *app) {
    if (host == nullptr || app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard gh(&host->mutex);
    MutexGuard ga(&app->mutex);
    if (app->host != host) return -1;
    LinkRemove(&app->host_link);
    app->host = nullptr;
    --host->app_count;
    return 0;
}

ORLO_EXPORT int LocalHostAdoptApp(ORLOCOMM_APP *app) {
    if (app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (ORLOCOMM_APP *found = SearchAppInLocalHostSetByID(&app->id)) {
        COMM_INFO("APP service_name %s, pid %d, uuid %s exist", app->id.service_name, app->id.owner, app->id.uuid);
        AppPut(found);
        return 0;
    }
    ORLOCOMM_HOST *local = SearchLocalHost(nullptr);
    if (local == nullptr) {
        COMM_ERR("No local host");
        return -1;
    }
    return HostAdoptApp(local, app);
}

ORLO_EXPORT int RemoteHostAdoptApp(ORLOCOMM_HOST *host, ORLOCOMM_APP *app) {
    if (host == nullptr || app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (ORLOCOMM_APP *found = SearchAppInRemoteHostSetByID(&app->id)) {
        COMM_INFO("APP service_name %s, pid %d, uuid %s exist", app->id.service_name, app->id.owner, app->id.uuid);
        AppPut(found);
        return 0;
    }
    return HostAdoptApp(host, app);
}

ORLO_EXPORT int GetHostTypeByIP(const char *ip) {
    uint32_t v;
    if (ip == nullptr || Str2Ipv4(ip, &v) != 0) return ORLOCOMM_HOST_UNKNOWN;
    return GetHostTypeBySIP(v);
}

ORLO_EXPORT int GetHostTypeBySIP(uint32_t ip) {
    if (ip == 0) return ORLOCOMM_HOST_UNKNOWN;
    if (SearchLocalHostByIPv4(ip) != nullptr) return ORLOCOMM_HOST_LOCAL;
    if (SearchRemoteHostByIPv4(ip) != nullptr) return ORLOCOMM_HOST_REMOTE;
    return ORLOCOMM_HOST_UNKNOWN;
}

ORLO_EXPORT int GetHostTypeByName(const char *name) {
    if (name == nullptr || name[0] == '\0') return ORLOCOMM_HOST_UNKNOWN;
    if (SearchLocalHostByHostName(name) != nullptr) return ORLOCOMM_HOST_LOCAL;
    if (SearchRemoteHostByHostName(name) != nullptr) return ORLOCOMM_HOST_REMOTE;
    return ORLOCOMM_HOST_UNKNOWN;
}

ORLO_EXPORT uint32_t GetHostFirstIPV4(const ORLOCOMM_HOST *host) {
    if (host == nullptr) return 0;
    MutexGuard g(const_cast<pthread_mutex_t *>(&host->mutex));
    return host->ip_count <= 0 ? 0 : host->ips[0];
}

ORLO_EXPORT uint32_t GetRemoteHostFirstIPV4(const char *name) {
    return GetHostFirstIPV4(SearchRemoteHostByHostName(name));
}

ORLO_EXPORT const char *GetLocalHostName(void) {
    ORLOCOMM_HOST *local = SearchLocalHost(nullptr);
    return local == nullptr ? nullptr : local->name;
}

ORLO_EXPORT int ListHostIP(const ORLOCOMM_HOST *host) {
    if (host == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    for (int i = 0; i < host->ip_count; ++i)
        COMM_INFO("Host %s IP[%d] %s", host->name, i, orlocomm::IpText(host->ips[i]).c_str());
    return host->ip_count;
}

// Whether host names this appliance: no host at all, "localhost", the loopback network,
// the local host's name or one of its addresses.
ORLO_EXPORT int IsLocalService(const char *host) {
    if (host == nullptr || host[0] == '\0' || strcmp(host, "localhost") == 0) return 1;
    uint32_t ip;
    if (Str2Ipv4(host, &ip) == 0) return IsLoopback(ip) || SearchLocalHostByIPv4(ip) != nullptr ? 1 : 0;
    return SearchLocalHostByHostName(host) != nullptr || strncmp(host, gszLocalHostName, ORLOCOMM_NAME_SIZE - 1) == 0
               ? 1
               : 0;
}

// A service number for a second application of one process: positive and far above the
// range of process ids.
ORLO_EXPORT int getrandpid(void) {
    static thread_local std::mt19937 gen(std::random_device{}());
    std::uniform_int_distribution<int> dist(1 << 22, (1 << 30) - 1);
    return dist(gen);
}

// The appliance's IPv4 addresses, one per interface in the kernel's order, the active one
// first.  The active address is the first interface that is up with a carrier, else the
// first that is up, with an IPv4 address; with none the loopback address stands in.
ORLO_EXPORT int EnumAllAdapterIPs(uint32_t *ips, int max, char *active, size_t active_size) {
    if (ips == nullptr || max <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    OLIB_NET_IFINFO info[NUM_MAXIFACES];
    int n = OLIBNetGetInterfaceInfo(info, NUM_MAXIFACES, NIC_PHYSICAL);
    if (n < 0) {
        COMM_ERR("OLIBNetGetInterfaceInfo(%p, %d, NIC_PHYSICAL) failed, err=[0x%04X %s:%d]", static_cast<void *>(info),
                 NUM_MAXIFACES, OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
        n = 0;
    }
    int best = -1;
    for (int want : {OLIB_NET_IF_LINK, OLIB_NET_IF_UP}) {
        for (int i = 0; i < n && best < 0; ++i)
            if ((info[i].flags & want) && info[i].szIP[0] != '\0') best = i;
        if (best >= 0) break;
    }
    int count = 0;
    auto push = [&](const char *text) {
        uint32_t v;
        if (count >= max || Str2Ipv4(text, &v) != 0) return;
        for (int j = 0; j < count; ++j)
            if (ips[j] == v) return;
        ips[count++] = v;
    };
    if (best >= 0) push(info[best].szIP);
    for (int i = 0; i < n; ++i)
        if ((info[i].flags & OLIB_NET_IF_UP) && info[i].szIP[0] != '\0') push(info[i].szIP);
    if (count == 0) push("127.0.0.1");
    if (active != nullptr && active_size > 0) snprintf(active, active_size, "%s", orlocomm::IpText(ips[0]).c_str());
    return count;
}

ORLO_EXPORT int Str2Ipv4(const char *text, uint32_t *ip) {
    if (text == nullptr || ip == nullptr) return -1;
    struct in_addr a;
    if (inet_pton(AF_INET, text, &a) != 1) return -1;
    *ip = a.s_addr;
    return 0;
}

ORLO_EXPORT int Ipv42Str(uint32_t ip, char *out, size_t size) {
    if (out == nullptr || size == 0) return -1;
    std::string t = orlocomm::IpText(ip);
    if (t.size() >= size) return -1;
    memcpy(out, t.c_str(), t.size() + 1);
    return 0;
}

}  // extern "C"
