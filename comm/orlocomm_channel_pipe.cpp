// The pipe transport: channels over FIFOs on one host.  The end that reads a FIFO makes it
// (mode 0620) and keeps a second, write-only descriptor so that it never sees end of file;
// the writing end opens it write-only.  The engine's request FIFO is written by every
// application: each writer holds an exclusive flock on the FIFO around a frame so that
// frames of different writers never interleave, however full the pipe is.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "comm/orlocomm_internal.h"
#include "platform/os_seam.h"

namespace {

const char *EndName(int end) { return end == ORLOCOMM_SERVER_END ? "SERVER_END" : "CLIENT_END"; }

ORLOCOMM_PIPE *NewPipe(const char *path) {
    auto *p = static_cast<ORLOCOMM_PIPE *>(calloc(1, sizeof(ORLOCOMM_PIPE)));
    if (p == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    p->read_fd = p->write_fd = -1;
    snprintf(p->path, sizeof(p->path), "%s", path);
    orlocomm::QueueInit(&p->queue);
    p->read_timeout_ms = orlocomm::kPipeFrameTimeoutMs;
    return p;
}

void ClosePipe(ORLOCOMM_PIPE *p) {
    if (p->read_fd >= 0) close(p->read_fd);
    if (p->write_fd >= 0) close(p->write_fd);
    p->read_fd = p->write_fd = -1;
}

// Frames can be larger than the pipe's atomic write size, so writers of the shared request
// FIFO take an exclusive flock on the FIFO around each frame: frames of different
// applications never interleave.  Processes coordinate through lock files, never through
// shared memory; the kernel drops the lock of a writer that dies.
void LockWriters(ORLOCOMM_PIPE *p) {
    while (flock(p->write_fd, LOCK_EX) != 0 && errno == EINTR) {
    }
}

void UnlockWriters(ORLOCOMM_PIPE *p) { flock(p->write_fd, LOCK_UN); }

bool IsFifo(int fd, const char *path) {
    struct stat st;
    if (fstat(fd, &st) != 0 || !S_ISFIFO(st.st_mode)) {
        COMM_ERR("%s is not a FIFO", path);
        return false;
    }
    return true;
}

// The reading end: makes the FIFO (0620 whatever the umask) or takes the one there, opens it
// for reading and keeps a write-only descriptor beside.
ORLOCOMM_PIPE *OpenServerPipe(const char *path) {
    ORLOCOMM_PIPE *p = NewPipe(path);
    if (p == nullptr) return nullptr;
    if (orlo::os::Mkfifo(path, ORLOCOMM_FIFO_MODE) == 0) {
        if (orlo::os::Chmod(path, ORLOCOMM_FIFO_MODE) != 0) COMM_ERR("chmod(\"%s\", 0620) failed, err=%m", path);
    } else if (errno != EEXIST) {
        COMM_ERR("mkfifo(\"%s\", 0620) failed, err=%m", path);
        free(p);
        return nullptr;
    }
    p->read_fd = orlo::os::Open(path, O_RDWR | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC);
    if (p->read_fd < 0) {
        COMM_ERR("open(\"%s\", O_RDWR) failed, err=%m", path);
        free(p);
        return nullptr;
    }
    if (!IsFifo(p->read_fd, path)) {
        ClosePipe(p);
        free(p);
        return nullptr;
    }
    p->write_fd = orlo::os::Open(path, O_WRONLY | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC);
    if (p->write_fd < 0) {
        COMM_ERR("open(\"%s\", O_WRONLY) failed, err=%m", path);
        ClosePipe(p);
        free(p);
        return nullptr;
    }
    signal(SIGPIPE, SIG_IGN);
    p->server = 1;
    return p;
}

ORLOCOMM_PIPE *OpenClientPipe(const char *path) {
    ORLOCOMM_PIPE *p = NewPipe(path);
    if (p == nullptr) return nullptr;
    p->write_fd = orlo::os::Open(path, O_WRONLY | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC);
    if (p->write_fd < 0 || !IsFifo(p->write_fd, path)) {
        COMM_ERR("Client %s open fail", path);
        ClosePipe(p);
        free(p);
        return nullptr;
    }
    COMM_INFO("Client %s open success", path);
    signal(SIGPIPE, SIG_IGN);
    return p;
}

ORLOCOMM_PIPE *OpenPipe(ORLOCOMM_CHANNEL *ch, bool request) {
    char path[4096];
    if (GetPipePath(ch->desc->id.owner, request ? 1 : 0, path, sizeof(path)) != 0) return nullptr;
    // Requests are read by the server end, responses by the client end.
    bool reader = request == (ch->desc->end == ORLOCOMM_SERVER_END);
    ORLOCOMM_PIPE *p = reader ? OpenServerPipe(path) : OpenClientPipe(path);
    if (p != nullptr && request && ch->desc->id.owner < 0) p->shared = 1;
    return p;
}

int WaitFd(int fd, short events, int timeoutMs) {
    struct pollfd pfd = {fd, events, 0};
    for (;;) {
        int r = poll(&pfd, 1, timeoutMs);
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) return r;
        if (pfd.revents & events) return 1;
        return -1;  // error or hang-up without the event
    }
}

}  // namespace

