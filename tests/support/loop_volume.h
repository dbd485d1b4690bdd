// Loop-mounted volumes for tests: an image file formatted as Btrfs or ext4, attached to
// a free loop device and mounted at a chosen directory (usually <sandbox>/volumeN, so
// that the library sees it as "/volumeN").  The volume is always unmounted and its
// loop device detached and image removed, also when the test fails; a half-made volume
// is taken down before Create returns.
//
// Needs root, /dev/loop-control, the kernel's file system and mkfs.btrfs or mkfs.ext4.
// Tests ask LoopVolume::Unavailable first and skip with its message when it is not
// empty (ORLO_SKIP_UNLESS_LOOP_VOLUME does that).
#ifndef ORLO_TESTS_SUPPORT_LOOP_VOLUME_H
#define ORLO_TESTS_SUPPORT_LOOP_VOLUME_H

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "support/sandbox.h"

namespace orlotest {

class LoopVolume {
  public:
    enum class Fs { kBtrfs, kExt4 };

    LoopVolume() = default;
    LoopVolume(const LoopVolume &) = delete;
    LoopVolume &operator=(const LoopVolume &) = delete;
    ~LoopVolume() { Destroy(); }

    // Why volumes of this kind cannot be made on this machine; "" when they can.
    static std::string Unavailable(Fs fs);
    static const char *FsName(Fs fs);

    // Makes a sizeBytes image, formats it and mounts it at mountPoint (a real path,
    // made when missing).  False with *err set on failure; nothing is left behind.
    bool Create(Fs fs, uint64_t sizeBytes, const std::string &mountPoint, std::string *err);
    // Unmounts, detaches and removes the image; safe to call more than once.  False
    // when the file system could not be unmounted (then it is detached lazily).
    bool Destroy();

    bool mounted() const { return !mountPoint_.empty(); }
    const std::string &mount_point() const { return mountPoint_; }
    const std::string &device() const { return device_; }
    Fs fs() const { return fs_; }

  private:
    Fs fs_ = Fs::kBtrfs;
    std::string dir_;         // temporary directory holding the image
    std::string image_;
    std::string device_;      // "/dev/loopN"
    std::string mountPoint_;  // empty when not mounted
};

// A sandbox whose volumes are loop-mounted: MountVolume puts a fresh file system at
// <root>/volumeN; TearDown takes every volume down before the sandbox is removed.
class VolumeTest : public SandboxTest {
  protected:
    void TearDown() override;
    // Mounts a new volume at "/volume<n>" of the sandbox and returns true.  Use after
    // ORLO_SKIP_UNLESS_LOOP_VOLUME(fs).
    bool MountVolume(LoopVolume::Fs fs, uint64_t sizeBytes, int n = 1);
    LoopVolume *Volume(int n);

    std::vector<std::pair<int, std::unique_ptr<LoopVolume>>> volumes_;
};

}  // namespace orlotest

// Skips the current test with the reason when volumes of fs cannot be made here.
#define ORLO_SKIP_UNLESS_LOOP_VOLUME(fs)                                          \
    do {                                                                          \
        std::string orloWhy_ = ::orlotest::LoopVolume::Unavailable(fs);           \
        if (!orloWhy_.empty()) GTEST_SKIP() << orloWhy_;                          \
    } while (0)

#endif
