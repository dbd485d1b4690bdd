#include "support/loop_volume.h"

#include <fcntl.h>
#include <linux/loop.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <sstream>

namespace orlotest {

namespace {

constexpr uint64_t kSmallBtrfs = 128ull << 20;  // below this, Btrfs needs mixed block groups

std::string FindTool(const std::string &name) {
    for (const char *dir : {"/usr/sbin", "/sbin", "/usr/bin", "/bin"}) {
        std::string p = std::string(dir) + "/" + name;
        if (access(p.c_str(), X_OK) == 0) return p;
    }
    return std::string();
}

const char *MkfsName(LoopVolume::Fs fs) { return fs == LoopVolume::Fs::kBtrfs ? "mkfs.btrfs" : "mkfs.ext4"; }

bool KernelHas(const char *fsName) {
    std::ifstream in("/proc/filesystems");
    std::string line;
    while (std::getline(in, line)) {
        std::istringstream ss(line);
        std::string a, b;
        ss >> a >> b;
        if (a == fsName || b == fsName) return true;
    }
    return false;
}

void MakeDirs(const std::string &p) {
    for (size_t i = 1; i <= p.size(); ++i)
        if (i == p.size() || p[i] == '/') mkdir(p.substr(0, i).c_str(), 0755);
}

// Opens /dev/loopN, making the node when the container's /dev lacks it.
int OpenLoopDevice(int n, std::string *path) {
    *path = "/dev/loop" + std::to_string(n);
    int fd = open(path->c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0 && errno == ENOENT) {
        mknod(path->c_str(), S_IFBLK | 0660, makedev(7, static_cast<unsigned>(n)));
        fd = open(path->c_str(), O_RDWR | O_CLOEXEC);
    }
    return fd;
}

// Attaches image to a free loop device that detaches itself at its last close or
// unmount.  Returns the open device descriptor, or -1 with *err set.
int AttachLoop(const std::string &image, std::string *device, std::string *err) {
    int ctl = open("/dev/loop-control", O_RDWR | O_CLOEXEC);
    if (ctl < 0) {
        *err = std::string("open /dev/loop-control: ") + strerror(errno);
        return -1;
    }
    int img = open(image.c_str(), O_RDWR | O_CLOEXEC);
    if (img < 0) {
        *err = std::string("open image: ") + strerror(errno);
        close(ctl);
        return -1;
    }
    int result = -1;
    for (int attempt = 0; attempt < 32 && result < 0; ++attempt) {
        int n = ioctl(ctl, LOOP_CTL_GET_FREE);
        if (n < 0) {
            *err = std::string("LOOP_CTL_GET_FREE: ") + strerror(errno);
            break;
        }
        int dev = OpenLoopDevice(n, device);
        if (dev < 0) {
            *err = "open " + *device + ": " + strerror(errno);
            break;
        }
        struct loop_config cfg;
        memset(&cfg, 0, sizeof(cfg));
        cfg.fd = static_cast<__u32>(img);
        cfg.info.lo_flags = LO_FLAGS_AUTOCLEAR;
        if (ioctl(dev, LOOP_CONFIGURE, &cfg) == 0) {
            result = dev;
            break;
        }
        int e = errno;
        if (e == EINVAL || e == ENOTTY) {  // kernels before 5.8
            if (ioctl(dev, LOOP_SET_FD, img) == 0) {
                struct loop_info64 info;
                memset(&info, 0, sizeof(info));
                info.lo_flags = LO_FLAGS_AUTOCLEAR;
                ioctl(dev, LOOP_SET_STATUS64, &info);
                result = dev;
                break;
            }
            e = errno;
        }
        close(dev);
        if (e != EBUSY) {  // EBUSY: another process took the device first
            *err = "attach " + *device + ": " + strerror(e);
            break;
        }
    }
    if (result < 0 && err->empty()) *err = "no free loop device";
    close(img);
    close(ctl);
    return result;
}

}  // namespace

const char *LoopVolume::FsName(Fs fs) { return fs == Fs::kBtrfs ? "btrfs" : "ext4"; }

std::string LoopVolume::Unavailable(Fs fs) {
    if (geteuid() != 0) return "loop-mounted volumes need root";
    if (access("/dev/loop-control", R_OK | W_OK) != 0) return "no loop devices here (/dev/loop-control)";
    if (FindTool(MkfsName(fs)).empty())
        return std::string(MkfsName(fs)) + " not found (install " +
               (fs == Fs::kBtrfs ? "btrfs-progs" : "e2fsprogs") + ")";
    if (!KernelHas(FsName(fs))) {
        std::string modprobe = FindTool("modprobe");
        if (!modprobe.empty()) RunProgram({modprobe, "-q", FsName(fs)});
        if (!KernelHas(FsName(fs))) return std::string("the kernel has no ") + FsName(fs);
    }
    return std::string();
}

bool LoopVolume::Create(Fs fs, uint64_t sizeBytes, const std::string &mountPoint, std::string *err) {
    std::string scratch;
    if (err == nullptr) err = &scratch;
    err->clear();
    Destroy();
    fs_ = fs;
    dir_ = MakeTempDir("orlo-loop");
    if (dir_.empty()) {
        *err = std::string("mkdtemp: ") + strerror(errno);
        return false;
    }
    image_ = dir_ + "/image";
    int img = open(image_.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
    if (img < 0 || ftruncate(img, static_cast<off_t>(sizeBytes)) != 0) {
        *err = std::string("image: ") + strerror(errno);
        if (img >= 0) close(img);
        Destroy();
        return false;
    }
    close(img);

    std::vector<std::string> mkfs{FindTool(MkfsName(fs))};
    if (fs == Fs::kBtrfs) {
        mkfs.insert(mkfs.end(), {"-q", "-f"});
        if (sizeBytes < kSmallBtrfs) mkfs.push_back("--mixed");
    } else {
        // No reserved blocks, so "full" means full; inode tables written now, so that no
        // background initialisation runs while the test measures the volume.
        mkfs.insert(mkfs.end(), {"-q", "-F", "-m", "0", "-E", "lazy_itable_init=0,lazy_journal_init=0"});
    }
    mkfs.push_back(image_);
    std::string out, errText;
    if (mkfs[0].empty() || RunProgram(mkfs, &out, &errText) != 0) {
        *err = std::string(MkfsName(fs)) + " failed: " + out + errText;
        Destroy();
        return false;
    }

    int dev = AttachLoop(image_, &device_, err);
    if (dev < 0) {
        device_.clear();
        Destroy();
        return false;
    }
    MakeDirs(mountPoint);
    if (mount(device_.c_str(), mountPoint.c_str(), FsName(fs), 0, nullptr) != 0) {
        *err = "mount " + device_ + " on " + mountPoint + ": " + strerror(errno);
        ioctl(dev, LOOP_CLR_FD, 0);
        close(dev);
        device_.clear();
        Destroy();
        return false;
    }
    close(dev);  // the mount holds the device now; it detaches at unmount
    mountPoint_ = mountPoint;
    return true;
}

bool LoopVolume::Destroy() {
    bool ok = true;
    if (!mountPoint_.empty()) {
        sync();
        int rc = -1;
        for (int i = 0; i < 50; ++i) {
            rc = umount2(mountPoint_.c_str(), 0);
            if (rc == 0 || errno != EBUSY) break;
            usleep(100 * 1000);
        }
        if (rc != 0 && errno != EINVAL && errno != ENOENT) {
            ok = false;
            umount2(mountPoint_.c_str(), MNT_DETACH);
        }
        mountPoint_.clear();
    }
    if (!device_.empty()) {
        int dev = open(device_.c_str(), O_RDONLY | O_CLOEXEC);
        if (dev >= 0) {
            ioctl(dev, LOOP_CLR_FD, 0);  // ENXIO when it already detached itself
            close(dev);
        }
        device_.clear();
    }
    if (!image_.empty()) {
        unlink(image_.c_str());
        image_.clear();
    }
    if (!dir_.empty()) {
        rmdir(dir_.c_str());
        dir_.clear();
    }
    return ok;
}

void VolumeTest::TearDown() {
    for (auto &v : volumes_) EXPECT_TRUE(v.second->Destroy()) << "could not unmount " << v.second->mount_point();
    volumes_.clear();
    SandboxTest::TearDown();
}

bool VolumeTest::MountVolume(LoopVolume::Fs fs, uint64_t sizeBytes, int n) {
    auto vol = std::make_unique<LoopVolume>();
    std::string err;
    if (!vol->Create(fs, sizeBytes, Real("/volume" + std::to_string(n)), &err)) {
        ADD_FAILURE() << "cannot mount a " << LoopVolume::FsName(fs) << " volume: " << err;
        return false;
    }
    volumes_.emplace_back(n, std::move(vol));
    return true;
}

LoopVolume *VolumeTest::Volume(int n) {
    for (auto &v : volumes_)
        if (v.first == n) return v.second.get();
    return nullptr;
}

}  // namespace orlotest
