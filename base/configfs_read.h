// Reading a configfs attribute in one read(), shared by the configfs getters.
#ifndef ORLO_BASE_CONFIGFS_READ_H
#define ORLO_BASE_CONFIGFS_READ_H

#include <stddef.h>
#include <stdint.h>
#include <sys/types.h>

namespace orlo {

// Opens path read-only, reads up to size bytes with one read() into buf and closes it.
// *got receives the byte count.  0, 18990038 (open), 18990039 (read) or 18990024
// (close); each failure is logged here.
uint32_t ConfigfsReadOnce(const char *path, char *buf, size_t size, ssize_t *got);

}  // namespace orlo

#endif
