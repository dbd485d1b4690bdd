/*
 * The request loop: one reading thread that follows its caller's CPU, and helper
 * threads for the work that may wait on the kernel.
 */
#include "configfs_sim_loop.h"

#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace orlosim {

namespace {

// How long one caller must have been the only one before the thread moves to its CPU,
// and how often a move is considered at most (each look costs a read of /proc).
const long long kWindowNs = 2000000;

long long MonotonicNs() {
    struct timespec t;
    clock_gettime(CLOCK_MONOTONIC, &t);
    return static_cast<long long>(t.tv_sec) * 1000000000LL + t.tv_nsec;
}

}  // namespace

RequestLoop::RequestLoop(struct fuse_session *se, unsigned helpers, bool follow) : se_(se), follow_(follow) {
    CPU_ZERO(&allowed_);
    if (follow_ && sched_getaffinity(0, sizeof(allowed_), &allowed_) != 0) follow_ = false;
    if (helpers == 0) helpers = 1;
    // Signals are for the reading thread: SIGTERM must interrupt its read to end the
    // loop, so the helpers start with every signal blocked.
    sigset_t all, old;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, &old);
    for (unsigned i = 0; i < helpers; ++i) helpers_.emplace_back(&RequestLoop::Helper, this);
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
}

RequestLoop::~RequestLoop() {
    {
        std::lock_guard<std::mutex> lock(mu_);
        stopping_ = true;
    }
    wake_.notify_all();
    for (std::thread &t : helpers_) t.join();
}

int RequestLoop::Run() { return fuse_session_loop(se_); }

void RequestLoop::Defer(std::function<void()> job) {
    {
        std::lock_guard<std::mutex> lock(mu_);
        jobs_.push_back(std::move(job));
    }
    wake_.notify_one();
}

void RequestLoop::Helper() {
    std::unique_lock<std::mutex> lock(mu_);
    while (true) {
        wake_.wait(lock, [this] { return stopping_ || !jobs_.empty(); });
        if (jobs_.empty()) return;  // stopping, and nothing left to answer
        std::function<void()> job = std::move(jobs_.front());
        jobs_.pop_front();
        lock.unlock();
        job();
        lock.lock();
    }
}

void RequestLoop::Served(pid_t caller) {
    if (!follow_ || caller <= 0) return;
    long long now = MonotonicNs();
    if (windowCaller_ == 0) {
        windowCaller_ = caller;
        windowStartNs_ = now;
        return;
    }
    if (windowCaller_ != caller) windowCaller_ = -1;
    if (now - windowStartNs_ < kWindowNs) return;
    if (windowCaller_ == caller) FollowCaller(caller);
    windowCaller_ = 0;
}

// Pinning the thread to one CPU moves it there at once; the process's own set is put
// back right after, so the scheduler stays free to move it again.
void RequestLoop::FollowCaller(pid_t caller) {
    int cpu = CpuOf(caller);
    int here = sched_getcpu();
    if (cpu < 0 || here < 0 || cpu == here || cpu >= CPU_SETSIZE || !CPU_ISSET(cpu, &allowed_)) return;
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(cpu, &one);
    if (sched_setaffinity(0, sizeof(one), &one) == 0) sched_setaffinity(0, sizeof(allowed_), &allowed_);
}

// Field 39 of /proc/TID/stat; the command name (field 2) may hold spaces and
// parentheses, so fields are counted from its closing parenthesis.
int RequestLoop::CpuOf(pid_t tid) {
    char path[64];
    snprintf(path, sizeof(path), "/proc/%d/stat", static_cast<int>(tid));
    int fd = ::open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) return -1;
    char buf[1024];
    ssize_t n = ::read(fd, buf, sizeof(buf) - 1);
    ::close(fd);
    if (n <= 0) return -1;
    buf[n] = '\0';
    const char *p = strrchr(buf, ')');
    if (p == nullptr) return -1;
    int field = 2;
    for (++p; *p != '\0'; ++p) {
        if (*p != ' ') continue;
        if (++field == 39) {
            char *end = nullptr;
            long cpu = strtol(p + 1, &end, 10);
            return end != p + 1 && cpu >= 0 ? static_cast<int>(cpu) : -1;
        }
    }
    return -1;
}

}  // namespace orlosim
