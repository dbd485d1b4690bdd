// The messaging engine's private helpers: its log format, intrusive lists, the limits that
// keep an engine bounded, and the engine-side machinery its handlers share (the outbox
// that sends outside the state lock, host and app tear-down).
#ifndef ORLO_COMM_ORLOCOMM_INTERNAL_H
#define ORLO_COMM_ORLOCOMM_INTERNAL_H

#include <syslog.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "base/orlo_log.h"
#include "orlocomm.h"

// The engine's own log format: "<file>:<line> orlocomm: <text>\n", at LOG_INFO for progress
// and LOG_ERR for failures.  A line whose priority the program masked out is not formatted.
extern std::atomic<int> gOrloCommLogMask;
inline bool OrloCommLogOn(int prio) { return (gOrloCommLogMask.load(std::memory_order_relaxed) & LOG_MASK(prio)) != 0; }

#define COMM_LOG(prio, fmt, ...)                                                                     \
    do {                                                                                             \
        if (OrloCommLogOn(prio))                                                                     \
            OrloLog((prio), "%s:%d orlocomm: " fmt "\n", __FILE_NAME__, __LINE__, ##__VA_ARGS__);    \
    } while (0)
#define COMM_INFO(fmt, ...) COMM_LOG(LOG_INFO, fmt, ##__VA_ARGS__)
#define COMM_ERR(fmt, ...) COMM_LOG(LOG_ERR, fmt, ##__VA_ARGS__)

namespace orlocomm {

// ---- Limits: nothing a peer or a local process sends makes the engine grow past these ----
constexpr int kMaxPayload = ORLOCOMM_MSG_BUF_SIZE;  // the largest message the engine defines
constexpr int kRouteMsgSize = 212;
constexpr int kStatusMsgSize = 216;
constexpr int kHostIPsBaseSize = 220;
constexpr int kRegisterMsgSize = 40;
constexpr int kServiceMsgSize = 72;
constexpr int kGetAppIPMsgSize = 68;
constexpr int kGetAppIPAckMsgSize = 12;
constexpr int kMaxRemoteHosts = 64;
constexpr int kMaxAppsPerHost = 1024;
constexpr int kMaxConnections = 64;       // accepted TCP connections served at once
constexpr int kMaxQueued = 1024;          // messages an application keeps queued per queue
constexpr int kConnectTimeoutSec = 10;    // TCP connect to another engine
constexpr int kFrameTimeoutMs = 10000;    // the rest of a started frame on a socket
constexpr int kPipeFrameTimeoutMs = 2000; // the rest of a started frame on a FIFO
constexpr int kFirstFrameTimeoutMs = 10000;  // a new TCP connection must say Conn by then
constexpr int kWriteTimeoutMs = 10000;    // a frame must be taken by the reader by then
constexpr int kControlWaitMs = 30000;     // an application waits this long for an answer
// The wait for an answer in force (kControlWaitMs unless a test shortened it).
extern std::atomic<int> gControlWaitMs;
constexpr int kRConnectSleepSec = 2;

// ---- Intrusive circular lists ----
inline void LinkInit(ORLOCOMM_LINK *h) { h->next = h->prev = h; }
inline bool LinkEmpty(const ORLOCOMM_LINK *h) { return h->next == h; }
inline void LinkAddTail(ORLOCOMM_LINK *h, ORLOCOMM_LINK *n) {
    n->prev = h->prev;
    n->next = h;
    h->prev->next = n;
    h->prev = n;
}
inline void LinkRemove(ORLOCOMM_LINK *n) {
    n->prev->next = n->next;
    n->next->prev = n->prev;
    n->next = n->prev = n;
}
#define COMM_ENTRY(ptr, type, member) \
    (reinterpret_cast<type *>(reinterpret_cast<char *>(ptr) - offsetof(type, member)))

// Packet queues (heads are packets of their own; insque/remque underneath).
void QueueInit(ORLOCOMM_CMD_PACKET *head);
bool QueueEmpty(const ORLOCOMM_CMD_PACKET *head);
void QueueAppend(ORLOCOMM_CMD_PACKET *head, ORLOCOMM_CMD_PACKET *p);
ORLOCOMM_CMD_PACKET *QueuePopFront(ORLOCOMM_CMD_PACKET *head);
void QueueFreeAll(ORLOCOMM_CMD_PACKET *head);

// Scope guard for a pthread mutex.
class MutexGuard {
  public:
    explicit MutexGuard(pthread_mutex_t *m) : m_(m) { pthread_mutex_lock(m_); }
    ~MutexGuard() { pthread_mutex_unlock(m_); }
    MutexGuard(const MutexGuard &) = delete;
    MutexGuard &operator=(const MutexGuard &) = delete;

  private:
    pthread_mutex_t *m_;
};

// ---- Small helpers ----
int64_t NowMs();  // monotonic
void CopyName(char *dst, const char *src);  // bounded "%s" into 32 bytes
std::string IpText(uint32_t ip);             // "%d.%d.%d.%d" in storage order
int MsgCode(const void *msg);                // the first byte
bool IsKnownCode(int code);                  // in the command table
int TableSize(int code);                     // the command table's size, -1 when unknown
void FillRouteHeader(uint8_t *msg, int code);
void FillHostAddr(uint32_t *ip_field, char *name_field, const ORLOCOMM_HOST *host);
uint8_t *NewZeroed(size_t size);

// The one-time initialisation of a process (host sets, channel set, globals).
int EnsureInit();
// The local host record, made on first use from the globals.
ORLOCOMM_HOST *EnsureLocalHost();
// Reads the appliance's addresses again into the local host record and gszLocalActiveIP
// (an application that joins, or an engine that starts, sees the network as it is now).
void RefreshLocalHost();

// ---- Channels ----
// The medium a channel sends on and the one it receives on (by its end).
void *SendMedium(ORLOCOMM_CHANNEL *ch);
void *RecvMedium(ORLOCOMM_CHANNEL *ch);
bool IsPipeChannel(const ORLOCOMM_CHANNEL *ch);
bool IsSocketChannel(const ORLOCOMM_CHANNEL *ch);
// Waits up to timeoutMs for a readable frame on the channel: 1 ready, 0 time-out, -1 gone.
int ChannelWaitReadable(ORLOCOMM_CHANNEL *ch, int timeoutMs);
// Drops whatever is buffered on a shared FIFO after a bad frame; the count dropped.
int PipeDrain(ORLOCOMM_PIPE *p);
// Opens an accepted connection as a socket medium.
ORLOCOMM_SOCKET *NewAcceptedSocket(int fd, const struct sockaddr_in *peer);
// Shuts a socket channel's connection down so that its reader wakes up.
void SocketChannelShutdown(ORLOCOMM_CHANNEL *ch);
// The peer address of a socket channel (network order), 0 when not connected.
uint32_t SocketChannelPeer(const ORLOCOMM_CHANNEL *ch);
// Destroys a channel through its transport.
void ChannelDestroy(ORLOCOMM_CHANNEL *ch);

// ---- Engine side ----
// Messages decided under the state lock and sent after it is released.  A channel whose
// send fails is dealt with afterwards: an external-out channel breaks its host, a process
// channel drops its application.
class Outbox {
  public:
    Outbox() = default;
    ~Outbox();
    Outbox(const Outbox &) = delete;
    Outbox &operator=(const Outbox &) = delete;
    // Queues msg on ch (a reference is taken).
    void Add(ORLOCOMM_CHANNEL *ch, const void *msg, int len);
    // Queues msg for the external-out channel of the host holding ip.  False when none.
    bool AddToHost(uint32_t ip, const void *msg, int len);
    // Queues msg for a local application's process channel.  False when it has none.
    bool AddToApp(ORLOCOMM_APP *app, const void *msg, int len);
    // Sends everything; then, under mCommMutex, tears down what failed (which may queue
    // more, sent in turn).  Call without mCommMutex held.
    void Flush();
    size_t Size() const { return items_.size(); }

  private:
    struct Item {
        ORLOCOMM_CHANNEL *ch;
        std::vector<uint8_t> msg;
    };
    std::vector<Item> items_;
};

// Sends one message on a channel now (slot 13, one writer at a time).  Returns the count.
int ChannelSend(ORLOCOMM_CHANNEL *ch, const void *msg, int len);

// Under mCommMutex: every application that holds a rule to app is told it is gone (local
// ones by ABroken, remote ones by UBond or UBind to their hosts); their rules are removed.
void EngAppGone(ORLOCOMM_APP *app, Outbox *out);
// Under mCommMutex: breaks a remote host (tells the related apps, releases its apps, closes
// its channels, forgets it).
void EngBreakHost(ORLOCOMM_HOST *host, Outbox *out);
// Under mCommMutex: the local app whose process channel is ch, dropped.
void EngDropAppByChannel(ORLOCOMM_CHANNEL *ch, Outbox *out);
// Under mCommMutex: the host whose current external channel (in or out) is ch, broken.
void EngBreakHostByChannel(ORLOCOMM_CHANNEL *ch, Outbox *out);
// Under mCommMutex: forgets a remote app record that no rule points at any more.
void EngForgetRemoteAppIfUnused(ORLOCOMM_APP *app);
// Under mCommMutex: drops local apps whose process has gone (their FIFO has no reader).
void EngReapDeadApps(Outbox *out);
// The host the message came from when it came on an external-in channel, else null.
ORLOCOMM_HOST *EngHostOfChannel(ORLOCOMM_CHANNEL *ch);
// The external-out channel of a host (a reference is taken), null when it has none.
ORLOCOMM_CHANNEL *HostOutChannel(ORLOCOMM_HOST *host);
// Under mCommMutex: the app of the local host set whose process channel is ch (a reference
// is taken).
ORLOCOMM_APP *LocalAppByChannel(ORLOCOMM_CHANNEL *ch);
// Forgets every app and host and closes their channels (engine shut-down).
void EngReleaseAll();
// Shuts every external channel down so that the connection threads leave.
void EngCloseExternalChannels();
// Whether the engine was asked to stop (an SStop is honoured only then).
extern std::atomic<bool> gEngStopRequested;
// The per-connection thread routine of the socket server.
void *SocketConnThread(void *arg);
// Bounded count of served connections.
bool ConnSlotTake();
void ConnSlotRelease();
void ConnSlotsWaitIdle(int timeoutMs);

// ---- Application side ----
// Applies a message read by an application: data goes to the data queue, route notices
// (Band, UBand, ABroken, unsolicited UBond, SStop) change the rules, other control messages
// go to the control queue.  Returns 0 or -1 when a queue is full.
int AppIngest(ORLOCOMM_APP *app, const uint8_t *msg, int len);
// Reads one message from the app's channel, waiting up to timeoutMs: its length, 0 on
// time-out, -1 when the channel is gone.
int AppReadOne(ORLOCOMM_APP *app, void *buf, int size, int timeoutMs);
// Releases an application with the pictures of peers only it used (application side).
void AppReleaseAll(ORLOCOMM_APP *app);
// The app's virtual peer for service on host (made and adopted when missing; a reference
// is taken).
ORLOCOMM_APP *AppPeerFor(const char *host, const char *service, bool *remote);
constexpr int kCommFlagCounted = 0x1;  // holds one count of the count file
constexpr int kCommFlagHolder = 0x2;   // its holder was allocated by CreateOrloComm
constexpr int kCommFlagClient = 0x4;   // a remote record of a client (made on Bind)
constexpr int kCommFlagVirtual = 0x8;  // an application's picture of a peer service

}  // namespace orlocomm

#endif
