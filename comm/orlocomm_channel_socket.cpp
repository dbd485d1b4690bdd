// The socket transport: channels over TCP between the engines of two hosts, port 3262.
// The server end listens and serves each accepted connection on a detached thread of its
// own (at most kMaxConnections at once); the client end connects with a 10-second limit.
// Reads wait for the first byte of a frame as long as the caller wants and for its rest
// kFrameTimeoutMs; a frame whose code the engine does not know is never sent nor accepted.
#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>

#include "comm/orlocomm_internal.h"

namespace {

std::mutex gListenMu;
pthread_t gListenThread;
bool gListenRunning = false;

std::mutex gSlotsMu;
std::condition_variable gSlotsCv;
int gSlotsUsed = 0;

ORLOCOMM_SOCKET *NewSocket(int fd) {
    auto *s = static_cast<ORLOCOMM_SOCKET *>(calloc(1, sizeof(ORLOCOMM_SOCKET)));
    if (s == nullptr) return nullptr;
    s->sock_fd = fd;
    s->conn_fd = -1;
    s->frame_timeout_ms = orlocomm::kFrameTimeoutMs;
    return s;
}

int FdOf(const ORLOCOMM_SOCKET *s) { return s->conn_fd >= 0 ? s->conn_fd : s->sock_fd; }

void ReapChildren(int) {
    int saved = errno;
    while (waitpid(-1, nullptr, WNOHANG) > 0) {
    }
    errno = saved;
}

void SetNoDelay(int fd) {
    int one = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof(one));
}

int WaitFd(int fd, short events, int timeoutMs) {
    struct pollfd pfd = {fd, events, 0};
    for (;;) {
        int r = poll(&pfd, 1, timeoutMs);
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) return r;
        if (pfd.revents & events) return 1;
        return -1;
    }
}

int OpenListener(ORLOCOMM_SOCKET **out) {
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        COMM_ERR("socket(AF_INET, SOCK_STREAM) failed, err=%m");
        return -1;
    }
    int one = 1;
    setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof(one));
    struct sockaddr_in addr;
    memset(&addr, 0, sizeof(addr));
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_ANY);
    addr.sin_port = htons(ORLOCOMM_PORT);
    // An engine that cannot have its port is of no use to the other hosts: it says so.
    if (bind(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof(addr)) != 0) {
        COMM_ERR("bind(%d, 0.0.0.0:%d) failed, err=%m", fd, ORLOCOMM_PORT);
        close(fd);
        return -1;
    }
    if (listen(fd, 10) != 0) {
        COMM_ERR("Error listening");
        close(fd);
        return -1;
    }
    struct sigaction sa;
    memset(&sa, 0, sizeof(sa));
    sa.sa_handler = ReapChildren;
    sa.sa_flags = SA_RESTART;
    sigemptyset(&sa.sa_mask);
    sigaction(SIGCHLD, &sa, nullptr);
    ORLOCOMM_SOCKET *s = NewSocket(fd);
    if (s == nullptr) {
        COMM_ERR("Out of memory. Failed to allocate memory for ORLOCOMM_SOCKET");
        close(fd);
        return -1;
    }
    s->addr = addr;
    snprintf(s->name, sizeof(s->name), "0.0.0.0:%d", ORLOCOMM_PORT);
    *out = s;
    return 0;
}

