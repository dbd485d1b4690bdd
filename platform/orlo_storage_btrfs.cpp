// Btrfs subvolumes and snapshots through the kernel's own ioctls (no btrfs-progs):
// creation on the parent directory, read-only or writable snapshots, the subvolume test
// (a directory on Btrfs whose inode is the first free object id, 256) and deletion with
// the nested subvolumes first.
#include <dirent.h>
#include <fcntl.h>
#include <linux/btrfs.h>
#include <linux/magic.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "olibc.h"
#include "orlo_storage.h"
#include "platform/orlo_storage_internal.h"
#include "platform/os_seam.h"

namespace {

// Inode number of the root directory of every Btrfs subvolume.
constexpr ino_t kSubvolRootIno = 256;

// Closes a descriptor on scope exit without disturbing errno.
class Fd {
  public:
    explicit Fd(int fd) : fd_(fd) {}
    Fd(const Fd &) = delete;
    Fd &operator=(const Fd &) = delete;
    ~Fd() {
        if (fd_ >= 0) {
            int saved = errno;
            ::close(fd_);
            errno = saved;
        }
    }
    int get() const { return fd_; }

  private:
    int fd_;
};

// f_type is a signed word: on 32-bit systems the Btrfs magic reads as negative.
bool IsBtrfsMagic(__fsword_t type) { return (static_cast<unsigned long>(type) & 0xFFFFFFFFUL) == BTRFS_SUPER_MAGIC; }

bool IsBtrfsFd(int fd) {
    struct statfs sfs;
    return fstatfs(fd, &sfs) == 0 && IsBtrfsMagic(sfs.f_type);
}

bool IsSubvolRootFd(int fd) {
    struct stat st;
    return fstat(fd, &st) == 0 && S_ISDIR(st.st_mode) && st.st_ino == kSubvolRootIno && IsBtrfsFd(fd);
}

// Opens a directory without following a final symbolic link.
int OpenDir(const char *path) { return orlo::os::Open(path, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC); }

// Fills a vol_args name; false (ENAMETOOLONG) when it does not fit.
template <size_t N>
bool SetName(char (&dst)[N], const std::string &name) {
    if (name.size() >= N) {
        errno = ENAMETOOLONG;
        return false;
    }
    memcpy(dst, name.c_str(), name.size() + 1);
    return true;
}

int DestroyByName(int parentFd, const std::string &name) {
    struct btrfs_ioctl_vol_args args;
    memset(&args, 0, sizeof(args));
    if (!SetName(args.name, name)) return -1;
    return ioctl(parentFd, BTRFS_IOC_SNAP_DESTROY, &args);
}

int DeleteSubvolAt(int parentFd, const std::string &name, int depth);

// Deletes every subvolume found below the directory dirFd (not dirFd itself), depth
// first.  Plain directories are walked; files are left alone.
int DeleteNestedIn(int dirFd, int depth) {
    if (depth > 256) {
        errno = ELOOP;
        return -1;
    }
    int walkFd = fcntl(dirFd, F_DUPFD_CLOEXEC, 0);
    if (walkFd < 0) return -1;
    DIR *d = fdopendir(walkFd);
    if (d == nullptr) {
        int saved = errno;
        ::close(walkFd);
        errno = saved;
        return -1;
    }
    int rc = 0;
    while (rc == 0) {
        errno = 0;
        struct dirent *e = readdir(d);
        if (e == nullptr) {
            if (errno != 0) rc = -1;
            break;
        }
        if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
        if (e->d_type != DT_DIR && e->d_type != DT_UNKNOWN) continue;
        Fd child(orlo::os::OpenAt(dirFd, e->d_name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        if (child.get() < 0) {
            if (errno == ENOTDIR || errno == ELOOP || errno == ENOENT) continue;
            rc = -1;
            break;
        }
        struct stat st;
        if (fstat(child.get(), &st) != 0) {
            rc = -1;
            break;
        }
        if (st.st_ino == kSubvolRootIno) {
            rc = DeleteSubvolAt(dirFd, e->d_name, depth + 1);
        } else {
            rc = DeleteNestedIn(child.get(), depth + 1);
        }
    }
    int saved = errno;
    closedir(d);
    errno = saved;
    return rc;
}

// Deletes the subvolume name of parentFd.  The common case (nothing nested) is one
// ioctl; a subvolume that still holds others reports ENOTEMPTY, and then the tree is
// searched for them and the deletion retried.
int DeleteSubvolAt(int parentFd, const std::string &name, int depth) {
    if (DestroyByName(parentFd, name) == 0) return 0;
    if (errno != ENOTEMPTY) return -1;
    Fd self(orlo::os::OpenAt(parentFd, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (self.get() < 0) return -1;
    if (DeleteNestedIn(self.get(), depth) != 0) return -1;
    return DestroyByName(parentFd, name);
}

}  // namespace

extern "C" {

ORLO_EXPORT int ORLOBtrfsCreateSubVol(const char *path) {
    std::string parent, name;
    if (!orlo::storage::SplitPath(path, &parent, &name)) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    struct btrfs_ioctl_vol_args args;
    memset(&args, 0, sizeof(args));
    if (name.size() > BTRFS_SUBVOL_NAME_MAX || !SetName(args.name, name)) {
        ORLO_STORAGE_FAIL(ENAMETOOLONG, OLIBC_ERR_TOO_LONG);
        return -1;
    }
    Fd dir(orlo::os::Open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.get() < 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    if (ioctl(dir.get(), BTRFS_IOC_SUBVOL_CREATE, &args) != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    return 0;
}

ORLO_EXPORT int ORLOBtrfsIsSubVol(const char *path) {
    if (path == nullptr || path[0] == '\0') {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    struct stat st;
    if (orlo::os::Lstat(path, &st) != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_IO);
        return -1;
    }
    if (!S_ISDIR(st.st_mode) || st.st_ino != kSubvolRootIno) return 0;
    struct statfs sfs;
    if (orlo::os::Statfs(path, &sfs) != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_IO);
        return -1;
    }
    return IsBtrfsMagic(sfs.f_type) ? 1 : 0;
}

ORLO_EXPORT int ORLOBtrfsDeleteSubvolFaultTolerant(const char *path) {
    std::string parent, name;
    if (!orlo::storage::SplitPath(path, &parent, &name)) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    Fd dir(orlo::os::Open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.get() < 0) {
        if (errno == ENOENT) return 0;  // the parent is gone, so is the subvolume
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    Fd self(orlo::os::OpenAt(dir.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK));
    if (self.get() < 0) {
        if (errno == ENOENT) return 0;
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    struct stat st;
    if (fstat(self.get(), &st) != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    if (!S_ISDIR(st.st_mode)) {
        ORLO_STORAGE_FAIL(ENOTDIR, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    if (!IsSubvolRootFd(self.get())) {
        // A plain directory: removed only when it is empty, so that a wrong path never
        // costs data; anything in it is left untouched and reported.
        if (orlo::os::Rmdir(path) == 0 || errno == ENOENT) return 0;
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    if (DeleteSubvolAt(dir.get(), name, 0) != 0) {
        if (errno == ENOENT) return 0;  // removed by someone else meanwhile
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    return 0;
}

ORLO_EXPORT int ORLOBtrfsDeleteSubvolListFaultTolerant(const char *dir, const OLIBC_SZLIST *names) {
    if (dir == nullptr || dir[0] == '\0' || names == nullptr) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    // Every name is tried; the first failure is what the call reports.
    int result = 0, savedErr = 0, savedCode = 0;
    for (int i = 0; i < names->nItem; ++i) {
        const char *name = OLIBCSzListGet(names, i);
        if (name == nullptr || name[0] == '\0' || strchr(name, '/') != nullptr) continue;
        std::string path = std::string(dir) + "/" + name;
        if (ORLOBtrfsDeleteSubvolFaultTolerant(path.c_str()) != 0 && result == 0) {
            result = -1;
            savedErr = errno;
            savedCode = OLIBCErrGet();
        }
    }
    if (result != 0) {
        ORLO_STORAGE_FAIL(savedErr, savedCode);
    }
    return result;
}

ORLO_EXPORT int ORLOBtrfsSnapshotCreate(const char *src, const char *dst, int readOnly) {
    std::string parent, name;
    if (src == nullptr || src[0] == '\0' || !orlo::storage::SplitPath(dst, &parent, &name)) {
        ORLO_STORAGE_FAIL(EINVAL, OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    Fd source(OpenDir(src));
    if (source.get() < 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    Fd dir(orlo::os::Open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.get() < 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    struct btrfs_ioctl_vol_args_v2 args;
    memset(&args, 0, sizeof(args));
    args.fd = source.get();
    args.flags = readOnly ? BTRFS_SUBVOL_RDONLY : 0;
    if (!SetName(args.name, name)) {
        ORLO_STORAGE_FAIL(ENAMETOOLONG, OLIBC_ERR_TOO_LONG);
        return -1;
    }
    if (ioctl(dir.get(), BTRFS_IOC_SNAP_CREATE_V2, &args) != 0) {
        ORLO_STORAGE_FAIL(errno, OLIBC_ERR_BTRFS);
        return -1;
    }
    return 0;
}

}  // extern "C"
