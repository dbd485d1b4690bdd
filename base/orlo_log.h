/*
 * Logging for the library's own code.
 *
 * Every failure is logged once, where it happens, at LOG_ERR with the prefix
 * "iSCSI:<source file>:<line>:<function> ".  Lines go to syslog (the calling program's
 * identity and facility apply: the library never calls openlog) or, when a test has
 * installed one, to a capture sink.  "%m" is expanded with the errno of the moment the
 * line was logged, and logging never changes errno.
 */
#ifndef ORLO_BASE_ORLO_LOG_H
#define ORLO_BASE_ORLO_LOG_H

#include <syslog.h>

#include "olibc.h"

typedef void (*OrloLogSinkFn)(int priority, const char *line, void *ctx);

// Installs a sink that receives every line instead of syslog; NULL restores syslog.
void OrloLogSetSink(OrloLogSinkFn sink, void *ctx);

void OrloLog(int priority, const char *format, ...) __attribute__((format(printf, 2, 3)));

#define ORLO_LOG(prio, fmt, ...) \
    OrloLog((prio), "iSCSI:%s:%d:%s " fmt, __FILE_NAME__, __LINE__, __func__, ##__VA_ARGS__)
#define ORLO_LOG_ERR(fmt, ...) ORLO_LOG(LOG_ERR, fmt, ##__VA_ARGS__)

// The parameter-check failure of the call frame: one log line and platform code 0x0D00.
#define ORLO_LOG_BAD_PARAMS()                    \
    do {                                         \
        ORLO_LOG_ERR("Bad parameters");          \
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);        \
    } while (0)

// A lock file that could not be taken: the usual line, with the reason at its end when
// the lock was not simply busy (see orlo::LockFailureDetail).  Reads errno first.
#define ORLO_LOG_LOCK_FAILED(path)                                                         \
    do {                                                                                   \
        int orloLockErr_ = errno;                                                          \
        const char *orloLockPath_ = (path);                                                \
        std::string orloLockWhy_ = orlo::LockFailureDetail(orloLockPath_, orloLockErr_);   \
        ORLO_LOG_ERR("Failed to lock file: %s.%s", orloLockPath_, orloLockWhy_.c_str());   \
    } while (0)

// A failed platform call: its text, then the platform error, file and line.
#define ORLO_LOG_PLATFORM(fmt, ...)                                                          \
    do {                                                                                     \
        int orloPlatErr_ = OLIBCErrGet();                                                    \
        const char *orloPlatFile_ = OLIBCErrorGetFile();                                     \
        int orloPlatLine_ = OLIBCErrorGetLine();                                             \
        ORLO_LOG_ERR(fmt " failed, err=[0x%04X %s:%d]", ##__VA_ARGS__, orloPlatErr_, orloPlatFile_, \
                     orloPlatLine_);                                                         \
    } while (0)

#endif
