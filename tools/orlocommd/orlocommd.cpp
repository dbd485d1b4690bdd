// orlocommd: the messaging engine as a service.  It listens on its request FIFO for the
// applications of this appliance and on TCP port 3262 for the engines of others, until
// SIGTERM, SIGINT or SIGHUP, when every application is told the engine stops and the
// engine's own FIFO and pid file are removed.
//
//   orlocommd [--root DIR] [--foreground] [--verbose]
//
// Without --foreground it detaches once the engine is ready to serve (its FIFO made, its
// port bound, its pid file written), so a script may use it as soon as the command returns.
#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>

#include "comm/orlocomm_internal.h"
#include "orlocomm.h"
#include "platform/os_seam.h"

namespace {

int gStopPipe[2] = {-1, -1};

void OnSignal(int) {
    int saved = errno;
    char c = 's';
    ssize_t n = write(gStopPipe[1], &c, 1);
    (void)n;
    errno = saved;
}

// Waits for a stop request and stops the dispatch loop (which tells every application).
void *StopWatcher(void *arg) {
    auto *eng = static_cast<ORLOCOMM_ENG *>(arg);
    char c = 0;
    while (read(gStopPipe[0], &c, 1) < 0 && errno == EINTR) {
    }
    if (c == 's') {
        syslog(LOG_NOTICE, "stopping");
        StopEngCommPipeServer(eng);
    }
    return nullptr;
}

void RedirectStdio() {
    int fd = orlo::os::Open("/dev/null", O_RDWR);
    if (fd < 0) return;
    dup2(fd, STDIN_FILENO);
    dup2(fd, STDOUT_FILENO);
    dup2(fd, STDERR_FILENO);
    if (fd > STDERR_FILENO) close(fd);
}

// Detaches: the caller's process waits until the engine says it is ready (or failed) and
// exits with that outcome.  Returns the write end of the readiness pipe in the daemon.
int Daemonize() {
    int ready[2];
    if (pipe(ready) != 0) {
        perror("orlocommd: pipe");
        exit(1);
    }
    pid_t pid = fork();
    if (pid < 0) {
        perror("orlocommd: fork");
        exit(1);
    }
    if (pid > 0) {
        close(ready[1]);
        char status = 1;
        ssize_t n;
        while ((n = read(ready[0], &status, 1)) < 0 && errno == EINTR) {
        }
        if (n != 1) status = 1;
        waitpid(pid, nullptr, 0);
        exit(status == 0 ? 0 : 1);
    }
    close(ready[0]);
    setsid();
    pid = fork();
    if (pid < 0) exit(1);
    if (pid > 0) _exit(0);  // the first child leaves; the grandchild is the daemon
    if (chdir("/") != 0) {
    }
    return ready[1];
}

void Tell(int fd, char status) {
    if (fd < 0) return;
    ssize_t n = write(fd, &status, 1);
    (void)n;
    close(fd);
}

}  // namespace

int main(int argc, char **argv) {
    CLI::App app{"orlocommd: the orlocomm messaging engine (FIFOs under /tmp, TCP port 3262)"};
    std::string root;
    bool foreground = false;
    bool verbose = false;
    app.add_option("--root", root, "work on the appliance tree under DIR (sets ORLO_SYSROOT)")->check(CLI::ExistingDirectory);
    app.add_flag("--foreground", foreground, "stay in the foreground and log to standard error as well");
    app.add_flag("--verbose", verbose, "log the engine's progress lines (priority info) too");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &e) {
        return app.exit(e) == 0 ? 0 : 2;
    }
    if (!root.empty()) {
        // The daemon leaves its working directory: the root is kept absolute.
        setenv("ORLO_SYSROOT", std::filesystem::absolute(root).lexically_normal().c_str(), 1);
    }
    int mask = verbose ? LOG_UPTO(LOG_DEBUG) : LOG_UPTO(LOG_NOTICE);
    OrloCommSetLogMask(mask);
    setlogmask(mask);
    openlog("orlocommd", LOG_PID | (foreground ? LOG_PERROR : 0), LOG_DAEMON);

    if (IsServiceAlive(ORLOCOMM_PID_FILE)) {
        fprintf(stderr, "orlocommd: an engine already runs (pid file %s)\n", ORLOCOMM_PID_FILE);
        return 1;
    }
    int ready = -1;
    if (!foreground) {
        ready = Daemonize();
        RedirectStdio();
    }
    if (pipe2(gStopPipe, O_CLOEXEC) != 0) {
        syslog(LOG_ERR, "pipe failed: %m");
        Tell(ready, 1);
        return 1;
    }
    if (CreatePidFile(ORLOCOMM_PID_FILE) != 0) {
        syslog(LOG_ERR, "cannot write the pid file %s", ORLOCOMM_PID_FILE);
        Tell(ready, 1);
        return 1;
    }
    ORLOCOMM_ENG *eng = nullptr;
    bool ok = CreateLocalOrloCommCountFile() == 0 && (eng = CreateEngComm()) != nullptr;
    ok = ok && SetSignalAction(OnSignal) == 0 && StartEngCommSockServer(eng) == 0;
    pthread_t watcher;
    ok = ok && pthread_create(&watcher, nullptr, StopWatcher, eng) == 0;
    if (!ok) {
        syslog(LOG_ERR, "the engine could not start");
        if (eng != nullptr) {
            StopEngCommSockServer(eng);
            eng->prqrx->transport->stop_service(eng->prqrx);
            ReleaseEngComm(eng);
        }
        orlo::os::Unlink(ORLOCOMM_PID_FILE);
        Tell(ready, 1);
        return 1;
    }
    syslog(LOG_NOTICE, "serving (pid %d)", static_cast<int>(getpid()));
    if (foreground) {
        printf("orlocommd: serving, pid %d\n", static_cast<int>(getpid()));
        fflush(stdout);
    }
    Tell(ready, 0);
    StartEngCommPipeServer(eng);
    // The loop ended: by a stop request, or because its FIFO failed (then the watcher is
    // told to stop everything too).
    OnSignal(0);
    pthread_join(watcher, nullptr);
    StopEngCommSockServer(eng);
    ReleaseEngComm(eng);
    FreeSignalAction();
    orlo::os::Unlink(ORLOCOMM_PID_FILE);
    syslog(LOG_NOTICE, "stopped");
    return 0;
}
