// Portal directory names of a portal group.
#include "target/lio_portal_util.h"

#include <arpa/inet.h>

#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "target/lio_target_util.h"

namespace orlo {
namespace target {
namespace lio {

namespace {

bool ValidAddress(const char *addr, bool *v6) {
    unsigned char buf[16];
    *v6 = strchr(addr, ':') != nullptr;
    if (!*v6) return inet_pton(AF_INET, addr, buf) == 1;
    std::string bare(addr);
    size_t pct = bare.find('%');
    if (pct != std::string::npos) {
        std::string scope = bare.substr(pct + 1);
        if (scope.empty() || scope.find_first_of("/:[]% \t") != std::string::npos) return false;
        bare.resize(pct);
    }
    return inet_pton(AF_INET6, bare.c_str(), buf) == 1;
}

}  // namespace

uint32_t PortalPath(const ORLOiSCSITarget *target, const char *addr, int port, char *buf) {
    if (target == nullptr || addr == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = CheckIqn(target->iqn);
    if (ret != ORLO_OK) return ret;
    bool v6 = false;
    if (port < 1 || port > 65535 || !ValidAddress(addr, &v6)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (!v6) return FormatPath(buf, kNpFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, addr, port);
    char bracketed[72];
    int n = snprintf(bracketed, sizeof(bracketed), "[%s]", addr);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(bracketed)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    return FormatPath(buf, kNpFmt, target->iqn, ISCSI_TARGET_DEFAULT_TPGT_NUMBER, bracketed, port);
}

}  // namespace lio
}  // namespace target
}  // namespace orlo
