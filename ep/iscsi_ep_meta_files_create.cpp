// Makes a volume's extent pool: "<volume>/@iSCSI/EP" with its extent table, free-index
// and data files, each 1 MiB of head (sparse) stamped with its file type and the pool's
// one UUID.  Each file is built under a temporary name and renamed into place, so a
// crash leaves either no file or a whole one; the table is made first and marks the
// pool as existing, and a later call completes a pool whose other files are missing.
// An existing pool is kept; its extent size must be the one asked for.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace {

using orlo::ep::Put32;

struct MetaFile {
    uint32_t type;
    const char *typeName;
    uint32_t (*path)(const char *, char *, size_t);
    uint32_t (*typeHeaderSet)(const char *, const void *);
};

const MetaFile kMetaFiles[] = {
    {EP_FILE_TYPE_TBL, "EP_FILE_TYPE_TBL", orlo::ep::TblPath, ORLOiSCSIEpFileTblHeaderSet},
    {EP_FILE_TYPE_FRI, "EP_FILE_TYPE_FRI", orlo::ep::FriPath, ORLOiSCSIEpFileFriHeaderSet},
    {EP_FILE_TYPE_DAT, "EP_FILE_TYPE_DAT", orlo::ep::DatPath, ORLOiSCSIEpFileDatHeaderSet},
};

uint32_t SyncPath(const char *path, int flags) {
    int fd = orlo::os::Open(path, flags | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_RDONLY) failed, err=%m", path);
        return ORLO_ERR_OPEN_FILE;
    }
    orlo::FdGuard guard(fd);
    if (fsync(fd) != 0) {
        ORLO_LOG_ERR("fsync(%d) failed, err=%m", fd);
        return ORLO_ERR_WRITE_FILE;
    }
    return ORLO_OK;
}

