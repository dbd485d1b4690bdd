// Path of the "control" attribute of a LUN being deleted's backstore.
#include "base/configfs_paths.h"
#include "orloiscsi_configfs.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIConfigfsTrashControlPath(const char *name, char *buf, size_t size) {
    return orlo::BuildBackstorePath(orlo::BackstoreHost::Trash, orlo::BackstoreFile::Control, name, buf, size);
}
