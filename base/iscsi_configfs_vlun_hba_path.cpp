// Path of a virtual LUN's backstore directory, under the extent-pool host.
#include "base/configfs_paths.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsVlunHbaPath(const char *name, char *buf, size_t size) {
    return orlo::BuildBackstorePath(orlo::BackstoreHost::Ep, orlo::BackstoreFile::None, name, buf, size);
}
