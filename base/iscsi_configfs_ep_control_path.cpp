// Path of the "control" attribute of an extent-pool LUN's backstore.
#include "base/configfs_paths.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsEpControlPath(const char *name, char *buf, size_t size) {
    return orlo::BuildBackstorePath(orlo::BackstoreHost::Ep, orlo::BackstoreFile::Control, name, buf, size);
}
