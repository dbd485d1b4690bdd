/*
 * The request loop of orlo-configfs-sim: how the FUSE requests of a mounted session
 * are read and answered.
 *
 * One thread reads every request and answers it at once.  A caller waits for each
 * answer, so a writer and the thread answering it take turns: on one CPU that turn is a
 * plain switch, while across two CPUs each request costs two wake-ups of an idle CPU
 * (tens of microseconds each on a virtual machine).  With one reading thread the
 * scheduler keeps the pair on one CPU once they are there, and the loop moves its
 * thread to the CPU of the process it serves when a single process has been its only
 * caller for a while and runs elsewhere.  Several reading threads would not do: the
 * kernel hands each request to whichever thread has waited longest.
 *
 * A request whose answer waits on the kernel (an invalidation waits for the kernel's
 * lock on the directory, which a caller may hold while it waits for an answer of ours)
 * must not hold up the reading thread, or the request it waits for would never be
 * read: handlers pass such work to Defer, which runs it on a helper thread.
 *
 * Run is called once, from the thread that owns the loop; Served and Defer are called
 * by request handlers, Served only on the reading thread.
 */
#ifndef ORLO_SIM_CONFIGFS_SIM_LOOP_H
#define ORLO_SIM_CONFIGFS_SIM_LOOP_H

#define FUSE_USE_VERSION 314

#include <fuse3/fuse_lowlevel.h>
#include <sched.h>
#include <sys/types.h>

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace orlosim {

class RequestLoop {
  public:
    // helpers: threads for deferred work (at least one); follow: move the reading
    // thread to its caller's CPU.
    RequestLoop(struct fuse_session *se, unsigned helpers, bool follow);
    // Lets the helpers finish what was deferred and joins them.
    ~RequestLoop();

    // Serves requests until the session ends: 0 when unmounted, the number of the
    // signal that ended it, or -errno.
    int Run();

    // Notes a request answered on the reading thread (its caller's thread id) and moves
    // the thread to that caller's CPU when due.
    void Served(pid_t caller);
    // Runs job on a helper thread.
    void Defer(std::function<void()> job);

    // The CPU a thread last ran on (from /proc), or -1.
    static int CpuOf(pid_t tid);

  private:
    void Helper();
    void FollowCaller(pid_t caller);

    struct fuse_session *se_;
    bool follow_;
    cpu_set_t allowed_;  // where the process may run; the thread returns to it after a move
    // The current sampling window: its start, its one caller so far (0: none, -1: more
    // than one).
    long long windowStartNs_ = 0;
    pid_t windowCaller_ = 0;

    std::mutex mu_;
    std::condition_variable wake_;
    std::deque<std::function<void()>> jobs_;
    bool stopping_ = false;
    std::vector<std::thread> helpers_;
};

}  // namespace orlosim

#endif
