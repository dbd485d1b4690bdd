// Adds finished bytes to the progress file of this process ("done_bytes"), which other
// processes read to show how far a LUN file has grown.
#include <unistd.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"

namespace {
constexpr uint32_t kErrSetProgressFile = 18990424;  // Failed to set progress file
}

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIFileProgressWrite(uint64_t bytes) {
    char path[64];
    snprintf(path, sizeof(path), ORLO_ISCSI_FILE_PROGRESS_PATH_FMT, static_cast<int>(getpid()));
    uint64_t done = 0;
    if (OLIBCFileExist(path)) {
        char value[32];
        int n = OLIBCFileGetKeyValue(path, ORLO_ISCSI_FILE_PROGRESS_DONE, value, sizeof(value));
        if (n < 0) {
            if (OLIBCErrGet() != OLIBC_ERR_NOT_FOUND) {
                ORLO_LOG_PLATFORM("OLIBCFileGetKeyValue(\"%s\", \"%s\", %p, %zu)", path,
                                  ORLO_ISCSI_FILE_PROGRESS_DONE, static_cast<void *>(value), sizeof(value));
                return kErrSetProgressFile;
            }
        } else {
            char *end = nullptr;
            errno = 0;
            unsigned long long v = strtoull(value, &end, 10);
            if (n == 0 || errno != 0 || end == nullptr || *end != '\0' || value[0] == '-') {
                ORLO_LOG_ERR("Bad %s value in %s: \"%s\"", ORLO_ISCSI_FILE_PROGRESS_DONE, path, value);
                return kErrSetProgressFile;
            }
            done = v;
        }
    }
    char value[32];
    snprintf(value, sizeof(value), "%" PRIu64, done + bytes);
    if (OLIBCFileSetKeyValue(path, ORLO_ISCSI_FILE_PROGRESS_DONE, value, "%s=%s\n") < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileSetKeyValue(\"%s\", \"%s\", \"%s\", \"%%s=%%s\\n\")", path,
                          ORLO_ISCSI_FILE_PROGRESS_DONE, value);
        return kErrSetProgressFile;
    }
    return ORLO_OK;
}
