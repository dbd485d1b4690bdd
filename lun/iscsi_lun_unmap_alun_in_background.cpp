// Gives the extents of deleted advanced LUNs back to their volume's pool.  Their map
// files wait in "<volume>/@iSCSI/EP_unmap" under their uuids.  A background process,
// under the volume's trash lock, loads each map file into the kernel's trash host as
// backstore "UNMAP_LUN_<uuid>" (ep_map_table=1 and the map file as device): a map
// enabled there has all its extents released to the pool by the kernel before the
// enable returns.  The process then takes the backstore down and removes the map file.
// A map file whose release fails stays in the trash for the next run (the next deletion
// on the volume starts one, and so may any caller, such as the service start).  The caller does not wait: the call returns as
// soon as the process is started.  Whoever needs to know that a run is over takes the
// volume's trash lock (ORLOiSCSIEpTrashLock) after the map files have gone.
#include <dirent.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "lun/lun_kernel.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "platform/os_seam.h"

namespace {

// The child keeps none of the caller's descriptors: a held lock file (the service
// lock, a LUN lock) would otherwise stay held until the child ends.  The log socket
// goes first so that syslog reconnects rather than writing into a reused number.
void CloseInherited() {
    closelog();
    if (close_range(3, ~0u, 0) == 0) return;
    long max = sysconf(_SC_OPEN_MAX);
    if (max < 0 || max > 65536) max = 65536;
    for (int fd = 3; fd < max; ++fd) close(fd);
}

// The record that names a map file of the trash: it loads into the trash host.
ORLOiSCSILun TrashRecord(const char *volume, const char *uuid) {
    ORLOiSCSILun lun;
    memset(&lun, 0, sizeof(lun));
    lun.lockHandle = -1;
    lun.stateFlags = ORLO_ISCSI_LUN_STATE_EP_UNMAP;
    lun.type = ORLO_ISCSI_LUN_TYPE_ADV;
    lun.blockSize = 512;
    snprintf(lun.uuid, sizeof(lun.uuid), "%s", uuid);
    snprintf(lun.vpdUnitSerial, sizeof(lun.vpdUnitSerial), "%s", uuid);
    snprintf(lun.rootPath, sizeof(lun.rootPath), "%s", volume);
    snprintf(lun.name, sizeof(lun.name), "UNMAP_LUN_%s", uuid);
    return lun;
}

// Releases the extents of one map file and removes it; 0 or the first failure.
uint32_t ReleaseOne(const char *volume, const char *uuid, const char *path) {
    bool isMap = false;
    uint32_t ret = ORLOiSCSIEpIsMapFile(path, &isMap);
    if (ret != ORLO_OK || !isMap) {
        ORLO_LOG_ERR("%s is no map file, left in the trash", path);
        return ret != ORLO_OK ? ret : static_cast<uint32_t>(ORLO_ERR_BAD_FILE_TYPE);
    }
    ORLOiSCSILun lun = TrashRecord(volume, uuid);
    ret = ORLOiSCSILunLoad(&lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunLoad(%p) failed, err=%s. map: %s", static_cast<void *>(&lun), ORLOiSCSIErrStr(ret),
                     path);
        return ret;
    }
    ret = ORLOiSCSILunUnload(&lun);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSILunUnload(%p) failed, err=%s. map: %s", static_cast<void *>(&lun), ORLOiSCSIErrStr(ret),
                     path);
        return ret;
    }
    if (orlo::os::Unlink(path) != 0 && errno != ENOENT) {
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
        return ORLO_ERR_UNLINK_FILE;
    }
    return ORLO_OK;
}

// One pass over the trash under its lock.  Map files put there while the pass runs are
// handled by the process their deletion started, which waits for this one's lock.
uint32_t ReleaseTrash(const char *volume) {
    int32_t lockFd = -1;
    uint32_t ret = ORLOiSCSIEpTrashLock(&lockFd, volume);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpTrashLock(%p, \"%s\") failed, err=%s", static_cast<void *>(&lockFd), volume,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    auto unlock = orlo::MakeScopeExit([&lockFd] { ORLOiSCSIEpTrashCleanUnlock(&lockFd); });
    char dir[EP_PATH_SIZE];
    ret = orlo::ep::TrashDirPath(volume, dir, sizeof(dir));
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> uuids;
    {
        orlo::DirGuard d(orlo::os::Opendir(dir));
        if (d.get() == nullptr) {
            if (errno == ENOENT) return ORLO_OK;  // an empty trash
            ORLO_LOG_ERR("opendir(\"%s\") failed, err=%m", dir);
            return ORLO_ERR_OPEN_DIR;
        }
        unsigned char bin[16];
        while (struct dirent *e = readdir(d.get()))
            if (orlo::ep::UuidParse(e->d_name, bin)) uuids.push_back(e->d_name);
    }
    uint32_t first = ORLO_OK;
    for (const std::string &uuid : uuids) {
        char path[EP_PATH_SIZE];
        ret = orlo::ep::TrashEntryPath(volume, uuid.c_str(), path, sizeof(path));
        if (ret == ORLO_OK) ret = ReleaseOne(volume, uuid.c_str(), path);
        if (ret != ORLO_OK && first == ORLO_OK) first = ret;
    }
    return first;
}

// The trash lock's file is named after the volume path less its slash, so the volume
// must be one path component ("/volume2").
bool IsVolumePath(const char *volume) {
    return volume != nullptr && volume[0] == '/' && volume[1] != '\0' && strchr(volume + 1, '/') == nullptr &&
           strcmp(volume, "/.") != 0 && strcmp(volume, "/..") != 0;
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunUnmapALUNInBackground(const char *volume) {
    if (!IsVolumePath(volume)) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (ORLOVolIDParse(volume) < 0) {
        ORLO_LOG_ERR("ORLOVolIDParse(\"%s\") failed", volume);
        return orlo::lun::kErrParseVolumeId;
    }
    pid_t pid = OLIBCProcForkChildNoWait();
    if (pid < 0) {
        ORLO_LOG_PLATFORM("OLIBCProcForkChildNoWait()");
        return orlo::lun::kErrFork;
    }
    if (pid > 0) return ORLO_OK;
    CloseInherited();
    uint32_t ret = ReleaseTrash(volume);
    if (ret != ORLO_OK) ORLO_LOG_ERR("Failed to release the EP trash of %s, err=%s", volume, ORLOiSCSIErrStr(ret));
    _exit(ret == ORLO_OK ? 0 : 1);
}
