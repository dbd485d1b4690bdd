// Reads a target's configured portal list, "a.b.c.d:port,[v6]:port,...": entries are
// separated by commas (blanks around them are ignored, empty ones skipped), an IPv4
// entry reads as "%[^:]:%d" and an IPv6 one as "[%[^]]]:%d".  Only a complete entry
// with a valid address (an IPv6 one may carry a "%<scope>") and a port of 1..65535
// counts; any other is logged and skipped, and the rest are still read.
#include <arpa/inet.h>

#include <cstdio>
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"

namespace {

constexpr size_t kAddrSize = sizeof(ORLOiSCSIPortal::addr);

std::string Trim(const std::string &s) {
    size_t b = s.find_first_not_of(" \t");
    if (b == std::string::npos) return "";
    size_t e = s.find_last_not_of(" \t");
    return s.substr(b, e - b + 1);
}

bool ValidAddress(const char *addr, bool v6) {
    unsigned char buf[16];
    if (!v6) return inet_pton(AF_INET, addr, buf) == 1;
    std::string bare(addr);
    size_t pct = bare.find('%');
    if (pct != std::string::npos) {
        std::string scope = bare.substr(pct + 1);
        if (scope.empty() || scope.find_first_of("/:[]% \t") != std::string::npos) return false;
        bare.resize(pct);
    }
    return inet_pton(AF_INET6, bare.c_str(), buf) == 1;
}

// One entry into *out; false when it is not a portal.
bool ParseEntry(const std::string &entry, ORLOiSCSIPortal *out) {
    char addr[kAddrSize] = "";
    int port = 0, used = -1;
    bool v6 = !entry.empty() && entry[0] == '[';
    // The widths keep the address inside its field: a longer one does not match.
    int got = v6 ? sscanf(entry.c_str(), "[%63[^]]]:%d%n", addr, &port, &used)
                 : sscanf(entry.c_str(), "%63[^:]:%d%n", addr, &port, &used);
    if (got != 2 || used < 0 || static_cast<size_t>(used) != entry.size()) return false;
    if (port < 1 || port > 65535 || !ValidAddress(addr, v6)) return false;
    memset(out, 0, sizeof(*out));
    memcpy(out->addr, addr, sizeof(out->addr));
    out->port = port;
    return true;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSITargetNetworkPortalConfParse(const char *portals, ORLOiSCSIPortal *out, int max) {
    if (portals == nullptr || (out == nullptr && max > 0) || max < 0) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    const std::string list(portals);
    int n = 0;
    size_t start = 0;
    while (start <= list.size()) {
        size_t comma = list.find(',', start);
        if (comma == std::string::npos) comma = list.size();
        const std::string entry = Trim(list.substr(start, comma - start));
        start = comma + 1;
        if (entry.empty()) continue;
        ORLOiSCSIPortal portal;
        if (!ParseEntry(entry, &portal)) {
            ORLO_LOG_ERR("Bad network portal \"%s\" in \"%s\", skipped", entry.c_str(), portals);
            continue;
        }
        if (n >= max) {
            ORLO_LOG_ERR("Too many network portals in \"%s\", only %d taken", portals, max);
            break;
        }
        out[n++] = portal;
    }
    return n;
}
