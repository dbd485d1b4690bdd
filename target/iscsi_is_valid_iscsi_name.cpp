// Whether a string is an iSCSI name in one of its three forms: "iqn." with a date and a
// reversed domain name, "eui." with an EUI-64, "naa." with a 64- or 128-bit NAA
// identifier.  Names are compared byte for byte by initiators and the kernel, so only the
// normalised (lower-case) "iqn." spelling is taken.
#include <cctype>
#include <cstring>

#include "orloiscsi_target.h"

namespace {

bool AllHex(const char *s, size_t n) {
    for (size_t i = 0; i < n; ++i)
        if (!isxdigit(static_cast<unsigned char>(s[i]))) return false;
    return true;
}

bool IsIqn(const char *s, size_t len) {
    // "iqn." yyyy "-" mm "." authority [":" unique]
    if (len < 13 || strncmp(s, "iqn.", 4) != 0) return false;
    for (int i = 4; i < 8; ++i)
        if (!isdigit(static_cast<unsigned char>(s[i]))) return false;
    if (s[8] != '-' || !isdigit(static_cast<unsigned char>(s[9])) || !isdigit(static_cast<unsigned char>(s[10])) ||
        s[11] != '.')
        return false;
    int month = (s[9] - '0') * 10 + (s[10] - '0');
    if (month < 1 || month > 12) return false;
    const char *auth = s + 12;
    if (*auth == '\0' || *auth == '.' || *auth == '-' || *auth == ':') return false;
    for (const char *p = s; *p != '\0'; ++p) {
        unsigned char c = static_cast<unsigned char>(*p);
        if (!(islower(c) || isdigit(c) || c == '.' || c == '-' || c == ':')) return false;
    }
    return true;
}

}  // namespace

extern "C" ORLO_EXPORT int ORLOiSCSIIsValidIscsiName(const char *s) {
    if (s == nullptr) return 0;
    size_t len = strnlen(s, ORLO_ISCSI_ISCSI_NAME_MAX + 1);
    if (len == 0 || len > ORLO_ISCSI_ISCSI_NAME_MAX) return 0;
    if (strncmp(s, "eui.", 4) == 0) return len == 4 + 16 && AllHex(s + 4, 16);
    if (strncmp(s, "naa.", 4) == 0) return (len == 4 + 16 || len == 4 + 32) && AllHex(s + 4, len - 4);
    return IsIqn(s, len) ? 1 : 0;
}
