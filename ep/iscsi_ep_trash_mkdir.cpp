// Makes a volume's trash of map files, "<volume>/@iSCSI/EP_unmap"; on Btrfs without
// copy-on-write, like the pool files whose extents it hands back.
#include <sys/stat.h>

#include <cerrno>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpTrashMkdir(const char *volume) {
    if (volume == nullptr || volume[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    char path[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::TrashDirPath(volume, path, sizeof(path));
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Mkdir(path, 0700) != 0) {
        struct stat st;
        if (errno != EEXIST || orlo::os::Stat(path, &st) != 0 || !S_ISDIR(st.st_mode)) {
            if (errno == EEXIST) errno = ENOTDIR;  // something else holds the name
            ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", path);
            return ORLO_ERR_MKDIR;
        }
    }
    if (ORLOGetFSType(path) == ORLO_FSTYPE_BTRFS && ORLOFSSetNodatacow(path) != 0)
        ORLO_LOG_PLATFORM("ORLOFSSetNodatacow(\"%s\")", path);
    return ORLO_OK;
}
