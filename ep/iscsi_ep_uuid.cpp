// UUID fields of the pool files: 16 binary bytes in the order of the hexadecimal digits
// of the string form.
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"

namespace orlo {
namespace ep {

namespace {
int HexValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}
}  // namespace

bool UuidParse(const char *text, unsigned char out[16]) {
    // 8-4-4-4-12 single digits and nothing after them.
    static const int kGroups[] = {8, 4, 4, 4, 12};
    unsigned char digits[32];
    int count = 0;
    const char *p = text;
    for (size_t g = 0; g < sizeof(kGroups) / sizeof(kGroups[0]); ++g) {
        if (g > 0 && *p++ != '-') return false;
        for (int i = 0; i < kGroups[g]; ++i, ++p) {
            int v = HexValue(*p);
            if (v < 0) return false;
            digits[count++] = static_cast<unsigned char>(v);
        }
    }
    if (*p != '\0' || count != 32) return false;
    for (int i = 0; i < 16; ++i) out[i] = static_cast<unsigned char>(digits[2 * i] * 16 + digits[2 * i + 1]);
    return true;
}

uint32_t UuidFormat(const unsigned char in[16], char out[ORLO_EP_UUID_BUF_SIZE]) {
    int n = snprintf(out, ORLO_EP_UUID_BUF_SIZE,
                     "%02x%02x%02x%02x-%02x%02x-%02x%02x-%02x%02x-%02x%02x%02x%02x%02x%02x", in[0], in[1], in[2],
                     in[3], in[4], in[5], in[6], in[7], in[8], in[9], in[10], in[11], in[12], in[13], in[14], in[15]);
    if (n != 36) {
        out[0] = '\0';
        ORLO_LOG_ERR("snprintf() failed with buffer size %zu", static_cast<size_t>(ORLO_EP_UUID_BUF_SIZE));
        return ORLO_ERR_PARSE_STRING;
    }
    return ORLO_OK;
}

}  // namespace ep
}  // namespace orlo
