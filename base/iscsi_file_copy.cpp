// Copies a file with the system's cp, which knows every file system's fast paths
// (reflinks, holes) and keeps attributes when asked.
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace {

struct CopyOption {
    unsigned int flag;
    const char *arg;
};

constexpr CopyOption kCopyOptions[] = {
    {ORLO_ISCSI_FILE_COPY_PRESERVE, "--preserve=mode,ownership,timestamps"},
    {ORLO_ISCSI_FILE_COPY_SPARSE, "--sparse=always"},
    {ORLO_ISCSI_FILE_COPY_REFLINK, "--reflink=auto"},
};

constexpr unsigned int kKnownFlags =
    ORLO_ISCSI_FILE_COPY_PRESERVE | ORLO_ISCSI_FILE_COPY_SPARSE | ORLO_ISCSI_FILE_COPY_REFLINK;

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIFileCopy(const char *source, const char *destination, unsigned int flags) {
    if (source == nullptr || destination == nullptr || source[0] == '\0' || destination[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if ((flags & ~kKnownFlags) != 0) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (orlo::os::Access(source, F_OK) != 0) {
        ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", source);
        return ORLO_ERR_FILE_NOT_FOUND;
    }
    // cp runs on the machine itself, so it is given the paths as the machine sees them.
    std::string realSource = orlo::os::Map(source);
    std::string realDestination = orlo::os::Map(destination);
    if (realSource.empty() || realDestination.empty()) {
        ORLO_LOG_ERR("Path too long to copy: \"%s\" to \"%s\"", source, destination);
        return ORLO_ERR_PARSE_STRING;
    }
    std::vector<const char *> argv{"/bin/cp"};
    for (const CopyOption &o : kCopyOptions) {
        if ((flags & o.flag) != 0) argv.push_back(o.arg);
    }
    argv.push_back("--");  // a name that begins with "-" is still a name
    argv.push_back(realSource.c_str());
    argv.push_back(realDestination.c_str());
    argv.push_back(nullptr);
    int ret = OLIBCExecv(argv.data());
    if (ret != 0) {
        ORLO_LOG_PLATFORM("OLIBCExecv(\"/bin/cp\", \"%s\", \"%s\") with status %d", source, destination, ret);
        return ORLO_ERR_COPY_FILE;
    }
    return ORLO_OK;
}
