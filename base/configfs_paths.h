// Builders of backstore paths under the storage-object host directories.
#ifndef ORLO_BASE_CONFIGFS_PATHS_H
#define ORLO_BASE_CONFIGFS_PATHS_H

#include <stddef.h>
#include <stdint.h>

namespace orlo {

// Host directories of the backstore kinds.
enum class BackstoreHost { Block, File, Ep, Trash };
// The attribute file under a backstore, or none for the backstore directory itself.
enum class BackstoreFile { None, Control, Enable, Info };

const char *BackstoreHostDir(BackstoreHost host);

// "<host>/<name>" (the backstore directory).
uint32_t GetLUNConfigFSPath(const char *host, const char *name, char *buf, size_t size);

// "<host dir>/<name>[/control|/enable|/info]".  18990004 for null arguments, 18990050
// when the path does not fit; both logged.
uint32_t BuildBackstorePath(BackstoreHost host, BackstoreFile file, const char *name, char *buf, size_t size);

// The value of an attribute as a log line may show it: CHAP secrets ("password" and
// "password_mutual" under auth/) are shown as "********".
const char *ConfigfsLogValue(const char *path, const char *value);

}  // namespace orlo

#endif
