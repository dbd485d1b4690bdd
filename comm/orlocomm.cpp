// The engine's public face: how an application joins, connects, sends and receives (also
// through envelopes), the engine process's start-up with its pipe and socket servers, the
// count file that admits at most two clients at once, the pid file, and the base channel
// operations every transport shares.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>

#include "comm/orlocomm_internal.h"
#include "olibc.h"
#include "platform/os_seam.h"

using orlocomm::MutexGuard;

extern "C" {
ORLO_EXPORT char gszLocalHostName[36] = {0};
ORLO_EXPORT char gszLocalActiveIP[64] = {0};
ORLO_EXPORT pthread_mutex_t mCommMutex = PTHREAD_MUTEX_INITIALIZER;
ORLO_EXPORT pthread_once_t once_block = PTHREAD_ONCE_INIT;
}

namespace {

bool gInitialised = false;
uint32_t gLocalIps[ORLOCOMM_MAX_HOST_IPS];
int gLocalIpCount = 0;
std::mutex gLocalHostMu;

void OnceInit() {
    if (pLocalHostSet == nullptr && pRemoteHostSet == nullptr) InitHostSet();
    if (pChannelSet == nullptr) InitChannelSet();
    gLocalIpCount = EnumAllAdapterIPs(gLocalIps, ORLOCOMM_MAX_HOST_IPS, gszLocalActiveIP, sizeof(gszLocalActiveIP));
    if (gLocalIpCount > 0)
        COMM_INFO(">>>>> Init 1st Active IP %s", gszLocalActiveIP);
    else
        COMM_ERR("Fail to get localIP");
    char name[256];
    if (gethostname(name, sizeof(name)) == 0) {
        name[sizeof(name) - 1] = '\0';
        snprintf(gszLocalHostName, sizeof(gszLocalHostName), "%.31s", name);
        COMM_INFO(">>>>> Init LocalHostName %s", gszLocalHostName);
    } else {
        COMM_ERR("Fail to get LocalHostName");
    }
    gInitialised = pLocalHostSet != nullptr && pRemoteHostSet != nullptr && pChannelSet != nullptr;
}

constexpr int kCountWaitMs = 100;
constexpr int kCountGiveUpSec = 600;

void SleepMs(int ms) {
    struct timespec ts = {ms / 1000, static_cast<long>(ms % 1000) * 1000000L};
    while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
}

// Changes the count of active clients by one under the count file's lock: an increment
// waits while two are counted, a decrement while none is.  The new count, or -110 after
// 600 seconds.
int ModifyLocalOrloCommCount(bool increment) {
    int64_t start = orlocomm::NowMs();
    for (;;) {
        if (orlocomm::NowMs() - start >= kCountGiveUpSec * 1000LL) return -ETIMEDOUT;
        int handle = -1;
        if (OLIBCFileLockTimeByFile(ORLOCOMM_COUNT_LOCK, 1, 10, &handle) != 1) {
            COMM_ERR("fail to lock %s", ORLOCOMM_COUNT_LOCK);
            SleepMs(kCountWaitMs);
            continue;
        }
        char value[32];
        int count = -1;
        if (OLIBCFileGetKeyValue(ORLOCOMM_COUNT_FILE, ORLOCOMM_COUNT_KEY, value, sizeof(value)) >= 0)
            count = atoi(value);
        bool wait = increment ? count > 1 : count <= 0;
        if (wait) {
            if (OLIBCFileUnlockByFile(handle) != 0) COMM_ERR("fail to unlock %s", ORLOCOMM_COUNT_LOCK);
            SleepMs(kCountWaitMs);
            continue;
        }
        int next = increment ? count + 1 : count - 1;
        snprintf(value, sizeof(value), "%d", next);
        int r = OLIBCFileSetKeyValue(ORLOCOMM_COUNT_FILE, ORLOCOMM_COUNT_KEY, value, "%s=%s\n");
        if (OLIBCFileUnlockByFile(handle) != 0) COMM_ERR("fail to unlock %s", ORLOCOMM_COUNT_LOCK);
        if (r != 0) {
            COMM_ERR("OLIBCFileSetKeyValue(\"%s\", \"%s\", \"%s\") failed, err=[0x%04X %s:%d]", ORLOCOMM_COUNT_FILE,
                     ORLOCOMM_COUNT_KEY, value, OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
            return -1;
        }
        return next;
    }
}

pid_t ReadPidFile(const char *path) {
    FILE *f = orlo::os::Fopen(path, "r");
    if (f == nullptr) return -1;
    char line[32] = {0};
    char *ok = fgets(line, sizeof(line), f);
    fclose(f);
    if (ok == nullptr) return -1;
    char *end = nullptr;
    long v = strtol(line, &end, 10);
    if (end == line || v <= 0 || v > 0x3FFFFFFF) return -1;
    return static_cast<pid_t>(v);
}

bool ProcessRuns(pid_t pid) { return pid > 0 && (kill(pid, 0) == 0 || errno == EPERM); }

uint8_t *EvlpBuf(PORLOCOMM_EVLP e) { return e == nullptr ? nullptr : e->buf; }

void ClearMediumFrame(void *m, bool pipe) {
    if (pipe) {
        static_cast<ORLOCOMM_PIPE *>(m)->frame_started = 0;
        static_cast<ORLOCOMM_PIPE *>(m)->short_read = 0;
    } else {
        static_cast<ORLOCOMM_SOCKET *>(m)->frame_started = 0;
        static_cast<ORLOCOMM_SOCKET *>(m)->short_read = 0;
    }
}

}  // namespace

namespace orlocomm {

std::atomic<int> gControlWaitMs{kControlWaitMs};

void RefreshLocalHost() {
    ORLOCOMM_HOST *local = EnsureLocalHost();
    if (local == nullptr) return;
    uint32_t ips[ORLOCOMM_MAX_HOST_IPS];
    char active[64];
    int n = EnumAllAdapterIPs(ips, ORLOCOMM_MAX_HOST_IPS, active, sizeof(active));
    if (n <= 0) return;
    std::lock_guard<std::mutex> l(gLocalHostMu);
    MutexGuard g(&local->mutex);
    memcpy(local->ips, ips, sizeof(uint32_t) * static_cast<size_t>(n));
    local->ip_count = n;
    if (strcmp(active, gszLocalActiveIP) != 0) {
        snprintf(gszLocalActiveIP, sizeof(gszLocalActiveIP), "%s", active);
        COMM_INFO(">>>>> Init 1st Active IP %s", gszLocalActiveIP);
    }
}

int EnsureInit() {
    if (pthread_once(&once_block, OnceInit) != 0) {
        COMM_ERR("once_init fail");
        return -1;
    }
    return gInitialised ? 0 : -1;
}

ORLOCOMM_HOST *EnsureLocalHost() {
    if (EnsureInit() != 0) return nullptr;
    std::lock_guard<std::mutex> l(gLocalHostMu);
    if (ORLOCOMM_HOST *h = SearchLocalHost(nullptr)) return h;
    return AddLocalHost(gszLocalHostName, gLocalIps, gLocalIpCount);
}

bool IsPipeChannel(const ORLOCOMM_CHANNEL *ch) {
    return ch != nullptr && ch->transport != nullptr && ch->transport->type == ORLOCOMM_TRANSPORT_PIPE;
}

bool IsSocketChannel(const ORLOCOMM_CHANNEL *ch) {
    return ch != nullptr && ch->transport != nullptr && ch->transport->type == ORLOCOMM_TRANSPORT_SOCKET;
}

void *SendMedium(ORLOCOMM_CHANNEL *ch) {
    void *primary = ch->desc->end == ORLOCOMM_SERVER_END ? ch->response : ch->request;
    void *other = ch->desc->end == ORLOCOMM_SERVER_END ? ch->request : ch->response;
    return primary != nullptr ? primary : other;
}

void *RecvMedium(ORLOCOMM_CHANNEL *ch) {
    void *primary = ch->desc->end == ORLOCOMM_SERVER_END ? ch->request : ch->response;
    void *other = ch->desc->end == ORLOCOMM_SERVER_END ? ch->response : ch->request;
    return primary != nullptr ? primary : other;
}

int ChannelWaitReadable(ORLOCOMM_CHANNEL *ch, int timeoutMs) {
    if (ch == nullptr) return -1;
    if (ch->base != nullptr) return ChannelWaitReadable(ch->base, timeoutMs);
    void *m = RecvMedium(ch);
    if (m == nullptr) return -1;
    int fd;
    if (IsPipeChannel(ch)) {
        auto *p = static_cast<ORLOCOMM_PIPE *>(m);
        if (p->rbuf_off < p->rbuf_len) return 1;  // already read ahead
        fd = p->read_fd;
    } else {
        auto *s = static_cast<ORLOCOMM_SOCKET *>(m);
        if (s->rbuf_off < s->rbuf_len) return 1;
        fd = s->conn_fd >= 0 ? s->conn_fd : s->sock_fd;
    }
    if (fd < 0) return -1;
    struct pollfd pfd = {fd, POLLIN, 0};
    for (;;) {
        int r = poll(&pfd, 1, timeoutMs);
        if (r < 0 && errno == EINTR) continue;
        if (r < 0) return -1;
        if (r == 0) return 0;
        if (pfd.revents & POLLIN) return 1;
        return -1;
    }
}

}  // namespace orlocomm

extern "C" {

// ---- Base channel operations ----

ORLO_EXPORT ORLOCOMM_CHANNEL *orlocomm_base_construct(const char *name, int owner, int end,
                                                      const ORLOCOMM_TRANSPORT *transport) {
    if (name == nullptr || (end != ORLOCOMM_SERVER_END && end != ORLOCOMM_CLIENT_END)) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    auto *ch = static_cast<ORLOCOMM_CHANNEL *>(calloc(1, sizeof(ORLOCOMM_CHANNEL)));
    auto *desc = static_cast<ORLOCOMM_CHANNEL_DESC *>(calloc(1, sizeof(ORLOCOMM_CHANNEL_DESC)));
    if (ch == nullptr || desc == nullptr) {
        COMM_ERR("Out of memory");
        free(ch);
        free(desc);
        return nullptr;
    }
    orlocomm::CopyName(desc->id.service_name, name);
    desc->id.owner = owner;
    ServiceIDGenerateUUID(&desc->id);
    desc->end = end;
    desc->channel = ch;
    orlocomm::LinkInit(&desc->link);
    ch->desc = desc;
    ch->transport = transport != nullptr ? transport : &base_channel_transport;
    ch->ref_count = 1;
    pthread_mutex_init(&ch->mutex, nullptr);
    pthread_mutex_init(&ch->send_mutex, nullptr);
    pthread_mutex_init(&ch->recv_mutex, nullptr);
    return ch;
}

ORLO_EXPORT void orlocomm_base_destruct(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return;
    if (ch->base != nullptr) ChannelPut(ch->base);
    pthread_mutex_destroy(&ch->mutex);
    pthread_mutex_destroy(&ch->send_mutex);
    pthread_mutex_destroy(&ch->recv_mutex);
    free(ch->desc);
    free(ch);
}

ORLO_EXPORT int orlocomm_base_send_msg(ORLOCOMM_CHANNEL *ch, const void *msg, int len) {
    if (ch == nullptr || msg == nullptr || len <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (ch->base != nullptr) return ch->base->transport->send_msg(ch->base, msg, len);
    void *m = orlocomm::SendMedium(ch);
    if (m == nullptr || ch->transport->write == nullptr) {
        COMM_ERR("%s has no medium to send on", ch->desc->id.service_name);
        return -1;
    }
    MutexGuard g(&ch->send_mutex);
    int n = PacketWrite(m, ch->transport->write, msg, len);
    if (n < len) ch->failed = 1;
    return n;
}

// Receives one message.  A frame that cannot be read whole, or (on a socket) whose code the
// engine does not know, fails the channel; on the engine's shared request FIFO the bytes
// buffered behind it are dropped instead and the next frame is read.
ORLO_EXPORT int orlocomm_base_recv_msg(ORLOCOMM_CHANNEL *ch, void *buf, int size) {
    if (ch == nullptr || buf == nullptr || size <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (ch->base != nullptr) return ch->base->transport->recv_msg(ch->base, buf, size);
    void *m = orlocomm::RecvMedium(ch);
    if (m == nullptr || ch->transport->read == nullptr) {
        COMM_ERR("%s has no medium to receive on", ch->desc->id.service_name);
        return -1;
    }
    bool pipe = orlocomm::IsPipeChannel(ch);
    MutexGuard g(&ch->recv_mutex);
    for (;;) {
        ClearMediumFrame(m, pipe);
        int n = PacketRead(m, ch->transport->read, buf, size);
        bool bad = n <= 0;
        if (pipe) {
            auto *p = static_cast<ORLOCOMM_PIPE *>(m);
            bad = bad || p->short_read;
            if (!bad) return n;
            if (p->shared && p->server && p->read_fd >= 0 && p->frame_started) {
                int dropped = orlocomm::PipeDrain(p);
                COMM_ERR("%s: bad frame on %s, %d byte(s) behind it dropped", ch->desc->id.service_name, p->path,
                         dropped);
                continue;
            }
        } else {
            auto *s = static_cast<ORLOCOMM_SOCKET *>(m);
            bad = bad || s->short_read;
            if (!bad && !IsSocketValidOpcode(static_cast<uint8_t *>(buf)[0])) {
                COMM_ERR("invalid opcode: %#X from %s", static_cast<uint8_t *>(buf)[0], s->name);
                bad = true;
            }
            if (!bad) {
                s->last_recv = time(nullptr);
                return n;
            }
        }
        ch->failed = 1;
        return -1;
    }
}

// Sends a request and waits (kFrameTimeoutMs) for one answer on the same channel.
ORLO_EXPORT int orlocomm_base_external_request(ORLOCOMM_CHANNEL *ch, const void *msg, int len, void *reply,
                                               int size) {
    if (ch == nullptr || msg == nullptr || len <= 0 || reply == nullptr || size <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (ch->transport->send_msg(ch, msg, len) < len) return -1;
    if (orlocomm::ChannelWaitReadable(ch, orlocomm::kFrameTimeoutMs) != 1) {
        COMM_ERR("No answer to '%s' on %s", GetCommCmdNameExt(msg), ch->desc->id.service_name);
        return -1;
    }
    return ch->transport->recv_msg(ch, reply, size);
}

// Answers a request on the connection it came in on.
ORLO_EXPORT int orlocomm_base_external_response(ORLOCOMM_CHANNEL *ch, const void *msg, int len) {
    if (ch == nullptr || msg == nullptr || len <= 0 || ch->request == nullptr || ch->transport->write == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&ch->send_mutex);
    return PacketWrite(ch->request, ch->transport->write, msg, len);
}

const ORLOCOMM_TRANSPORT base_channel_transport = {
    ORLOCOMM_TRANSPORT_BASE,
    nullptr,
    nullptr,
    nullptr,
    nullptr,
    nullptr,
    nullptr,
    nullptr,
    nullptr,
    orlocomm_base_external_request,
    orlocomm_base_external_response,
    nullptr,
    nullptr,
    orlocomm_base_send_msg,
    orlocomm_base_recv_msg,
};

// ---- Applications ----

ORLO_EXPORT PORLOCOMM CreateOrloComm(const char *name) {
    if (name == nullptr || name[0] == '\0') {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    int count = ModifyLocalOrloCommCount(true);
    if (count < 0) {
        COMM_ERR("modify_local_orlocomm_count(true) return %d", count);
        return nullptr;
    }
    COMM_INFO("Increment orlocomm count to %d", count);
    auto *handle = static_cast<PORLOCOMM>(calloc(1, sizeof(ORLOCOMM)));
    if (handle == nullptr || InitOrloComm(handle, name) != 0) {
        if (handle == nullptr) COMM_ERR("Out of memory");
        free(handle);
        // A count taken from a missing file (it read -1) is no count to give back.
        if (count >= 1) {
            int back = ModifyLocalOrloCommCount(false);
            if (back < 0) COMM_ERR("modify_local_orlocomm_count(false) return %d", back);
        }
        return nullptr;
    }
    handle->app->comm_flags |= orlocomm::kCommFlagHolder | (count >= 1 ? orlocomm::kCommFlagCounted : 0);
    return handle;
}

ORLO_EXPORT int InitOrloComm(PORLOCOMM handle, const char *name) {
    if (handle == nullptr || name == nullptr || name[0] == '\0') {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (orlocomm::EnsureInit() != 0) return -1;
    MutexGuard g(&mCommMutex);
    bool alive = false;
    for (int i = 0; i < 12 && !alive; ++i) {
        alive = IsServiceAlive(ORLOCOMM_PID_FILE) == 1;
        if (!alive) sleep(1);
    }
    if (!alive) {
        COMM_ERR(">>>>>>>>>>>>>>>>>>>>>>> Wait Service %s time out", ORLOCOMM_PID_FILE);
        return -1;
    }
    if (orlocomm::EnsureLocalHost() == nullptr) return -1;
    orlocomm::RefreshLocalHost();
    int owner = static_cast<int>(getpid());
    // One process, several applications: the second and later get a service number.
    char path[4096];
    struct stat st;
    if (GetPipePath(owner, 0, path, sizeof(path)) == 0 && orlo::os::Lstat(path, &st) == 0) {
        ORLOCOMM_HOST *local = SearchLocalHost(nullptr);
        bool mine = false;
        if (local != nullptr) {
            MutexGuard gh(&local->mutex);
            for (ORLOCOMM_LINK *l = local->apps.next; l != &local->apps && !mine; l = l->next)
                mine = COMM_ENTRY(l, ORLOCOMM_APP, host_link)->id.owner == owner;
        }
        if (mine) {
            do {
                owner = getrandpid();
            } while (GetPipePath(owner, 0, path, sizeof(path)) == 0 && orlo::os::Lstat(path, &st) == 0);
        }
    }
    COMM_INFO("............................. Generate commpid %d", owner);
    ORLOCOMM_APP *app = CreateAppLocalAppServer(name, owner);
    if (app == nullptr) return -1;
    app->engine_pid = ReadPidFile(ORLOCOMM_PID_FILE);
    handle->app = app;
    return 0;
}

ORLO_EXPORT int DestroyOrloComm(PORLOCOMM handle) {
    if (handle == nullptr || handle->app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    if (SearchLocalHost(nullptr) == nullptr) {
        COMM_ERR("No local host");
        return -1;
    }
    ORLOCOMM_APP *app = handle->app;
    int flags = app->comm_flags;
    {
        MutexGuard g(&mCommMutex);
        uint8_t *msg = CreateURegistryMsg(app);
        if (msg != nullptr) {
            if (AppSendControl(app, msg, orlocomm::kServiceMsgSize) == orlocomm::kServiceMsgSize) {
                uint8_t answer[ORLOCOMM_MSG_BUF_SIZE];
                auto accept = [](void *ctx, const void *m, int len) -> int {
                    const auto *s = static_cast<const ORLOCOMM_SERVICE_MSG *>(m);
                    return len >= orlocomm::kServiceMsgSize && s->opcode == ORLOCOMM_OP_UNREGISACK &&
                           CompareUUID(s->id.uuid, static_cast<const char *>(ctx)) == 0;
                };
                if (AppWaitControl(app, answer, sizeof(answer), accept, app->id.uuid) < 0)
                    COMM_ERR("No UnRegisack for %s", app->id.uuid);
            }
            free(msg);
        }
        handle->app = nullptr;
        orlocomm::AppReleaseAll(app);
    }
    if (flags & orlocomm::kCommFlagCounted) {
        int count = ModifyLocalOrloCommCount(false);
        if (count < 0)
            COMM_ERR("modify_local_orlocomm_count(false) return %d", count);
        else
            COMM_INFO("Decrease orlocomm count to %d", count);
    }
    if (flags & orlocomm::kCommFlagHolder) free(handle);
    return 0;
}

ORLO_EXPORT int OrloCommConnect(PORLOCOMM handle, const char *host, const char *service) {
    if (handle == nullptr || handle->app == nullptr || host == nullptr || service == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&mCommMutex);
    return AppConnect(handle->app, host, service);
}

ORLO_EXPORT int OrloCommDisconnect(PORLOCOMM handle, int index) {
    if (handle == nullptr || handle->app == nullptr || index < 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&mCommMutex);
    return AppDisconnect(handle->app, index);
}

ORLO_EXPORT int OrloCommIsConnect(PORLOCOMM handle, const char *host, const char *service) {
    if (handle == nullptr || handle->app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return AppIsConnect(handle->app, host, service);
}

ORLO_EXPORT int CommSendMessage(PORLOCOMM handle, int index, const void *data, int len) {
    if (handle == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return AppSendMessage(handle->app, index, data, len);
}

ORLO_EXPORT int CommUSendMessage(PORLOCOMM handle, const char *to_uuid, const void *data, int len) {
    if (handle == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return AppUSendMessage(handle->app, to_uuid, data, len);
}

ORLO_EXPORT int CommRecvMessage(PORLOCOMM handle, void *buf, int size) {
    if (handle == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return AppRecvMessage(handle->app, buf, size);
}

// ---- Envelopes ----

ORLO_EXPORT int InitOrloCommEvlp(PORLOCOMM_EVLP holder) {
    if (holder == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    holder->buf = static_cast<uint8_t *>(calloc(1, ORLOCOMM_MSG_BUF_SIZE));
    if (holder->buf == nullptr) {
        COMM_ERR("Out of memory");
        return -1;
    }
    return 0;
}

ORLO_EXPORT PORLOCOMM_EVLP CreateOrloCommEvlp(void) {
    auto *e = static_cast<PORLOCOMM_EVLP>(calloc(1, sizeof(ORLOCOMM_EVLP)));
    if (e == nullptr || InitOrloCommEvlp(e) != 0) {
        free(e);
        return nullptr;
    }
    return e;
}

ORLO_EXPORT void FreeOrloCommEvlpData(PORLOCOMM_EVLP e) {
    if (e == nullptr) return;
    free(e->buf);
    e->buf = nullptr;
}

ORLO_EXPORT void ReleaseOrloCommEvlp(PORLOCOMM_EVLP e) {
    if (e == nullptr) return;
    FreeOrloCommEvlpData(e);
    free(e);
}

ORLO_EXPORT int CommRecvEvlp(PORLOCOMM handle, PORLOCOMM_EVLP e) {
    if (handle == nullptr || EvlpBuf(e) == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    int n = AppRecvMessage(handle->app, e->buf, ORLOCOMM_MSG_BUF_SIZE);
    if (n < 1) return n;
    return static_cast<int>(reinterpret_cast<ORLOCOMM_DATA_MSG *>(e->buf)->length);
}

ORLO_EXPORT int CommRecvEvlpTimed(PORLOCOMM handle, PORLOCOMM_EVLP e, int timeout_ms) {
    if (handle == nullptr || EvlpBuf(e) == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    uint8_t buf[ORLOCOMM_MSG_BUF_SIZE];
    int n = AppRecvMessageTimed(handle->app, buf, sizeof(buf), timeout_ms);
    if (n < 1) return n;
    memcpy(e->buf, buf, sizeof(buf));
    return static_cast<int>(reinterpret_cast<ORLOCOMM_DATA_MSG *>(e->buf)->length);
}

ORLO_EXPORT void *CommGetEvlpData(PORLOCOMM_EVLP e) {
    uint8_t *buf = EvlpBuf(e);
    if (buf == nullptr || buf[0] == 0) return nullptr;
    return buf + ORLOCOMM_DATA_OFFSET;
}

ORLO_EXPORT int CommGetEvlpDataLen(PORLOCOMM_EVLP e) {
    uint8_t *buf = EvlpBuf(e);
    if (buf == nullptr || buf[0] == 0) return -1;
    return static_cast<int>(reinterpret_cast<ORLOCOMM_DATA_MSG *>(buf)->length);
}

ORLO_EXPORT int CommRetEvlp(PORLOCOMM handle, PORLOCOMM_EVLP e, const void *data, int len) {
    if (handle == nullptr || EvlpBuf(e) == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return AppRetMessage(handle->app, e->buf, data, len);
}

ORLO_EXPORT int CommGetEvlpFD(PORLOCOMM handle, PORLOCOMM_EVLP e) {
    if (handle == nullptr || EvlpBuf(e) == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return AppGetMessageFromFD(handle->app, e->buf);
}

// ---- The engine process ----

ORLO_EXPORT ORLOCOMM_ENG *CreateEngComm(void) {
    if (orlocomm::EnsureLocalHost() == nullptr) return nullptr;
    orlocomm::RefreshLocalHost();
    auto *eng = static_cast<ORLOCOMM_ENG *>(calloc(1, sizeof(ORLOCOMM_ENG)));
    if (eng == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    orlocomm::gEngStopRequested.store(false);
    eng->prqrx = orlocomm_pipe_construct(ORLOCOMM_CH_PRQRX, ORLOCOMM_OWNER_MSG_SERVER, ORLOCOMM_SERVER_END,
                                         ORLOCOMM_PIPE_TYPE_MSG_SERVER);
    if (eng->prqrx == nullptr || eng->prqrx->transport->internal_request(eng->prqrx, nullptr) != 0 ||
        AddInternalChannel(pChannelSet, eng->prqrx) != 0) {
        COMM_ERR("Fail to create %s", ORLOCOMM_CH_PRQRX);
        ReleaseEngComm(eng);
        return nullptr;
    }
    eng->prqsn = orlocomm_pipe_construct(ORLOCOMM_CH_PRQSN, ORLOCOMM_OWNER_MSG_SERVER, ORLOCOMM_CLIENT_END,
                                         ORLOCOMM_PIPE_TYPE_MSG_SERVER);
    if (eng->prqsn == nullptr || eng->prqsn->transport->internal_request(eng->prqsn, nullptr) != 0 ||
        AddInternalChannel(pChannelSet, eng->prqsn) != 0) {
        COMM_ERR("Fail to create %s", ORLOCOMM_CH_PRQSN);
        ReleaseEngComm(eng);
        return nullptr;
    }
    eng->srqln = orlocomm_socket_construct(ORLOCOMM_CH_SRQLN, 0, ORLOCOMM_SERVER_END, 0);
    if (eng->srqln == nullptr || eng->srqln->transport->internal_request(eng->srqln, nullptr) != 0 ||
        AddInternalChannel(pChannelSet, eng->srqln) != 0) {
        COMM_ERR("Fail to create %s", ORLOCOMM_CH_SRQLN);
        ReleaseEngComm(eng);
        return nullptr;
    }
    return eng;
}

// Forgets every app and host and closes the engine's channels.  Call after both servers
// stopped.
ORLO_EXPORT void ReleaseEngComm(ORLOCOMM_ENG *eng) {
    if (eng == nullptr) return;
    orlocomm::EngReleaseAll();
    for (ORLOCOMM_CHANNEL *ch : {eng->prqrx, eng->prqsn, eng->srqln}) {
        if (ch == nullptr) continue;
        if (ch->desc->kind != 0) RemoveChannel(pChannelSet, ch);
        ChannelFree(ch);
    }
    free(eng);
}

ORLO_EXPORT int StartEngCommSockServer(ORLOCOMM_ENG *eng) {
    if (eng == nullptr || eng->srqln == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    return eng->srqln->transport->start_service(eng->srqln);
}

ORLO_EXPORT int StopEngCommSockServer(ORLOCOMM_ENG *eng) {
    if (eng == nullptr || eng->srqln == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    COMM_INFO("Stopping the SRqLn thread .......");
    int r = eng->srqln->transport->stop_service(eng->srqln);
    orlocomm::EngCloseExternalChannels();
    orlocomm::ConnSlotsWaitIdle(orlocomm::kFrameTimeoutMs);
    return r;
}

ORLO_EXPORT int StartEngCommPipeServer(ORLOCOMM_ENG *eng) {
    if (eng == nullptr || eng->prqrx == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    auto *buf = static_cast<uint8_t *>(calloc(1, ORLOCOMM_MSG_BUF_SIZE));
    if (buf == nullptr) {
        COMM_ERR("Out of memory");
        return -1;
    }
    ORLOCOMM_CHANNEL *rx = eng->prqrx;
    for (;;) {
        int n = rx->transport->recv_msg(rx, buf, ORLOCOMM_MSG_BUF_SIZE);
        if (n < 1) {
            COMM_ERR("No Message PRqRx %p", static_cast<void *>(rx));
            break;
        }
        if (EngDispatchMessage(buf, n, rx) == 1) break;
    }
    free(buf);
    COMM_INFO("Stopping the PRqRx thread .......");
    rx->transport->stop_service(rx);
    COMM_INFO("PRqRx thread exit.......");
    return 0;
}

ORLO_EXPORT int StopEngCommPipeServer(ORLOCOMM_ENG *eng) {
    if (eng == nullptr || eng->prqsn == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    uint8_t *msg = CreateServicePipeServerStop();
    if (msg == nullptr) return -1;
    orlocomm::gEngStopRequested.store(true);
    COMM_INFO("Send service stop to PRqRx thread .......");
    int r = eng->prqsn->transport->send_msg(eng->prqsn, msg, orlocomm::kRouteMsgSize);
    eng->prqsn->transport->stop_service(eng->prqsn);
    ChannelBroadCast(pChannelSet, msg, orlocomm::kRouteMsgSize);
    free(msg);
    return r == orlocomm::kRouteMsgSize ? 0 : -1;
}

ORLO_EXPORT int CreateLocalOrloCommCountFile(void) {
    int handle = -1;
    if (OLIBCFileLockTimeByFile(ORLOCOMM_COUNT_LOCK, 1, 10, &handle) != 1) {
        COMM_ERR("fail to lock %s", ORLOCOMM_COUNT_LOCK);
        return -1;
    }
    int r = OLIBCFileSetKeyValue(ORLOCOMM_COUNT_FILE, ORLOCOMM_COUNT_KEY, "0", "%s=%s\n");
    if (r != 0)
        COMM_ERR("OLIBCFileSetKeyValue(\"%s\", \"%s\", \"0\") failed, err=[0x%04X %s:%d]", ORLOCOMM_COUNT_FILE,
                 ORLOCOMM_COUNT_KEY, OLIBCErrGet(), OLIBCErrorGetFile(), OLIBCErrorGetLine());
    if (OLIBCFileUnlockByFile(handle) != 0) COMM_ERR("fail to unlock %s", ORLOCOMM_COUNT_LOCK);
    return r == 0 ? 0 : -1;
}

ORLO_EXPORT const char *GetGlobalHostName(void) {
    orlocomm::EnsureInit();
    return gszLocalHostName;
}

ORLO_EXPORT const char *GetGlobalHostIP(void) {
    orlocomm::EnsureInit();
    return gszLocalActiveIP;
}

// 1 when the pid file exists and the process it names runs, else 0.
ORLO_EXPORT int IsServiceAlive(const char *pid_file) {
    if (pid_file == nullptr) {
        COMM_ERR("Invalid parameter");
        return 0;
    }
    return ProcessRuns(ReadPidFile(pid_file)) ? 1 : 0;
}

// Writes this process's id ("%d\n") to pid_file, replacing it atomically.
ORLO_EXPORT int CreatePidFile(const char *pid_file) {
    if (pid_file == nullptr || pid_file[0] != '/') {
        COMM_ERR("Invalid parameter");
        OLIBCErrSet(OLIBC_ERR_BAD_PARAM);
        return -1;
    }
    char tmpl[4096];
    if (snprintf(tmpl, sizeof(tmpl), "%s.XXXXXX", pid_file) >= static_cast<int>(sizeof(tmpl))) {
        COMM_ERR("Pid file path too long: %s", pid_file);
        OLIBCErrSet(OLIBC_ERR_MKDIR);
        return -1;
    }
    int fd = orlo::os::Mkstemp(tmpl);
    if (fd < 0) {
        COMM_ERR("mkstemp(\"%s\") failed, err=%m", tmpl);
        OLIBCErrSet(OLIBC_ERR_MKDIR);
        return -1;
    }
    char line[32];
    int n = snprintf(line, sizeof(line), "%d\n", static_cast<int>(getpid()));
    bool ok = write(fd, line, static_cast<size_t>(n)) == n && fchmod(fd, 0644) == 0 && fsync(fd) == 0;
    ok = close(fd) == 0 && ok;
    if (!ok || orlo::os::Rename(tmpl, pid_file) != 0) {
        COMM_ERR("Fail to write pid file %s, err=%m", pid_file);
        orlo::os::Unlink(tmpl);
        OLIBCErrSet(OLIBC_ERR_MKDIR);
        return -1;
    }
    return 0;
}

ORLO_EXPORT int SetSignalAction(void (*handler)(int)) {
    if (handler == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    struct sigaction sa;
    memset(&sa, 0, sizeof(sa));
    sa.sa_handler = handler;
    sigemptyset(&sa.sa_mask);
    for (int sig : {SIGHUP, SIGINT, SIGTERM})
        if (sigaction(sig, &sa, nullptr) != 0) {
            COMM_ERR("sigaction(%d) failed, err=%m", sig);
            return -1;
        }
    return 0;
}

ORLO_EXPORT int FreeSignalAction(void) {
    struct sigaction sa;
    memset(&sa, 0, sizeof(sa));
    sa.sa_handler = SIG_DFL;
    sigemptyset(&sa.sa_mask);
    for (int sig : {SIGHUP, SIGINT, SIGTERM}) sigaction(sig, &sa, nullptr);
    return 0;
}

}  // extern "C"
