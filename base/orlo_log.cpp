// Log sink of the library: syslog, or a capture sink installed by tests.
#include "base/orlo_log.h"

#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace {
struct Sink {
    OrloLogSinkFn fn;
    void *ctx;
};
std::atomic<Sink *> gSink{nullptr};
// Every sink ever installed stays allocated until exit: another thread may still be
// logging through one that has just been replaced.
std::mutex gSinksMu;
std::vector<std::unique_ptr<Sink>> gSinks;

// Replaces every "%m" (but not "%%m") with the error text, so that the formatted line
// reads exactly as syslog would print it.
std::string ExpandErrno(const char *format, int savedErrno) {
    std::string out;
    char buf[256];
    const char *err = strerror_r(savedErrno, buf, sizeof(buf));
    for (const char *p = format; *p != '\0'; ++p) {
        if (p[0] == '%' && p[1] == '%') {
            out += "%%";
            ++p;
        } else if (p[0] == '%' && p[1] == 'm') {
            for (const char *e = err; *e != '\0'; ++e) {
                if (*e == '%') out += '%';
                out += *e;
            }
            ++p;
        } else {
            out += *p;
        }
    }
    return out;
}
}  // namespace

void OrloLogSetSink(OrloLogSinkFn sink, void *ctx) {
    Sink *fresh = nullptr;
    if (sink != nullptr) {
        std::lock_guard<std::mutex> lock(gSinksMu);
        gSinks.push_back(std::unique_ptr<Sink>(new Sink{sink, ctx}));
        fresh = gSinks.back().get();
    }
    gSink.store(fresh);
}

void OrloLog(int priority, const char *format, ...) {
    int savedErrno = errno;
    std::string fmt = ExpandErrno(format, savedErrno);
    char line[2048];
    va_list ap;
    va_start(ap, format);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    vsnprintf(line, sizeof(line), fmt.c_str(), ap);
#pragma GCC diagnostic pop
    va_end(ap);
    Sink *sink = gSink.load();
    if (sink != nullptr) {
        sink->fn(priority, line, sink->ctx);
    } else {
        syslog(priority, "%s", line);
    }
    errno = savedErrno;
}