int Connect(const char *addr, ORLOCOMM_SOCKET **out) {
    struct sockaddr_in sin;
    memset(&sin, 0, sizeof(sin));
    sin.sin_family = AF_INET;
    sin.sin_port = htons(ORLOCOMM_PORT);
    if (addr == nullptr || inet_pton(AF_INET, addr, &sin.sin_addr) != 1) {
        COMM_ERR("Invalid address %s", addr == nullptr ? "(null)" : addr);
        return -1;
    }
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        COMM_ERR("socket(AF_INET, SOCK_STREAM) failed, err=%m");
        return -1;
    }
    int flags = fcntl(fd, F_GETFL);
    fcntl(fd, F_SETFL, flags | O_NONBLOCK);
    COMM_INFO("Try to connect ip %s", addr);
    int status = 0;
    if (connect(fd, reinterpret_cast<struct sockaddr *>(&sin), sizeof(sin)) != 0) {
        if (errno != EINPROGRESS) {
            COMM_ERR("Connect Failed, %d - %s", errno, strerror(errno));
            close(fd);
            return -1;
        }
        COMM_INFO("Connect InProgress");
        int r = WaitFd(fd, POLLOUT, orlocomm::kConnectTimeoutSec * 1000);
        int err = 0;
        socklen_t len = sizeof(err);
        getsockopt(fd, SOL_SOCKET, SO_ERROR, &err, &len);
        if (r <= 0 || err != 0) {
            if (err == 0) err = ETIMEDOUT;
            COMM_ERR("Connect Failed, Timeout or %d - %s", err, strerror(err));
            shutdown(fd, SHUT_RDWR);
            close(fd);
            return -1;
        }
        status = err;
    }
    fcntl(fd, F_SETFL, flags & ~O_NONBLOCK);
    SetNoDelay(fd);
    struct timeval tv = {orlocomm::kWriteTimeoutMs / 1000, 0};
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof(tv));
    COMM_INFO("Connect to %s Successfully status=%d", addr, status);
    ORLOCOMM_SOCKET *s = NewSocket(fd);
    if (s == nullptr) {
        COMM_ERR("Out of memory. Failed to allocate memory for ORLOCOMM_SOCKET");
        close(fd);
        return -1;
    }
    s->addr = sin;
    snprintf(s->name, sizeof(s->name), "%s:%d", addr, ORLOCOMM_PORT);
    *out = s;
    return 0;
}

struct ListenArg {
    int fd;
};

void *ListenLoop(void *arg) {
    int lfd = static_cast<ListenArg *>(arg)->fd;
    delete static_cast<ListenArg *>(arg);
    for (;;) {
        struct sockaddr_in peer;
        socklen_t plen = sizeof(peer);
        int fd = accept4(lfd, reinterpret_cast<struct sockaddr *>(&peer), &plen, SOCK_CLOEXEC);
        if (fd < 0) {
            if (errno == EINTR || errno == ECONNABORTED || errno == EMFILE || errno == ENFILE ||
                errno == ENOBUFS || errno == ENOMEM) {
                if (errno != EINTR && errno != ECONNABORTED) usleep(100000);
                continue;
            }
            break;  // the listener was shut down
        }
        COMM_INFO("After accept, p->request_fd %d", fd);
        if (!orlocomm::ConnSlotTake()) {
            COMM_ERR("%d connections already served, %s refused", orlocomm::kMaxConnections,
                     orlocomm::IpText(peer.sin_addr.s_addr).c_str());
            close(fd);
            continue;
        }
        ORLOCOMM_SOCKET *s = orlocomm::NewAcceptedSocket(fd, &peer);
        if (s == nullptr) {
            COMM_ERR("Out of memory. Failed to allocate memory for ORLOCOMM_SOCKET");
            close(fd);
            orlocomm::ConnSlotRelease();
            continue;
        }
        pthread_attr_t attr;
        if (pthread_attr_init(&attr) != 0) {
            COMM_ERR("pthread_attr_init failed");
            close(fd);
            free(s);
            orlocomm::ConnSlotRelease();
            continue;
        }
        if (pthread_attr_setdetachstate(&attr, PTHREAD_CREATE_DETACHED) != 0) {
            COMM_ERR("set PTHREAD_CREATE_DETACHED failed");
            pthread_attr_destroy(&attr);
            close(fd);
            free(s);
            orlocomm::ConnSlotRelease();
            continue;
        }
        pthread_attr_setstacksize(&attr, 256 * 1024);
        pthread_t tid;
        if (pthread_create(&tid, &attr, orlocomm::SocketConnThread, s) != 0) {
            COMM_ERR("Failed to create thread");
            close(fd);
            free(s);
            orlocomm::ConnSlotRelease();
        }
        pthread_attr_destroy(&attr);
    }
    return nullptr;
}

}  // namespace

namespace orlocomm {

ORLOCOMM_SOCKET *NewAcceptedSocket(int fd, const struct sockaddr_in *peer) {
    ORLOCOMM_SOCKET *s = NewSocket(-1);
    if (s == nullptr) return nullptr;
    s->conn_fd = fd;
    s->addr = *peer;
    snprintf(s->name, sizeof(s->name), "%s:%d", IpText(peer->sin_addr.s_addr).c_str(), ntohs(peer->sin_port));
    SetNoDelay(fd);
    struct timeval tv = {kWriteTimeoutMs / 1000, 0};
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof(tv));
    return s;
}

void SocketChannelShutdown(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr || !IsSocketChannel(ch)) return;
    for (void *m : {ch->request, ch->response}) {
        auto *s = static_cast<ORLOCOMM_SOCKET *>(m);
        if (s != nullptr && FdOf(s) >= 0) shutdown(FdOf(s), SHUT_RDWR);
    }
}