// Builds one meta file at tmp and renames it to path.
uint32_t MakeMetaFile(const MetaFile &mf, const char *path, const char *tmp, char *uuid, uint32_t extentSize) {
    uint32_t ret = orlo::ep::FileGrow(tmp, EP_HEAD_SIZE);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("FileGrow(\"%s\", %u) failed, err=%s", tmp, EP_HEAD_SIZE, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ret = ORLOiSCSIEpFileHeaderFill(tmp, uuid, mf.type, 0);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpFileHeaderFill(\"%s\", \"%s\", %s, 0) failed, err=%s", tmp, uuid, mf.typeName,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    unsigned char block[EP_BLOCK_SIZE];
    memset(block, 0, sizeof(block));
    if (mf.type == EP_FILE_TYPE_TBL) Put32(block, EP_TBL_OFF_EXTENT_SIZE, extentSize);
    // The free index starts with no extents: the data files are grown by the kernel.
    ret = mf.typeHeaderSet(tmp, block);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to write the type header of %s, err=%s", tmp, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (mf.type == EP_FILE_TYPE_FRI) {
        memset(block, 0, sizeof(block));
        ret = ORLOiSCSIEpFileFriSetVar0(tmp, block);
        if (ret != ORLO_OK) {
            ORLO_LOG_ERR("ORLOiSCSIEpFileFriSetVar0(\"%s\", %p) failed, err=%s", tmp, static_cast<void *>(block),
                         ORLOiSCSIErrStr(ret));
            return ret;
        }
    }
    ret = SyncPath(tmp, O_RDONLY);
    if (ret != ORLO_OK) return ret;
    if (orlo::os::Rename(tmp, path) != 0) {
        ORLO_LOG_ERR("rename(\"%s\", \"%s\") failed, err=%m", tmp, path);
        return ORLO_ERR_RENAME_FILE;
    }
    return ORLO_OK;
}

uint32_t MakeMissing(const char *volume, const char *poolDir, char *uuid, uint32_t extentSize) {
    for (const MetaFile &mf : kMetaFiles) {
        char path[EP_PATH_SIZE];
        char tmp[EP_PATH_SIZE];
        uint32_t ret = mf.path(volume, path, sizeof(path));
        if (ret == ORLO_OK) ret = orlo::ep::PathBuild(tmp, sizeof(tmp), "%s.new", path);
        if (ret != ORLO_OK) return ret;
        if (orlo::os::Access(path, F_OK) == 0) {
            if (mf.type == EP_FILE_TYPE_TBL && uuid[0] == '\0') {
                ret = ORLOiSCSIEpFileUuidGet(path, uuid);
                if (ret != ORLO_OK) {
                    ORLO_LOG_ERR("ORLOiSCSIEpFileUuidGet(\"%s\", %p) failed, err=%s", path, static_cast<void *>(uuid),
                                 ORLOiSCSIErrStr(ret));
                    return ret;
                }
            }
            continue;
        }
        if (errno != ENOENT) {
            ORLO_LOG_ERR("access(\"%s\", F_OK) failed, err=%m", path);
            return ORLO_ERR_ACCESS_PATH;
        }
        if (orlo::os::Unlink(tmp) != 0 && errno != ENOENT) {
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", tmp);
            return ORLO_ERR_UNLINK_FILE;
        }
        ret = MakeMetaFile(mf, path, tmp, uuid, extentSize);
        if (ret != ORLO_OK) {
            if (orlo::os::Unlink(tmp) != 0 && errno != ENOENT)
                ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", tmp);
            return ret;
        }
    }
    return SyncPath(poolDir, O_RDONLY | O_DIRECTORY);
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSIEpMetaFilesCreate(const char *volume, uint32_t extentSize) {
    if (volume == nullptr || volume[0] == '\0') {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t wanted = extentSize != 0 ? extentSize : ORLO_EP_DEFAULT_EXTENT_SIZE;
    if (wanted < EP_EXTENT_SIZE_MIN || wanted > EP_EXTENT_SIZE_MAX || (wanted & (wanted - 1)) != 0) {
        ORLO_LOG_ERR("Bad parameters, extent size: %llu", static_cast<unsigned long long>(extentSize));
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return ORLO_ERR_BAD_PARAMETER;
    }
    char iscsiDir[EP_PATH_SIZE];
    uint32_t ret = ORLOiSCSIDirPathGet(volume, iscsiDir, sizeof(iscsiDir));
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIDirPathGet(\"%s\", %p, %zu) failed, err=%s", volume, static_cast<void *>(iscsiDir),
                     sizeof(iscsiDir), ORLOiSCSIErrStr(ret));
        return ret;
    }
    char poolDir[EP_PATH_SIZE];
    ret = orlo::ep::PoolDirPath(volume, poolDir, sizeof(poolDir));
    if (ret != ORLO_OK) return ret;
    int volumeNumber = orlo::ep::VolumeNumber(volume);
    if (volumeNumber < 0) return EP_ERR_PARSE_VOLUME_ID;

    int32_t lockFd = -1;
    ret = ORLOiSCSIEpLock(&lockFd, volumeNumber);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpLock(%p, %d) failed, err=%s", static_cast<void *>(&lockFd), volumeNumber,
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    auto unlock = orlo::MakeScopeExit([&] {
        uint32_t r = ORLOiSCSIEpUnlock(lockFd);
        if (r != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpUnlock(%d) failed, err=%s", lockFd, ORLOiSCSIErrStr(r));
    });

    uint32_t size = 0, shift = 0;
    ret = ORLOiSCSIEpExtentSizeAndShiftGet(volume, &size, &shift);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpExtentSizeAndShiftGet(\"%s\", %p, %p) failed, err=%s", volume,
                     static_cast<void *>(&size), static_cast<void *>(&shift), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (size != 0 && extentSize != 0 && size != extentSize) {
        ORLO_LOG_ERR("Extent pool on %s has extent size %u, not %u", volume, size, extentSize);
        return EP_ERR_BAD_EXTENT_SIZE;
    }
    if (orlo::os::Mkdir(poolDir, 0700) != 0 && errno != EEXIST) {
        ORLO_LOG_ERR("mkdir(\"%s\", S_IRWXU) failed, err=%m", poolDir);
        return ORLO_ERR_MKDIR;
    }
    char uuid[ORLO_EP_UUID_BUF_SIZE] = "";
    return MakeMissing(volume, poolDir, uuid, size != 0 ? size : wanted);
}
