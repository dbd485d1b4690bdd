// The check of an application key: a key is one line of the snapshot's key file, so it
// holds no line break, and is 1 to 127 characters long.
#include <cstring>
#include <string>

#include "base/iscsi_base_internal.h"
#include "platform/olibc_file_internal.h"
#include "snapshot/snapshot_app_keys.h"
#include "snapshot/snapshot_internal.h"

namespace orlo {
namespace snap {

uint32_t CheckAppKey(const char *appKey) {
    size_t n = strnlen(appKey, kAppKeyMax + 1);
    if (n >= 1 && n <= kAppKeyMax && strpbrk(appKey, "\n\r") == nullptr) return ORLO_OK;
    std::string shown(appKey, n);
    ORLO_LOG_ERR("Bad app key (1 to %zu characters, one line): \"%s%s\"", kAppKeyMax,
                 orlo::olibc::Printable(shown.c_str()).c_str(), n > kAppKeyMax ? "..." : "");
    OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
    return kErrBadAppKey;
}

}  // namespace snap
}  // namespace orlo