uint32_t SocketChannelPeer(const ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr || !IsSocketChannel(ch) || ch->request == nullptr) return 0;
    return static_cast<const ORLOCOMM_SOCKET *>(ch->request)->addr.sin_addr.s_addr;
}

bool ConnSlotTake() {
    std::lock_guard<std::mutex> l(gSlotsMu);
    if (gSlotsUsed >= kMaxConnections) return false;
    ++gSlotsUsed;
    return true;
}

void ConnSlotRelease() {
    std::lock_guard<std::mutex> l(gSlotsMu);
    --gSlotsUsed;
    gSlotsCv.notify_all();
}

void ConnSlotsWaitIdle(int timeoutMs) {
    std::unique_lock<std::mutex> l(gSlotsMu);
    gSlotsCv.wait_for(l, std::chrono::milliseconds(timeoutMs), [] { return gSlotsUsed == 0; });
}

}  // namespace orlocomm

extern "C" {

ORLO_EXPORT ORLOCOMM_CHANNEL *orlocomm_socket_construct(const char *name, int owner, int end, int) {
    return orlocomm_base_construct(name, owner, end, &socket_channel_transport);
}

ORLO_EXPORT void orlocomm_socket_destruct(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return;
    void *media[2] = {ch->request, ch->response};
    for (int i = 0; i < 2; ++i) {
        auto *s = static_cast<ORLOCOMM_SOCKET *>(media[i]);
        if (s == nullptr || (i == 1 && media[1] == media[0])) continue;
        if (s->conn_fd >= 0) close(s->conn_fd);
        if (s->sock_fd >= 0) close(s->sock_fd);
        free(s);
    }
    ch->request = ch->response = nullptr;
    ch->has_request = ch->has_response = 0;
    orlocomm_base_destruct(ch);
}

ORLO_EXPORT int orlocomm_socket_start_service(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr || ch->request == nullptr || ch->desc->end != ORLOCOMM_SERVER_END) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    std::lock_guard<std::mutex> l(gListenMu);
    if (gListenRunning) {
        COMM_ERR("The socket server already runs");
        return -1;
    }
    auto *arg = new ListenArg{static_cast<ORLOCOMM_SOCKET *>(ch->request)->sock_fd};
    if (pthread_create(&gListenThread, nullptr, ListenLoop, arg) != 0) {
        COMM_ERR("Failed to create thread");
        delete arg;
        return -1;
    }
    gListenRunning = true;
    return 0;
}

// The listener stops accepting and its thread is joined; a connection's channel is shut
// down so that its reader wakes up and leaves.
ORLO_EXPORT int orlocomm_socket_stop_service(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return -1;
    if (ch->desc->end == ORLOCOMM_SERVER_END && ch->request != nullptr &&
        static_cast<ORLOCOMM_SOCKET *>(ch->request)->conn_fd < 0) {
        std::lock_guard<std::mutex> l(gListenMu);
        shutdown(static_cast<ORLOCOMM_SOCKET *>(ch->request)->sock_fd, SHUT_RDWR);
        if (gListenRunning) {
            pthread_join(gListenThread, nullptr);
            gListenRunning = false;
        }
        return 0;
    }
    orlocomm::SocketChannelShutdown(ch);
    return 0;
}

ORLO_EXPORT int orlocomm_socket_internal_request(ORLOCOMM_CHANNEL *ch, const char *addr) {
    if (ch == nullptr || ch->request != nullptr) return -1;
    ORLOCOMM_SOCKET *s = nullptr;
    int r = ch->desc->end == ORLOCOMM_SERVER_END ? OpenListener(&s) : Connect(addr, &s);
    if (r != 0) return -1;
    return orlocomm_socket_internal_request_media(ch, s);
}

// Answers travel back on the request's own connection: there is no second medium.
ORLO_EXPORT int orlocomm_socket_internal_response(ORLOCOMM_CHANNEL *ch, const char *) {
    return ch == nullptr || ch->request == nullptr ? -1 : 0;
}

ORLO_EXPORT int orlocomm_socket_internal_request_media(ORLOCOMM_CHANNEL *ch, void *media) {
    if (ch == nullptr || media == nullptr || ch->request != nullptr) return -1;
    ch->request = media;
    ch->has_request = 1;
    return 0;
}