extern "C" {

// The FIFO of a channel's owner: the engine's control (-2) and message (-1) servers have
// fixed names, every other owner its own numbered pair.
ORLO_EXPORT int GetPipePath(int owner, int request, char *out, size_t size) {
    int n;
    if (owner == ORLOCOMM_OWNER_CTL_SERVER)
        n = snprintf(out, size, "%s", request ? ORLOCOMM_PIPE_SVR_CTL_REQ : ORLOCOMM_PIPE_SVR_CTL_REP);
    else if (owner == ORLOCOMM_OWNER_MSG_SERVER)
        n = snprintf(out, size, "%s", request ? ORLOCOMM_PIPE_SVR_MSG_REQ : ORLOCOMM_PIPE_SVR_MSG_REP);
    else
        n = snprintf(out, size, request ? ORLOCOMM_PIPE_REQ_FMT : ORLOCOMM_PIPE_REP_FMT, owner);
    return n > 0 && static_cast<size_t>(n) < size ? 0 : -1;
}

ORLO_EXPORT ORLOCOMM_CHANNEL *orlocomm_pipe_construct(const char *name, int owner, int end, int type) {
    if (type == ORLOCOMM_PIPE_TYPE_MSG_SERVER) owner = ORLOCOMM_OWNER_MSG_SERVER;
    return orlocomm_base_construct(name, owner, end, &pipe_channel_transport);
}

ORLO_EXPORT void orlocomm_pipe_destruct(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return;
    orlocomm_pipe_stop_service(ch);
    for (void *m : {ch->request, ch->response}) {
        if (m == nullptr) continue;
        auto *p = static_cast<ORLOCOMM_PIPE *>(m);
        orlocomm::QueueFreeAll(&p->queue);
        free(p);
    }
    ch->request = ch->response = nullptr;
    ch->has_request = ch->has_response = 0;
    orlocomm_base_destruct(ch);
}

// Closes the channel's descriptors; the FIFOs it made are removed.
ORLO_EXPORT int orlocomm_pipe_stop_service(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return -1;
    orlocomm::MutexGuard gs(&ch->send_mutex);
    for (void *m : {ch->request, ch->response}) {
        if (m == nullptr) continue;
        auto *p = static_cast<ORLOCOMM_PIPE *>(m);
        bool open = p->read_fd >= 0 || p->write_fd >= 0;
        ClosePipe(p);
        if (open && p->server) {
            COMM_INFO(">>>>>>>>>>>>>>>>>>>>> unlink %s", p->path);
            if (orlo::os::Unlink(p->path) != 0 && errno != ENOENT) COMM_ERR("unlink(\"%s\") failed, err=%m", p->path);
        }
    }
    return 0;
}

ORLO_EXPORT int orlocomm_pipe_internal_request(ORLOCOMM_CHANNEL *ch, const char *) {
    if (ch == nullptr) return -1;
    ORLOCOMM_PIPE *p = OpenPipe(ch, true);
    if (p == nullptr) return -1;
    COMM_INFO("%s request_channel, name=%s", EndName(ch->desc->end), p->path);
    return orlocomm_pipe_internal_request_media(ch, p);
}

ORLO_EXPORT int orlocomm_pipe_internal_response(ORLOCOMM_CHANNEL *ch, const char *) {
    if (ch == nullptr) return -1;
    ORLOCOMM_PIPE *p = OpenPipe(ch, false);
    if (p == nullptr) return -1;
    COMM_INFO("%s response_channel, name=%s", EndName(ch->desc->end), p->path);
    return orlocomm_pipe_internal_response_media(ch, p);
}

ORLO_EXPORT int orlocomm_pipe_internal_request_media(ORLOCOMM_CHANNEL *ch, void *media) {
    if (ch == nullptr || media == nullptr || ch->request != nullptr) return -1;
    ch->request = media;
    ch->has_request = 1;
    return 0;
}

ORLO_EXPORT int orlocomm_pipe_internal_response_media(ORLOCOMM_CHANNEL *ch, void *media) {
    if (ch == nullptr || media == nullptr || ch->response != nullptr) return -1;
    ch->response = media;
    ch->has_response = 1;
    return 0;
}

// Writes one whole frame; a reader that takes nothing for kWriteTimeoutMs fails it.
ORLO_EXPORT int orlocomm_pipe_write(void *media, const void *buf, int len) {
    auto *p = static_cast<ORLOCOMM_PIPE *>(media);
    if (p == nullptr || buf == nullptr || len <= 0 || p->write_fd < 0) return -1;
    int fd = p->write_fd;
    if (p->shared) LockWriters(p);
    const auto *bytes = static_cast<const uint8_t *>(buf);
    int done = 0;
    int64_t deadline = orlocomm::NowMs() + orlocomm::kWriteTimeoutMs;
    int err = 0;
    while (done < len) {
        ssize_t n = write(fd, bytes + done, static_cast<size_t>(len - done));
        if (n > 0) {
            done += static_cast<int>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && errno != EAGAIN) {
            err = errno;
            break;
        }
        int64_t left = deadline - orlocomm::NowMs();
        if (left <= 0 || WaitFd(fd, POLLOUT, static_cast<int>(left)) <= 0) {
            err = ETIMEDOUT;
            break;
        }
    }
    if (p->shared) UnlockWriters(p);
    if (done < len) {
        errno = err;
        COMM_ERR("write(%s) of %d bytes stopped at %d, err=%m", p->path, len, done);
    }
    return done > 0 ? done : -1;
}

// Reads exactly len bytes (the buffer is zeroed first).  The first byte of a frame is
// waited for as long as it takes; the rest of a started frame for read_timeout_ms.  Fewer
// bytes than asked mark the medium short.  What the descriptor gives beyond the bytes asked
// for is kept for the next read: a FIFO has one reader, and a frame costs one read.
ORLO_EXPORT int orlocomm_pipe_read(void *media, void *buf, int len) {
    auto *p = static_cast<ORLOCOMM_PIPE *>(media);
    if (p == nullptr || buf == nullptr || len <= 0 || p->read_fd < 0) return -1;
    memset(buf, 0, static_cast<size_t>(len));
    auto *bytes = static_cast<uint8_t *>(buf);
    int got = 0;
    int64_t deadline = 0;
    while (got < len) {
        if (p->rbuf_off < p->rbuf_len) {
            int take = std::min(len - got, p->rbuf_len - p->rbuf_off);
            memcpy(bytes + got, p->rbuf + p->rbuf_off, static_cast<size_t>(take));
            p->rbuf_off += take;
            got += take;
            p->frame_started = 1;
            continue;
        }
        p->rbuf_off = p->rbuf_len = 0;
        ssize_t n = read(p->read_fd, p->rbuf, sizeof(p->rbuf));
        if (n > 0) {
            p->rbuf_len = static_cast<int32_t>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n == 0 || errno != EAGAIN) break;
        int timeout = -1;
        if (p->frame_started) {
            if (deadline == 0) deadline = orlocomm::NowMs() + p->read_timeout_ms;
            int64_t left = deadline - orlocomm::NowMs();
            if (left <= 0) break;
            timeout = static_cast<int>(left);
        }
        if (WaitFd(p->read_fd, POLLIN, timeout) <= 0) break;
    }
    if (got < len) p->short_read = 1;
    return got;
}

const ORLOCOMM_TRANSPORT pipe_channel_transport = {
    ORLOCOMM_TRANSPORT_PIPE,
    orlocomm_pipe_construct,
    orlocomm_pipe_destruct,
    nullptr,
    orlocomm_pipe_stop_service,
    orlocomm_pipe_internal_request,
    orlocomm_pipe_internal_response,
    orlocomm_pipe_internal_request_media,
    orlocomm_pipe_internal_response_media,
    orlocomm_base_external_request,
    orlocomm_base_external_response,
    orlocomm_pipe_write,
    orlocomm_pipe_read,
    orlocomm_base_send_msg,
    orlocomm_base_recv_msg,
};

}  // extern "C"

namespace orlocomm {

int PipeDrain(ORLOCOMM_PIPE *p) {
    if (p == nullptr || p->read_fd < 0) return 0;
    uint8_t scratch[4096];
    int total = p->rbuf_len - p->rbuf_off;
    p->rbuf_off = p->rbuf_len = 0;
    for (;;) {
        ssize_t n = read(p->read_fd, scratch, sizeof(scratch));
        if (n > 0) {
            total += static_cast<int>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        break;
    }
    return total;
}

}  // namespace orlocomm
