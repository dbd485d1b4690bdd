// The platform's interface queries against what the kernel says through /sys and
// /proc: every interface but the loopback, its index and state, its first IPv4 address,
// and its IPv6 addresses with their prefixes and, for link-local ones, their scope.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <netinet/in.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "olibc.h"

namespace target_kernel_test {
namespace {

std::string ReadSys(const std::string &path) {
    std::ifstream in(path);
    std::string v;
    std::getline(in, v);
    return v;
}

// The interfaces under /sys/class/net with their flags word.
std::map<std::string, unsigned long> SysInterfaces() {
    std::map<std::string, unsigned long> out;
    struct if_nameindex *ni = if_nameindex();
    if (ni == nullptr) return out;
    for (struct if_nameindex *p = ni; p->if_index != 0; ++p)
        out[p->if_name] = std::stoul(ReadSys(std::string("/sys/class/net/") + p->if_name + "/flags"), nullptr, 16);
    if_freenameindex(ni);
    return out;
}

// "addr/prefix%scope" for each IPv6 address of ifname in /proc/net/if_inet6.
std::set<std::string> ProcV6(const std::string &ifname) {
    std::set<std::string> out;
    std::ifstream in("/proc/net/if_inet6");
    std::string hex, name;
    unsigned int index, prefix, scope, flags;
    while (in >> hex >> std::hex >> index >> prefix >> scope >> flags >> name >> std::dec) {
        if (name != ifname || hex.size() != 32) continue;
        struct in6_addr a;
        for (int i = 0; i < 16; ++i) a.s6_addr[i] = static_cast<uint8_t>(std::stoul(hex.substr(2 * i, 2), nullptr, 16));
        char text[INET6_ADDRSTRLEN];
        inet_ntop(AF_INET6, &a, text, sizeof(text));
        out.insert(std::string(text) + "/" + std::to_string(prefix) + "%" +
                   std::to_string((scope & 0x20) ? index : 0));
    }
    return out;
}

// The first IPv4 address of ifname as the kernel's ioctl tells it, or "".
std::string IoctlV4(const std::string &ifname) {
    int fd = socket(AF_INET, SOCK_DGRAM, 0);
    if (fd < 0) return "";
    struct ifreq req;
    memset(&req, 0, sizeof(req));
    strncpy(req.ifr_name, ifname.c_str(), IFNAMSIZ - 1);
    std::string out;
    if (ioctl(fd, SIOCGIFADDR, &req) == 0) {
        char text[INET_ADDRSTRLEN];
        inet_ntop(AF_INET, &reinterpret_cast<struct sockaddr_in *>(&req.ifr_addr)->sin_addr, text, sizeof(text));
        out = text;
    }
    close(fd);
    return out;
}

TEST(OlibNetTest, InterfacesAndAddressesAreTheKernels) {
    std::map<std::string, unsigned long> sys = SysInterfaces();
    OLIB_NET_IFINFO info[NUM_MAXIFACES];
    int n = OLIBNetGetInterfaceInfo(info, NUM_MAXIFACES, static_cast<ORLONICENUM>(NIC_LOGICAL_PPP | NIC_HA_DATA));
    ASSERT_GE(n, 0);
    std::set<std::string> listed, want;
    for (const auto &p : sys)
        if (!(p.second & IFF_LOOPBACK)) want.insert(p.first);
    for (int i = 0; i < n; ++i) {
        const OLIB_NET_IFINFO &e = info[i];
        SCOPED_TRACE(e.szName);
        listed.insert(e.szName);
        ASSERT_TRUE(sys.count(e.szName));
        unsigned long flags = sys[e.szName];
        EXPECT_EQ(static_cast<int>(if_nametoindex(e.szName)), e.ifIndex);
        EXPECT_EQ((flags & IFF_UP) != 0, (e.flags & OLIB_NET_IF_UP) != 0);
        // sysfs keeps the carrier apart from the flags word (and refuses to tell it while down).
        const bool carrier = ReadSys(std::string("/sys/class/net/") + e.szName + "/carrier") == "1";
        EXPECT_EQ((flags & IFF_UP) && carrier, (e.flags & OLIB_NET_IF_LINK) != 0);
        EXPECT_EQ(IoctlV4(e.szName), std::string(e.szIP));
        EXPECT_EQ((e.flags & OLIB_NET_IF_STATIC) != 0,
                  (e.flags & OLIB_NET_IF_UP) && !(e.flags & OLIB_NET_IF_LINK) && e.szIP[0] != '\0');

        ORLO_V6_IP v6[NUM_MAXIFACES];
        int m = ORLOLnxV6IPGet(e.szName, v6, NUM_MAXIFACES);
        ASSERT_GE(m, 0);
        std::set<std::string> got;
        for (int j = 0; j < m; ++j)
            got.insert(std::string(v6[j].szIP) + "/" + std::to_string(v6[j].prefixLen) + "%" +
                       std::to_string(v6[j].scopeId));
        EXPECT_EQ(ProcV6(e.szName), got);
    }
    EXPECT_EQ(want, listed);

    // Room for fewer: the first ones only.
    if (n > 0) {
        OLIB_NET_IFINFO one[1];
        ASSERT_EQ(1, OLIBNetGetInterfaceInfo(one, 1, NIC_PHYSICAL));
        EXPECT_STREQ(info[0].szName, one[0].szName);
    }
    EXPECT_EQ(0, OLIBNetGetInterfaceInfo(info, 0, NIC_PHYSICAL));
    EXPECT_EQ(-1, OLIBNetGetInterfaceInfo(info, -1, NIC_PHYSICAL));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    // The loopback's addresses are not asked for by name either way.
    ORLO_V6_IP lo[4];
    EXPECT_GE(ORLOLnxV6IPGet("lo", lo, 4), 0);
}

}  // namespace
}  // namespace target_kernel_test
