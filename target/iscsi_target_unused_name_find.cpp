// The first free target name "<prefix>-<k>", trying k = 1..1001.
#include <cstdio>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "target/target_internal.h"

namespace {
constexpr int kMaxTries = 1001;
}

extern "C" ORLO_EXPORT int ORLOiSCSITargetUnusedNameFind(const char *prefix, char *out, int outSize) {
    if (prefix == nullptr || out == nullptr || outSize < 1) {
        ORLO_LOG_BAD_PARAMS();
        return -1;
    }
    char candidate[ORLO_ISCSI_TARGET_NAME_SIZE];
    for (int k = 1; k <= kMaxTries; ++k) {
        int n = snprintf(candidate, sizeof(candidate), "%s-%d", prefix, k);
        if (n < 0 || n >= static_cast<int>(sizeof(candidate)) || n >= outSize) {
            // A name that does not fit is never handed out cut.
            ORLO_LOG_ERR("Bad parameters, target name from prefix %.32s... does not fit %d bytes", prefix,
                         n >= static_cast<int>(sizeof(candidate)) ? static_cast<int>(sizeof(candidate)) : outSize);
            OLIBCErrSet(OLIBC_ERR_TOO_LONG);
            return -1;
        }
        int used = ORLOiSCSITargetIsNameUsed(candidate);
        if (used < 0) {
            ORLO_LOG_ERR("Failed to check whether target name: %s exist", candidate);
            return -1;
        }
        if (used == 0) {
            memcpy(out, candidate, static_cast<size_t>(n) + 1);
            return 0;
        }
    }
    ORLO_LOG_ERR("too much loop, break: %s", candidate);
    return -1;
}
