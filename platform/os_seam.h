/*
 * The OS seam: the one place where the library touches the machine by path.
 *
 * On the appliance every path is used as it stands.  When ORLO_SYSROOT is set (read
 * with secure_getenv at each call, so tests may move the root between tests) an
 * absolute path is taken to mean $ORLO_SYSROOT/<path>; /dev, /proc and /sys are never
 * mapped, nor are relative paths.  Programs started through the seam are mapped the
 * same way and run without a shell.  Callers always pass, log and return the logical
 * (appliance) path; only the seam sees the mapped one.
 *
 * Under a sandbox root the directories every appliance has (/tmp, /tmp/iscsi and its
 * lock directories, /usr/orlo/etc, /etc, /etc.defaults, /root, /var/run, /var/log, ...)
 * may be missing: a call that creates something beneath one of them (Open with O_CREAT,
 * Fopen for writing, Mkdir, Mkstemp, Mkfifo, Symlink) makes that directory inside the
 * root first when it has to.  Mount points (/config, /volumeN) are never made.  On the
 * appliance itself (no root) nothing is ever made implicitly.
 *
 * Nothing outside platform/ calls open, fopen, mkdir, stat, opendir, symlink, rename,
 * exec* or popen directly; a lint test keeps it so.  All functions are thread-safe and
 * set errno as the system call they wrap does (ENAMETOOLONG when a mapped path does
 * not fit PATH_MAX).
 */
#ifndef ORLO_PLATFORM_OS_SEAM_H
#define ORLO_PLATFORM_OS_SEAM_H

#include <dirent.h>
#include <stdio.h>
#include <string>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/statvfs.h>
#include <sys/types.h>
#include <vector>

namespace orlo {
namespace os {

// The sandbox root ("" when unset).
std::string SysRoot();
// Maps a logical path into out (size bytes).  0, or -1 with errno ENAMETOOLONG.
int MapPath(const char *logical, char *out, size_t size);
// Convenience form; an unmappable path yields "" with errno set.
std::string Map(const char *logical);
// The logical form of a mapped path (strips the root when the path lies under it).
std::string Unmap(const char *mapped);

int Open(const char *path, int flags, mode_t mode = 0);
int OpenAt(int dirfd, const char *name, int flags, mode_t mode = 0);  // name relative to dirfd
FILE *Fopen(const char *path, const char *mode);
int Mkdir(const char *path, mode_t mode);
int Rmdir(const char *path);
int Unlink(const char *path);
int Rename(const char *from, const char *to);
// Makes link pointing at target.  An absolute target is mapped too, so the link leads
// to the same object inside the sandbox.
int Symlink(const char *target, const char *link);
// Reads a link; an absolute content inside the sandbox is returned in logical form.
ssize_t Readlink(const char *path, char *buf, size_t size);
int Stat(const char *path, struct stat *st);
int Lstat(const char *path, struct stat *st);
int Access(const char *path, int mode);
DIR *Opendir(const char *path);
// tmpl is a logical path ending in "XXXXXX"; it is rewritten with the chosen name.
int Mkstemp(char *tmpl);
int Mkfifo(const char *path, mode_t mode);
int Statvfs(const char *path, struct statvfs *st);
int Statfs(const char *path, struct statfs *st);
int Truncate(const char *path, off_t length);
int Chmod(const char *path, mode_t mode);
int Chown(const char *path, uid_t uid, gid_t gid);
char *Realpath(const char *path, char *resolved);  // resolved holds the logical form

// Starts argv[0] (mapped) with argv, without a shell.  stdinFd/stdoutFd replace the
// child's standard input/output when 0 or more.  Returns the pid or -1.
pid_t Spawn(const std::vector<std::string> &argv, int stdinFd = -1, int stdoutFd = -1);
// Spawn and wait: the exit status (0..255), or -1 when it could not run or was killed.
int Run(const std::vector<std::string> &argv);

// The kernel's delete-module call.  Under a sandbox root it is answered by the
// simulated kernel target (its control file /config/.sim/modules).
int DeleteModule(const char *name, unsigned int flags);
// 1 when the kernel has the module inserted, 0 when not, -1 (errno set) when the
// module table cannot be read: /proc/modules, or under a sandbox root the simulated
// kernel target's table.
int ModuleLoaded(const char *name);

}  // namespace os
}  // namespace orlo

#endif
