// Makes the network portals of a target, by this rule:
//  - a backup-object target listens on the loopback portal 127.0.0.1:3260 only: it
//    serves a LUN backup on this appliance and must not be reachable from outside;
//  - otherwise, when the record's network_portals is not empty, the configured list is
//    where the target listens (the administrator chose; interface addresses are not
//    added), each entry on its own port;
//  - else every interface that is up with a link, or up with a static address,
//    contributes its IPv4 address and its global IPv6 addresses, each on port 3260.
//    Link-local IPv6 addresses (fe80::/10) are left out: discovery hands portals to
//    initiators without their scope, so no initiator could log in through one. An
//    administrator who wants one lists it in network_portals with its scope.
// A portal that cannot be made is logged and the others are still made; the result is
// the first failure.
#include <arpa/inet.h>
#include <netinet/in.h>

#include <cstdio>
#include <cstring>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "olibc.h"
#include "orloiscsi_target.h"
#include "target/lio_target_util.h"

namespace {

namespace lio = orlo::target::lio;

constexpr const char kLoopback[] = "127.0.0.1";

// Whether the configured list names anything at all (blanks and commas alone do not).
bool HasConfiguredPortals(const char *portals) { return portals[strspn(portals, " \t,")] != '\0'; }

// Adds one portal, logging a failure; keeps the first failure in *first.
void AddPortal(const ORLOiSCSITarget *target, const char *addr, int port, uint32_t *first) {
    uint32_t ret = ORLOiSCSILioTargetNetworkPortalAdd(target, addr, port);
    if (ret == ORLO_OK) return;
    ORLO_LOG_ERR("ORLOiSCSILioTargetNetworkPortalAdd(%p, \"%s\", %d) failed, err=%s", static_cast<const void *>(target),
                 addr, port, ORLOiSCSIErrStr(ret));
    if (*first == ORLO_OK) *first = ret;
}

uint32_t ConfiguredPortals(const ORLOiSCSITarget *target) {
    // An entry takes at least "a:1,", so the list cannot name more than this.
    std::vector<ORLOiSCSIPortal> portals(sizeof(target->network_portals) / 4);
    int n = ORLOiSCSITargetNetworkPortalConfParse(target->network_portals, portals.data(),
                                                  static_cast<int>(portals.size()));
    if (n < 0) {
        ORLO_LOG_ERR("ORLOiSCSITargetNetworkPortalConfParse(\"%s\", %p, %zu) failed, ret=%d",
                     target->network_portals, static_cast<void *>(portals.data()), portals.size(), n);
        return lio::kErrEnumPortals;
    }
    uint32_t first = ORLO_OK;
    for (int i = 0; i < n; ++i) {
        const ORLOiSCSIPortal &p = portals[static_cast<size_t>(i)];
        AddPortal(target, p.addr, p.port, &first);
    }
    return first;
}

// fe80::/10: the first ten bits 1111111010, i.e. a first group fe80..febf.
bool IsLinkLocalV6(const char *addr) {
    struct in6_addr a;
    if (inet_pton(AF_INET6, addr, &a) != 1) return false;
    return IN6_IS_ADDR_LINKLOCAL(&a);
}

uint32_t InterfacePortals(const ORLOiSCSITarget *target) {
    std::vector<OLIB_NET_IFINFO> ifaces(NUM_MAXIFACES);
    int n = OLIBNetGetInterfaceInfo(ifaces.data(), NUM_MAXIFACES,
                                    static_cast<ORLONICENUM>(NIC_LOGICAL_PPP | NIC_HA_DATA));
    if (n < 0) {
        ORLO_LOG_ERR("OLIBNetGetInterfaceInfo(%p, NUM_MAXIFACES, static_cast<ORLONICENUM>(NIC_LOGICAL_PPP | "
                     "NIC_HA_DATA)) failed, ret=%d",
                     static_cast<void *>(ifaces.data()), n);
        return lio::kErrGetNetIf;
    }
    uint32_t first = ORLO_OK;
    std::vector<ORLO_V6_IP> v6(NUM_MAXIFACES);
    for (int i = 0; i < n; ++i) {
        const OLIB_NET_IFINFO &iface = ifaces[static_cast<size_t>(i)];
        if (!(iface.flags & (OLIB_NET_IF_LINK | OLIB_NET_IF_STATIC))) continue;
        if (iface.szIP[0] != '\0') AddPortal(target, iface.szIP, lio::kIscsiPort, &first);
        int m = ORLOLnxV6IPGet(iface.szName, v6.data(), NUM_MAXIFACES);
        if (m < 0) {
            ORLO_LOG_ERR("ORLOLnxV6IPGet(\"%s\", %p, NUM_MAXIFACES) failed, ret=%d", iface.szName,
                         static_cast<void *>(v6.data()), m);
            if (first == ORLO_OK) first = lio::kErrGetNetIf;
            continue;
        }
        for (int j = 0; j < m; ++j) {
            const ORLO_V6_IP &ip = v6[static_cast<size_t>(j)];
            if (IsLinkLocalV6(ip.szIP)) continue;
            AddPortal(target, ip.szIP, lio::kIscsiPort, &first);
        }
    }
    return first;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILioTargetNetworkPortalLoad(const ORLOiSCSITarget *target) {
    if (target == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = lio::CheckIqn(target->iqn);
    if (ret != ORLO_OK) return ret;
    if (memchr(target->network_portals, '\0', sizeof(target->network_portals)) == nullptr) {
        ORLO_LOG_ERR("Bad target network_portals of tid %d: not terminated", target->tid);
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (target->bkp_obj) {
        uint32_t first = ORLO_OK;
        AddPortal(target, kLoopback, lio::kIscsiPort, &first);
        return first;
    }
    if (HasConfiguredPortals(target->network_portals)) return ConfiguredPortals(target);
    return InterfacePortals(target);
}
