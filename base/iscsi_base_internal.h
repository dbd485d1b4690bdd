/*
 * Internal helpers shared by the library's own code: the result-code decoder and the
 * scope guards that release descriptors, streams, lists, hashes and lock files on
 * every path out of a function.
 */
#ifndef ORLO_BASE_ISCSI_BASE_INTERNAL_H
#define ORLO_BASE_ISCSI_BASE_INTERNAL_H

#include <dirent.h>
#include <stdio.h>
#include <unistd.h>

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

// The numbers of the data volumes "/volumeN" at the root, ascending, into *out.  0, or
// 18990026 when the root cannot be listed (logged).
uint32_t VolumeNumbers(std::vector<int> *out);

}  // namespace orlo

#endif