ORLO_EXPORT int orlocomm_socket_internal_response_media(ORLOCOMM_CHANNEL *ch, void *media) {
    if (ch == nullptr || media == nullptr || ch->response != nullptr) return -1;
    ch->response = media;
    ch->has_response = 1;
    return 0;
}

ORLO_EXPORT int IsSocketValidOpcode(int code) { return orlocomm::IsKnownCode(code) ? 1 : 0; }

// Sends one whole frame (header and payload in one buffer).  A payload whose code the engine
// does not know is refused.
ORLO_EXPORT int orlocomm_socket_write(void *media, const void *buf, int len) {
    auto *s = static_cast<ORLOCOMM_SOCKET *>(media);
    if (s == nullptr || buf == nullptr || len <= ORLOCOMM_HEADER_SIZE) return -1;
    const auto *bytes = static_cast<const uint8_t *>(buf);
    int code = bytes[ORLOCOMM_HEADER_SIZE];
    if (!IsSocketValidOpcode(code)) {
        COMM_ERR("invalid opcode: %#X", code);
        return -1;
    }
    int fd = FdOf(s);
    int done = 0;
    while (done < len) {
        ssize_t n = send(fd, bytes + done, static_cast<size_t>(len - done), MSG_NOSIGNAL);
        if (n > 0) {
            done += static_cast<int>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        COMM_ERR("send(%s) of %d bytes stopped at %d, err=%m", s->name, len, done);
        break;
    }
    if (done == len) s->last_send = time(nullptr);
    return done > 0 ? done : -1;
}

// Reads exactly len bytes, keeping what came beyond them for the next read (one reader per
// connection).
ORLO_EXPORT int orlocomm_socket_read(void *media, void *buf, int len) {
    auto *s = static_cast<ORLOCOMM_SOCKET *>(media);
    if (s == nullptr || buf == nullptr || len <= 0) return -1;
    memset(buf, 0, static_cast<size_t>(len));
    auto *bytes = static_cast<uint8_t *>(buf);
    int fd = FdOf(s);
    int got = 0;
    int64_t deadline = 0;
    while (got < len) {
        if (s->rbuf_off < s->rbuf_len) {
            int take = std::min(len - got, s->rbuf_len - s->rbuf_off);
            memcpy(bytes + got, s->rbuf + s->rbuf_off, static_cast<size_t>(take));
            s->rbuf_off += take;
            got += take;
            s->frame_started = 1;
            continue;
        }
        s->rbuf_off = s->rbuf_len = 0;
        ssize_t n = recv(fd, s->rbuf, sizeof(s->rbuf), MSG_DONTWAIT);
        if (n > 0) {
            s->rbuf_len = static_cast<int32_t>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n == 0 || errno != EAGAIN) break;  // the peer closed or the connection failed
        int timeout = -1;
        if (s->frame_started) {
            if (deadline == 0) deadline = orlocomm::NowMs() + s->frame_timeout_ms;
            int64_t left = deadline - orlocomm::NowMs();
            if (left <= 0) break;
            timeout = static_cast<int>(left);
        }
        if (WaitFd(fd, POLLIN, timeout) <= 0) break;
    }
    if (got < len) s->short_read = 1;
    return got;
}

ORLO_EXPORT int IsSocketAlive(const ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr || ch->request == nullptr || !orlocomm::IsSocketChannel(ch)) return 0;
    const auto *s = static_cast<const ORLOCOMM_SOCKET *>(ch->request);
    time_t now = time(nullptr);
    if (now - s->last_recv > 10 && now - s->last_send > 10) {
        COMM_INFO("%s ISN'T UPDATED", ch->desc->id.service_name);
        return 0;
    }
    COMM_INFO("%s UPDATED", ch->desc->id.service_name);
    return 1;
}

const ORLOCOMM_TRANSPORT socket_channel_transport = {
    ORLOCOMM_TRANSPORT_SOCKET,
    orlocomm_socket_construct,
    orlocomm_socket_destruct,
    orlocomm_socket_start_service,
    orlocomm_socket_stop_service,
    orlocomm_socket_internal_request,
    orlocomm_socket_internal_response,
    orlocomm_socket_internal_request_media,
    orlocomm_socket_internal_response_media,
    orlocomm_base_external_request,
    orlocomm_base_external_response,
    orlocomm_socket_write,
    orlocomm_socket_read,
    orlocomm_base_send_msg,
    orlocomm_base_recv_msg,
};

const ORLOCOMM_TRANSPORT *const transports[] = {&pipe_channel_transport, &socket_channel_transport,
                                                            nullptr};

}  // extern "C"
