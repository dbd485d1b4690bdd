// The data volumes an appliance has: every "/volumeN" directory at the root.
#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "orlo_storage.h"

namespace orlo {

uint32_t VolumeNumbers(std::vector<int> *out) {
    out->clear();
    int count = ORLOVolumeNumsList(nullptr, 0);
    while (count > 0) {
        out->resize(static_cast<size_t>(count));
        int again = ORLOVolumeNumsList(out->data(), count);
        if (again <= count) {
            count = again;
            break;
        }
        count = again;  // a volume appeared meanwhile: ask again with room for it
    }
    if (count < 0) {
        out->clear();
        ORLO_LOG_PLATFORM("ORLOVolumeNumsList(%p, %d)", static_cast<void *>(out->data()), 0);
        return ORLO_ERR_OPEN_DIR;
    }
    out->resize(static_cast<size_t>(count));
    return ORLO_OK;
}

}  // namespace orlo
