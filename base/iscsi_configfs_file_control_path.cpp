// Path of the "control" attribute of a file LUN's backstore.
#include "base/configfs_paths.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsFileControlPath(const char *name, char *buf, size_t size) {
    return orlo::BuildBackstorePath(orlo::BackstoreHost::File, orlo::BackstoreFile::Control, name, buf, size);
}
