/*
 * Internal helpers shared by the library's own code: the result-code decoder and the
 * scope guards that release descriptors, streams, lists, hashes and lock files on
 * every path out of a function.
 */
#ifndef ORLO_BASE_ISCSI_BASE_INTERNAL_H
#define ORLO_BASE_ISCSI_BASE_INTERNAL_H

#include <dirent.h>
#include <errno.h>
#include <stdio.h>
#include <unistd.h>

#include <string>
#include <utility>
#include <vector>

#include "base/orlo_log.h"
#include "olibc.h"
#include "orloiscsi_base.h"

// The message of a result code; never NULL.
const char *ORLOiSCSIErrStr(unsigned int code);

namespace orlo {

// Runs a callable when the scope ends, unless dismissed.
template <typename F>
class ScopeExit {
  public:
    explicit ScopeExit(F f) : f_(std::move(f)) {}
    ScopeExit(const ScopeExit &) = delete;
    ScopeExit &operator=(const ScopeExit &) = delete;
    ~ScopeExit() {
        if (active_) f_();
    }
    void Dismiss() { active_ = false; }

  private:
    F f_;
    bool active_ = true;
};
template <typename F>
ScopeExit<F> MakeScopeExit(F f) {
    return ScopeExit<F>(std::move(f));
}

// Owns a file descriptor.
class FdGuard {
  public:
    explicit FdGuard(int fd = -1) : fd_(fd) {}
    FdGuard(const FdGuard &) = delete;
    FdGuard &operator=(const FdGuard &) = delete;
    ~FdGuard() {
        if (fd_ >= 0) ::close(fd_);
    }
    int get() const { return fd_; }
    void reset(int fd = -1) {
        if (fd_ >= 0) ::close(fd_);
        fd_ = fd;
    }
    // Gives the descriptor up; the caller closes it (and checks the result).
    int release() {
        int fd = fd_;
        fd_ = -1;
        return fd;
    }

  private:
    int fd_;
};

// Owns a stdio stream.
class FileGuard {
  public:
    explicit FileGuard(FILE *f = nullptr) : f_(f) {}
    FileGuard(const FileGuard &) = delete;
    FileGuard &operator=(const FileGuard &) = delete;
    ~FileGuard() {
        if (f_ != nullptr) fclose(f_);
    }
    FILE *get() const { return f_; }
    FILE *release() {
        FILE *f = f_;
        f_ = nullptr;
        return f;
    }

  private:
    FILE *f_;
};

// Owns an open directory stream.
class DirGuard {
  public:
    explicit DirGuard(DIR *d = nullptr) : d_(d) {}
    DirGuard(const DirGuard &) = delete;
    DirGuard &operator=(const DirGuard &) = delete;
    ~DirGuard() {
        if (d_ != nullptr) closedir(d_);
    }
    DIR *get() const { return d_; }

  private:
    DIR *d_;
};

// Owns a platform string list (the pointer may move when the list grows).
class SzListGuard {
  public:
    explicit SzListGuard(POLIBC_SZLIST p = nullptr) : p_(p) {}
    SzListGuard(const SzListGuard &) = delete;
    SzListGuard &operator=(const SzListGuard &) = delete;
    ~SzListGuard() { OLIBCSzListFree(p_); }
    POLIBC_SZLIST get() const { return p_; }
    POLIBC_SZLIST *addr() { return &p_; }
    POLIBC_SZLIST release() {
        POLIBC_SZLIST p = p_;
        p_ = nullptr;
        return p;
    }

  private:
    POLIBC_SZLIST p_;
};

// Owns a platform string hash.
class SzHashGuard {
  public:
    explicit SzHashGuard(POLIBC_SZHASH p = nullptr) : p_(p) {}
    SzHashGuard(const SzHashGuard &) = delete;
    SzHashGuard &operator=(const SzHashGuard &) = delete;
    ~SzHashGuard() { OLIBCSzHashFree(p_); }
    POLIBC_SZHASH get() const { return p_; }
    POLIBC_SZHASH *addr() { return &p_; }

  private:
    POLIBC_SZHASH p_;
};

// Holds a lock file for the scope: takes it in the constructor (check held()) and
// releases it on the way out, logging a failed release without changing any result.
class FileLockGuard {
  public:
    FileLockGuard(const char *lockPath, bool exclusive, int timeoutSec);
    FileLockGuard(const FileLockGuard &) = delete;
    FileLockGuard &operator=(const FileLockGuard &) = delete;
    ~FileLockGuard();
    bool held() const { return handle_ >= 0; }

  private:
    const char *path_;
    int handle_ = -1;
};

// Why a lock file could not be taken, for the end of the "Failed to lock file" line: ""
// when it was busy until the time-out (err ETIMEDOUT), otherwise what stands in its place
// (" It is a symbolic link, not a regular file." ...) or the errno text.  A lock file that
// is not a regular file is never followed or replaced: it blocks every user until an
// administrator removes it, so the line says exactly what it is.
std::string LockFailureDetail(const char *lockPath, int err);

// Whether the last failed lock attempt (errno err) was a time-out rather than a lock file
// that cannot be used.
inline bool LockTimedOut(int err) { return err == ETIMEDOUT || err == EWOULDBLOCK || err == EINTR; }

// Holds a lock file for the scope and may be taken again by the same thread while held
// (each nested take is free and the file is released when the outermost guard goes).
// Used for the locks that an operation takes and then calls other operations that take
// them too; another thread or process is excluded as by FileLockGuard.
class ReentrantLockGuard {
  public:
    ReentrantLockGuard(const char *lockPath, int timeoutSec);
    ReentrantLockGuard(const ReentrantLockGuard &) = delete;
    ReentrantLockGuard &operator=(const ReentrantLockGuard &) = delete;
    ~ReentrantLockGuard();
    bool held() const { return held_; }

  private:
    std::string path_;
    bool held_ = false;
};

// The target lock: any change to targets, their mappings or access lists, in the files
// and in the kernel, and the deletion or unloading of a LUN (which must not race a
// mapping), runs under it, so that picking a free tid, name or LUN number and writing it
// are one step, and the kernel and the files never see two changes interleaved.  See
// docs/locks.md for where it stands in the lock order.
constexpr const char kTargetLockPath[] = "/tmp/iscsi/iscsi_target_op.lock";
constexpr int kTargetLockTimeoutSec = 60;

// Whether the n bytes at s are well-formed UTF-8 (no overlong forms, no surrogates).
bool IsUtf8(const char *s, size_t n);

// The numbers of the data volumes "/volumeN" at the root, ascending, into *out.  0, or
// 18990026 when the root cannot be listed (logged).
uint32_t VolumeNumbers(std::vector<int> *out);

}  // namespace orlo

#endif
