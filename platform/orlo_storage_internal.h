/*
 * Helpers shared by the storage platform library's own sources (orlo_storage_*.cpp):
 * recording a failed system call in the per-thread platform error state, and splitting
 * a path into the parent directory and the last component that the Btrfs ioctls want.
 * Nothing here is exported.
 */
#ifndef ORLO_PLATFORM_ORLO_STORAGE_INTERNAL_H
#define ORLO_PLATFORM_ORLO_STORAGE_INTERNAL_H

#include <string>

namespace orlo {
namespace storage {

// Records the platform code that fits errno (err), with the caller's file and line, and
// leaves errno as err so that the caller's log line can still print "%m".
void SetErrFromErrno(int err, int fallbackCode, const char *file, int line);
#define ORLO_STORAGE_FAIL(err, fallback) \
    ::orlo::storage::SetErrFromErrno((err), (fallback), __FILE_NAME__, __LINE__)

// Splits a logical path into parent and last component: "/volume1/@iSCSI/" gives
// "/volume1" and "@iSCSI"; "name" gives "." and "name".  False (errno EINVAL) when there
// is no usable last component ("/", "", ".", "..").
bool SplitPath(const char *path, std::string *parent, std::string *name);

}  // namespace storage
}  // namespace orlo

#endif
