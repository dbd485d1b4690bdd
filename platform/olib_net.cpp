// Network interface queries: the interfaces of the machine and their IPv4 and IPv6
// addresses, read with getifaddrs so the answer is the kernel's of the moment.
#include <arpa/inet.h>
#include <ifaddrs.h>
#include <net/if.h>
#include <netinet/in.h>

#include <cerrno>
#include <cstring>

#include "olibc.h"

namespace {

// Prefix length of a netmask.
int PrefixLength(const unsigned char *mask, size_t bytes) {
    int n = 0;
    for (size_t i = 0; i < bytes; ++i)
        for (int b = 7; b >= 0; --b)
            if (mask[i] & (1u << b)) ++n;
    return n;
}

// Owns the list getifaddrs returns.
class IfAddrs {
  public:
    IfAddrs() {
        if (getifaddrs(&list_) != 0) list_ = nullptr;
    }
    IfAddrs(const IfAddrs &) = delete;
    IfAddrs &operator=(const IfAddrs &) = delete;
    ~IfAddrs() {
        if (list_ != nullptr) freeifaddrs(list_);
    }
    bool ok() const { return list_ != nullptr; }
    const struct ifaddrs *get() const { return list_; }

  private:
    struct ifaddrs *list_ = nullptr;
};

bool WantedKind(unsigned int ifFlags, ORLONICENUM kinds) {
    if (ifFlags & IFF_LOOPBACK) return false;
    if ((ifFlags & IFF_POINTOPOINT) && !(kinds & NIC_LOGICAL_PPP)) return false;
    return true;
}

// The entry of name in info[0..n), or nullptr.
OLIB_NET_IFINFO *Find(OLIB_NET_IFINFO *info, int n, const char *name) {
    for (int i = 0; i < n; ++i)
        if (strcmp(info[i].szName, name) == 0) return &info[i];
    return nullptr;
}

}  // namespace

extern "C" {

ORLO_EXPORT int OLIBNetGetInterfaceInfo(OLIB_NET_IFINFO *pInfo, int max, ORLONICENUM kinds) {
    if (pInfo == nullptr || max < 0) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    IfAddrs addrs;
    if (!addrs.ok()) {
        OLIBCErrSet(OLIBC_ERR_IO);
        return -1;
    }
    int n = 0;
    // getifaddrs lists each interface once per address (and once as a link): the first
    // appearance fixes its place, its first IPv4 address its address.
    for (const struct ifaddrs *a = addrs.get(); a != nullptr; a = a->ifa_next) {
        if (a->ifa_name == nullptr || !WantedKind(a->ifa_flags, kinds)) continue;
        if (strlen(a->ifa_name) >= OLIB_NET_IFNAME_SIZE) continue;
        OLIB_NET_IFINFO *e = Find(pInfo, n, a->ifa_name);
        if (e == nullptr) {
            if (n >= max) continue;
            e = &pInfo[n++];
            memset(e, 0, sizeof(*e));
            strcpy(e->szName, a->ifa_name);
            e->ifIndex = static_cast<int>(if_nametoindex(a->ifa_name));
            if (a->ifa_flags & IFF_UP) e->flags |= OLIB_NET_IF_UP;
            if ((a->ifa_flags & IFF_UP) && (a->ifa_flags & IFF_RUNNING)) e->flags |= OLIB_NET_IF_LINK;
        }
        if (a->ifa_addr == nullptr || a->ifa_addr->sa_family != AF_INET || e->szIP[0] != '\0') continue;
        const struct sockaddr_in *sin = reinterpret_cast<const struct sockaddr_in *>(a->ifa_addr);
        if (inet_ntop(AF_INET, &sin->sin_addr, e->szIP, sizeof(e->szIP)) == nullptr) {
            e->szIP[0] = '\0';
            continue;
        }
        if (a->ifa_netmask != nullptr && a->ifa_netmask->sa_family == AF_INET) {
            const struct sockaddr_in *m = reinterpret_cast<const struct sockaddr_in *>(a->ifa_netmask);
            if (inet_ntop(AF_INET, &m->sin_addr, e->szMask, sizeof(e->szMask)) == nullptr) e->szMask[0] = '\0';
        }
    }
    for (int i = 0; i < n; ++i)
        if ((pInfo[i].flags & OLIB_NET_IF_UP) && !(pInfo[i].flags & OLIB_NET_IF_LINK) && pInfo[i].szIP[0] != '\0')
            pInfo[i].flags |= OLIB_NET_IF_STATIC;
    return n;
}

ORLO_EXPORT int ORLOLnxV6IPGet(const char *ifname, ORLO_V6_IP *pIP, int max) {
    if (ifname == nullptr || ifname[0] == '\0' || pIP == nullptr || max < 0) {
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    IfAddrs addrs;
    if (!addrs.ok()) {
        OLIBCErrSet(OLIBC_ERR_IO);
        return -1;
    }
    int n = 0;
    for (const struct ifaddrs *a = addrs.get(); a != nullptr && n < max; a = a->ifa_next) {
        if (a->ifa_name == nullptr || strcmp(a->ifa_name, ifname) != 0) continue;
        if (a->ifa_addr == nullptr || a->ifa_addr->sa_family != AF_INET6) continue;
        const struct sockaddr_in6 *sin6 = reinterpret_cast<const struct sockaddr_in6 *>(a->ifa_addr);
        ORLO_V6_IP *e = &pIP[n];
        memset(e, 0, sizeof(*e));
        if (inet_ntop(AF_INET6, &sin6->sin6_addr, e->szIP, sizeof(e->szIP)) == nullptr) continue;
        e->scopeId = static_cast<int>(sin6->sin6_scope_id);
        if (a->ifa_netmask != nullptr && a->ifa_netmask->sa_family == AF_INET6) {
            const struct sockaddr_in6 *m = reinterpret_cast<const struct sockaddr_in6 *>(a->ifa_netmask);
            e->prefixLen = PrefixLength(m->sin6_addr.s6_addr, sizeof(m->sin6_addr.s6_addr));
        }
        ++n;
    }
    return n;
}

}  // extern "C"
