// Binds a BLOCK LUN to its block device: the root path must name a block device
// ("/dev/...") at least as large as the LUN.  Nothing is written on the device; the
// kernel target is pointed at it when the LUN is loaded.
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>

#include <cstring>

#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"
#include "lun/lun_internal.h"
#include "orlo_storage.h"
#include "platform/os_seam.h"

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunObjectCreateBLOCK(ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    if (lun->type != ORLO_ISCSI_LUN_TYPE_BLOCK) {
        ORLO_LOG_ERR("Unknown lun type: %d (%s)", static_cast<int>(lun->type), ORLOiSCSILunTypeName(lun->type));
        return orlo::lun::kErrBadLunType;
    }
    ORLO_SPACE_INFO info;
    if (strnlen(lun->rootPath, sizeof(lun->rootPath)) == sizeof(lun->rootPath) ||
        ORLOSpaceInfoGet(lun->rootPath, &info) < 1) {
        ORLO_LOG_PLATFORM("ORLOSpaceInfoGet(\"%.*s\", %p)", static_cast<int>(sizeof(lun->rootPath) - 1), lun->rootPath,
                          static_cast<void *>(&info));
        return orlo::lun::kErrBadLocation;
    }
    if (strncmp(lun->rootPath, "/dev/", 5) != 0 || info.isBlockDevice != 1) {
        ORLO_LOG_ERR("lid:%d name:%s szRootPath:%s IBLOCK: Please reference a valid /dev/ block_device", lun->lid,
                     lun->name, lun->rootPath);
        return orlo::lun::kErrBadLocation;
    }
    int fd = orlo::os::Open(lun->rootPath, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_RDONLY) failed, err=%m", lun->rootPath);
        return ORLO_ERR_OPEN_FILE;
    }
    orlo::FdGuard guard(fd);
    uint64_t deviceBytes = 0;
    if (ioctl(fd, BLKGETSIZE64, &deviceBytes) != 0) {
        ORLO_LOG_ERR("ioctl(%d, BLKGETSIZE64) failed, err=%m", fd);
        return ORLO_ERR_READ_FILE;
    }
    if (lun->size > deviceBytes) {
        ORLO_LOG_ERR("LUN size %llu is larger than %s (%llu bytes). lid: %d, name: %s",
                     static_cast<unsigned long long>(lun->size), lun->rootPath,
                     static_cast<unsigned long long>(deviceBytes), lun->lid, lun->name);
        return orlo::lun::kErrBadSize;
    }
    return ORLO_OK;
}
