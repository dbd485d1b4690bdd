// The iSNS client of this process (see isns_client.h): settings, connection state, and
// the messages it exchanges with the server through libisns.
#include "target/isns_client.h"

#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <strings.h>
#include <pthread.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <set>

extern "C" {
#include <libisns/isns.h>
// Declared in libisns/util.h, which does not compile as C++.
void isns_log_background(void);
}

#include "base/iscsi_base_internal.h"
#include "orloiscsi_conf.h"
#include "platform/os_seam.h"
#include "target/target_life_util.h"

namespace orlo {
namespace isns {

std::atomic<bool> gConnected{false};
const char kConfFile[] = "/usr/orlo/etc/isns.conf";
const char kEnableKey[] = "isns_enable";
const char kServerKey[] = "isns_server";
const char kEntityKey[] = "isns_entity";
const char kPeriodKey[] = "isns_registration_period";
const char kTimeoutKey[] = "isns_timeout";

namespace {

constexpr uint32_t kErrReadFile = 18990039;  // Failed to read file
// The source name of the messages that speak for the whole entity rather than for one
// of its targets: this prefix and the entity name in iSCSI-name characters.
constexpr const char kSourcePrefix[] = "iqn.2000-01.com.orlo-nas:isns.";
constexpr size_t kMaxIscsiName = 223;
constexpr const char kNpDirFmt[] = "/config/target/iscsi/%s/tpgt_1/np";

// ---- Settings ----

// One value of isns.conf: 1 found, 0 absent (or no file), -1 unreadable (logged).
int GetValue(const char *key, std::string *out) {
    char buf[1024];
    if (OLIBCFileGetKeyValue(kConfFile, key, buf, sizeof(buf)) >= 0) {
        *out = buf;
        return 1;
    }
    if (OLIBCErrGet() == OLIBC_ERR_NOT_FOUND) return 0;
    ORLO_LOG_PLATFORM("OLIBCFileGetKeyValue(\"%s\", \"%s\", %p, %zu)", kConfFile, key, static_cast<void *>(buf),
                      sizeof(buf));
    return -1;
}

// A decimal number within [lo, hi], the whole text.
bool ParseNumber(const std::string &text, long lo, long hi, int *out) {
    if (text.empty() || !isdigit(static_cast<unsigned char>(text[0]))) return false;
    errno = 0;
    char *end = nullptr;
    long v = strtol(text.c_str(), &end, 10);
    if (errno != 0 || *end != '\0' || v < lo || v > hi) return false;
    *out = static_cast<int>(v);
    return true;
}

// A host name as DNS allows it: labels of letters, digits and '-', 1..63 bytes, not
// beginning or ending with '-', 253 bytes at most; a last label of digits only would be
// a malformed IPv4 address rather than a name.
bool IsHostName(const std::string &h) {
    if (h.empty() || h.size() > 253) return false;
    size_t start = 0;
    std::string last;
    while (start <= h.size()) {
        size_t dot = h.find('.', start);
        if (dot == std::string::npos) dot = h.size();
        std::string label = h.substr(start, dot - start);
        if (label.empty() || label.size() > 63 || label.front() == '-' || label.back() == '-') {
            // A single trailing dot (a fully qualified name) is allowed.
            if (!(label.empty() && dot == h.size() && start == h.size() && start > 0)) return false;
        }
        for (char c : label)
            if (!isalnum(static_cast<unsigned char>(c)) && c != '-') return false;
        if (!label.empty()) last = label;
        start = dot + 1;
    }
    return last.find_first_not_of("0123456789") != std::string::npos;
}

bool IsIpv4(const std::string &h) {
    struct in_addr a;
    return inet_pton(AF_INET, h.c_str(), &a) == 1;
}
bool IsIpv6(const std::string &h) {
    struct in6_addr a;
    return inet_pton(AF_INET6, h.c_str(), &a) == 1;
}

bool ParsePort(const std::string &text, int *port) { return ParseNumber(text, 1, 65535, port); }

// The entity name is free text to the protocol; it is shown to people, so it must be
// printable UTF-8 of at most 255 bytes.
bool IsEntityName(const std::string &e) {
    if (e.empty() || e.size() > 255 || !orlo::IsUtf8(e.data(), e.size())) return false;
    for (unsigned char c : e)
        if (c < 0x20 || c == 0x7f) return false;
    return true;
}

// ---- Process state (under the target lock) ----

struct State {
    bool connected = false;
    Settings settings;       // of the connection
    time_t lastSync = 0;     // monotonic seconds of the last Sync
    uint32_t granted = 0;    // registration period the server granted last
    bool failed = false;     // the last attempt failed ...
    time_t failedAt = 0;     // ... at this time ...
    uint32_t failure = 0;    // ... with this code ...
    bool badSettings = false; // ... because isns.conf could not be used ...
    std::string failedFor;   // ... for isns.conf as it was then
};
State gState;

time_t Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return ts.tv_sec;
}
double NowPrecise() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

std::string Identity(const Settings &s) { return s.raw; }

void NoteFailure(const Settings &s, uint32_t code, bool badSettings = false) {
    gState.failed = true;
    gState.badSettings = badSettings;
    gState.failedAt = Now();
    gState.failure = code;
    gState.failedFor = Identity(s);
}
void NoteSuccess() {
    gState.failed = false;
    gState.failure = 0;
}
// Whether an implicit attempt for these settings should wait (a recent failure).
bool HoldingOff(const Settings &s) {
    return gState.failed && gState.failedFor == Identity(s) && Now() - gState.failedAt < kRetryAfterSec;
}

// ---- The server's address ----

struct Server {
    std::string numeric;  // the address as libisns is given it
    std::string portText;
    std::string display;  // "a.b.c.d:port" or "[v6]:port", for log lines
    int family = AF_UNSPEC;
    struct sockaddr_storage sa;
    socklen_t len = 0;
};

uint32_t Resolve(const Settings &s, Server *out) {
    struct addrinfo hints;
    memset(&hints, 0, sizeof(hints));
    hints.ai_socktype = SOCK_STREAM;
    hints.ai_flags = AI_NUMERICSERV;
    std::string port = std::to_string(s.port);
    struct addrinfo *res = nullptr;
    int rc = getaddrinfo(s.host.c_str(), port.c_str(), &hints, &res);
    if (rc != 0 || res == nullptr) {
        if (rc == EAI_SYSTEM)
            ORLO_LOG_ERR("getaddrinfo(\"%s\", \"%s\") failed, err=%m", s.host.c_str(), port.c_str());
        else
            ORLO_LOG_ERR("getaddrinfo(\"%s\", \"%s\") failed, err=%s", s.host.c_str(), port.c_str(),
                         rc != 0 ? gai_strerror(rc) : "no address");
        if (res != nullptr) freeaddrinfo(res);
        return kErrResolve;
    }
    auto freeRes = orlo::MakeScopeExit([res] { freeaddrinfo(res); });
    char host[INET6_ADDRSTRLEN];
    if (getnameinfo(res->ai_addr, res->ai_addrlen, host, sizeof(host), nullptr, 0, NI_NUMERICHOST) != 0) {
        ORLO_LOG_ERR("getnameinfo(\"%s\") failed, err=%s", s.host.c_str(), ORLOiSCSIErrStr(kErrResolve));
        return kErrResolve;
    }
    out->numeric = host;
    out->portText = port;
    out->family = res->ai_family;
    out->display = (res->ai_family == AF_INET6 ? "[" + out->numeric + "]" : out->numeric) + ":" + port;
    memcpy(&out->sa, res->ai_addr, res->ai_addrlen);
    out->len = res->ai_addrlen;
    return ORLO_OK;
}

// Opens a TCP connection to the server and closes it again: tells at once, with the
// system's reason, a server that refuses or cannot be reached, and gives up on one that
// does not answer after timeoutMs.
uint32_t Probe(const Server &srv, int timeoutMs) {
    orlo::FdGuard fd(socket(srv.family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (fd.get() < 0) {
        ORLO_LOG_ERR("socket(%d, SOCK_STREAM) failed, err=%m", srv.family);
        return kErrConnect;
    }
    if (connect(fd.get(), reinterpret_cast<const struct sockaddr *>(&srv.sa), srv.len) == 0) return ORLO_OK;
    if (errno != EINPROGRESS) {
        ORLO_LOG_ERR("connect(\"%s\") failed, err=%m", srv.display.c_str());
        return kErrConnect;
    }
    double deadline = NowPrecise() + timeoutMs / 1000.0;
    for (;;) {
        int left = static_cast<int>((deadline - NowPrecise()) * 1000.0);
        struct pollfd p = {fd.get(), POLLOUT, 0};
        int rc = left > 0 ? poll(&p, 1, left) : 0;
        if (rc < 0 && errno == EINTR) continue;
        if (rc < 0) {
            ORLO_LOG_ERR("poll(\"%s\") failed, err=%m", srv.display.c_str());
            return kErrConnect;
        }
        if (rc == 0) {
            ORLO_LOG_ERR("connect(\"%s\") failed after %d s, err=%s", srv.display.c_str(), timeoutMs / 1000,
                         ORLOiSCSIErrStr(kErrTimeout));
            return kErrTimeout;
        }
        break;
    }
    int err = 0;
    socklen_t len = sizeof(err);
    if (getsockopt(fd.get(), SOL_SOCKET, SO_ERROR, &err, &len) != 0) err = errno;
    if (err != 0) {
        errno = err;
        ORLO_LOG_ERR("connect(\"%s\") failed, err=%m", srv.display.c_str());
        return kErrConnect;
    }
    return ORLO_OK;
}

// ---- libisns ----

// Keeps a SIGPIPE that a write to a closed connection raises inside libisns from ending
// the caller's process: blocked for the scope, and taken back if it was raised here.
class SigpipeBlock {
  public:
    SigpipeBlock() {
        sigemptyset(&pipe_);
        sigaddset(&pipe_, SIGPIPE);
        sigset_t pending;
        sigpending(&pending);
        wasPending_ = sigismember(&pending, SIGPIPE) == 1;
        pthread_sigmask(SIG_BLOCK, &pipe_, &old_);
    }
    ~SigpipeBlock() {
        if (!wasPending_) {
            sigset_t pending;
            sigpending(&pending);
            if (sigismember(&pending, SIGPIPE) == 1) {
                struct timespec zero = {0, 0};
                sigtimedwait(&pipe_, nullptr, &zero);
            }
        }
        pthread_sigmask(SIG_SETMASK, &old_, nullptr);
    }
    SigpipeBlock(const SigpipeBlock &) = delete;
    SigpipeBlock &operator=(const SigpipeBlock &) = delete;

  private:
    sigset_t pipe_;
    sigset_t old_;
    bool wasPending_ = false;
};

// libisns's process-wide settings for one exchange: no message signing (the server's
// keys are not the appliance's business), the caller's time-out for connecting, for an
// answer and before a reconnection, and its own notices to syslog rather than to the
// caller's terminal.
void PrepareLibrary(int timeoutSec) {
    static bool once = false;
    if (!once) {
        isns_log_background();
        once = true;
    }
    isns_config.ic_security = 0;
    unsigned t = static_cast<unsigned>(timeoutSec);
    isns_config.ic_network.connect_timeout = t;
    isns_config.ic_network.call_timeout = t;
    isns_config.ic_network.reconnect_timeout = t;
}

// One TCP connection to the server for one or more requests.
class Session {
  public:
    Session(const Server &srv, int timeoutSec) : srv_(srv), timeoutSec_(timeoutSec) {
        PrepareLibrary(timeoutSec);
        sock_ = isns_create_client_socket(srv.numeric.c_str(), srv.portText.c_str(), srv.family, SOCK_STREAM);
        if (sock_ == nullptr)
            ORLO_LOG_ERR("isns_create_client_socket(\"%s\", \"%s\") failed, err=%s", srv.numeric.c_str(),
                         srv.portText.c_str(), ORLOiSCSIErrStr(kErrConnect));
    }
    ~Session() {
        if (sock_ != nullptr) isns_socket_free(sock_);
    }
    Session(const Session &) = delete;
    Session &operator=(const Session &) = delete;

    bool ok() const { return sock_ != nullptr; }
    isns_socket_t *socket() const { return sock_; }
    // Requests answered so far.
    int answered() const { return answered_; }

    // Sends a request (consumed) and waits for its answer, returned in *reply (the
    // caller frees it) on success.  "No such entry" counts as success when the request
    // was a withdrawal or a query (reply null then).  A failure is logged once.
    uint32_t Call(isns_simple_t *msg, isns_simple_t **reply, const char *what, const char *subject,
                  bool noEntryOk = false) {
        *reply = nullptr;
        double start = NowPrecise();
        int status;
        {
            SigpipeBlock block;
            status = isns_simple_call(sock_, &msg);
        }
        if (status == ISNS_SUCCESS) {
            ++answered_;
            *reply = msg;
            return ORLO_OK;
        }
        if (msg != nullptr) isns_simple_free(msg);
        if (status == ISNS_NO_SUCH_ENTRY && noEntryOk) {
            ++answered_;
            return ORLO_OK;
        }
        // libisns reports a missing answer as an internal error once its time is up.
        if (status == ISNS_INTERNAL_ERROR && NowPrecise() - start >= timeoutSec_ - 0.5) {
            ORLO_LOG_ERR("isns_simple_call(%s \"%s\") to %s failed after %d s, err=%s", what, subject,
                         srv_.display.c_str(), timeoutSec_, ORLOiSCSIErrStr(kErrTimeout));
            return kErrTimeout;
        }
        ORLO_LOG_ERR("isns_simple_call(%s \"%s\") to %s failed, status=%d (%s), err=%s", what, subject,
                     srv_.display.c_str(), status, isns_strerror(static_cast<enum isns_status>(status)),
                     ORLOiSCSIErrStr(kErrBadResponse));
        return kErrBadResponse;
    }

  private:
    const Server &srv_;
    int timeoutSec_;
    isns_socket_t *sock_ = nullptr;
    int answered_ = 0;
};

// Owns a libisns source name.
class SourceGuard {
  public:
    explicit SourceGuard(const std::string &name) : src_(isns_source_create_iscsi(name.c_str())) {}
    ~SourceGuard() {
        if (src_ != nullptr) isns_source_release(src_);
    }
    SourceGuard(const SourceGuard &) = delete;
    SourceGuard &operator=(const SourceGuard &) = delete;
    isns_source_t *get() const { return src_; }

  private:
    isns_source_t *src_;
};

// Owns the libisns objects of one registration.
class Objects {
  public:
    ~Objects() {
        for (auto it = objs_.rbegin(); it != objs_.rend(); ++it) isns_object_release(*it);
    }
    isns_object_t *Keep(isns_object_t *o) {
        objs_.push_back(o);
        return o;
    }

  private:
    std::vector<isns_object_t *> objs_;
};

std::string EntitySource(const Settings &s) {
    std::string name = kSourcePrefix;
    for (unsigned char c : s.entity) {
        char l = static_cast<char>(tolower(c));
        name += (isalnum(static_cast<unsigned char>(l)) || l == '.' || l == '-') && c < 0x80 ? l : '-';
    }
    if (name.size() > kMaxIscsiName) name.resize(kMaxIscsiName);
    return name;
}

// ---- What runs ----

struct Portal {
    struct in6_addr addr;  // IPv4 as ::ffff:a.b.c.d, as iSNS carries it
    uint32_t port = 0;
    bool operator<(const Portal &o) const {
        int c = memcmp(&addr, &o.addr, sizeof(addr));
        return c != 0 ? c < 0 : port < o.port;
    }
    bool operator==(const Portal &o) const { return memcmp(&addr, &o.addr, sizeof(addr)) == 0 && port == o.port; }
};

// A portal from the text of an address ("a.b.c.d", "v6", "v6%scope") and a port text.
bool MakePortal(std::string addr, const std::string &port, Portal *out) {
    int p = 0;
    if (!ParsePort(port, &p)) return false;
    size_t scope = addr.find('%');
    if (scope != std::string::npos) addr.resize(scope);
    struct in_addr v4;
    if (inet_pton(AF_INET, addr.c_str(), &v4) == 1) {
        memset(&out->addr, 0, sizeof(out->addr));
        out->addr.s6_addr[10] = 0xff;
        out->addr.s6_addr[11] = 0xff;
        memcpy(&out->addr.s6_addr[12], &v4, 4);
    } else if (inet_pton(AF_INET6, addr.c_str(), &out->addr) != 1) {
        return false;
    }
    out->port = static_cast<uint32_t>(p);
    return true;
}

// The portals of a target's portal group in the kernel, from the names of np/'s
// entries ("a.b.c.d:port", "[v6]:port", "[v6%scope]:port"; the scope is dropped: iSNS
// carries the bare address).  A missing directory is no portals.
std::set<Portal> KernelPortals(const char *iqn) {
    std::set<Portal> out;
    char dir[320];
    if (snprintf(dir, sizeof(dir), kNpDirFmt, iqn) >= static_cast<int>(sizeof(dir))) return out;
    orlo::DirGuard d(orlo::os::Opendir(dir));
    if (d.get() == nullptr) return out;
    while (struct dirent *e = readdir(d.get())) {
        std::string name = e->d_name;
        if (name.empty() || name[0] == '.') continue;
        Portal portal;
        if (name[0] == '[') {
            size_t close = name.find(']');
            if (close == std::string::npos || close + 1 >= name.size() || name[close + 1] != ':') continue;
            if (!MakePortal(name.substr(1, close - 1), name.substr(close + 2), &portal)) continue;
        } else {
            size_t colon = name.rfind(':');
            if (colon == std::string::npos || !MakePortal(name.substr(0, colon), name.substr(colon + 1), &portal))
                continue;
        }
        out.insert(portal);
    }
    return out;
}

bool Running(const ORLOiSCSITarget *t) { return !t->bkp_obj && ORLOiSCSILioIsTargetAlive(t->iqn, 1); }

// What the entity should hold: the stored targets (backup objects left out), those in
// the kernel with their portals, and the union of those portals.
struct Picture {
    orlo::target::life::ConfScope conf;
    std::vector<const ORLOiSCSITarget *> stopped;
    std::vector<std::pair<const ORLOiSCSITarget *, std::set<Portal>>> running;
    std::set<Portal> portals;
};

uint32_t TakePicture(Picture *pic) {
    namespace life = orlo::target::life;
    uint32_t ret = life::QueryConf(life::kQueryAllTargets, 0, 0, pic->conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X) failed, err=%s", life::kQueryAllTargets, ORLOiSCSIErrStr(ret));
        return ret;
    }
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&pic->conf->targets, link, t) {
        if (!Running(t)) {
            pic->stopped.push_back(t);
            continue;
        }
        std::set<Portal> own = KernelPortals(t->iqn);
        pic->portals.insert(own.begin(), own.end());
        pic->running.emplace_back(t, std::move(own));
    }
    return ORLO_OK;
}

// ---- Messages ----
//
// libisns encodes a message into a buffer of ISNS_MAX_MESSAGE (8 KiB) bytes and does
// not survive a larger one, and fails on answers that large: each message here carries
// one target at most, its size reckoned (attribute headers, values padded to 4 bytes)
// as it is built, and no question asks for more than a few portals or one node.
constexpr size_t kMessageBudget = 7168;

size_t AttrSize(size_t valueBytes) { return 8 + ((valueBytes + 3) & ~size_t{3}); }
size_t StringAttr(const char *s) { return AttrSize(strlen(s) + 1); }

isns_object_t *MakePortalObject(const Portal &p, isns_object_t *entity) {
    struct sockaddr_in6 sa;
    memset(&sa, 0, sizeof(sa));
    sa.sin6_family = AF_INET6;
    sa.sin6_addr = p.addr;
    sa.sin6_port = htons(static_cast<uint16_t>(p.port));
    isns_portal_info_t info;
    isns_portal_init(&info, reinterpret_cast<const struct sockaddr *>(&sa), IPPROTO_TCP);
    return isns_create_portal(&info, entity);
}

// A portal group joining a node to a portal: tag 1 when the node listens there, no tag
// (a NULL PGT: "not through this portal") otherwise.  The server makes a group with tag
// 1 for every pair a registration leaves unnamed, so every pair is named.
isns_object_t *MakePortalGroup(const char *iqn, const Portal &p, bool listens) {
    isns_attr_list_t attrs = {0, nullptr};
    isns_attr_list_append_string(&attrs, ISNS_TAG_PG_ISCSI_NAME, iqn);
    isns_attr_list_append_ipaddr(&attrs, ISNS_TAG_PG_PORTAL_IP_ADDR, &p.addr);
    isns_attr_list_append_uint32(&attrs, ISNS_TAG_PG_PORTAL_TCP_UDP_PORT, p.port);
    if (listens)
        isns_attr_list_append_uint32(&attrs, ISNS_TAG_PG_TAG, kPortalGroupTag);
    else
        isns_attr_list_append_nil(&attrs, ISNS_TAG_PG_TAG);
    isns_object_t *pg = isns_create_object(&isns_iscsi_pg_template, &attrs, nullptr);
    isns_attr_list_destroy(&attrs);
    return pg;
}

// Reads the registration period the server granted from a registration's answer.
void NoteGranted(isns_simple_t *reply) {
    isns_object_list_t list = {0, nullptr};
    isns_registration_response_get_objects(reply, &list);
    for (unsigned i = 0; i < list.iol_count; ++i) {
        uint32_t period = 0;
        if (isns_object_get_uint32(list.iol_data[i], ISNS_TAG_REGISTRATION_PERIOD, &period)) gState.granted = period;
    }
    isns_object_list_destroy(&list);
}

// Registers one target, joined to each portal of the entity: the node with its own
// portals and groups first, then the groups that name the other portals "not through
// here", in as many messages as they need.  Between the first message and the last the
// server may join the node to portals not yet named by default (tag 1): right for its
// own portals, and undone by the later messages for the others.
uint32_t SendRegistration(Session &ses, const Settings &s, const ORLOiSCSITarget &t, const std::set<Portal> &own,
                          const std::set<Portal> &all) {
    const size_t fixed = 12 + 2 * StringAttr(t.iqn) + 2 * StringAttr(s.entity.c_str()) + 3 * AttrSize(4) + 8;
    const size_t nodeSize = StringAttr(t.iqn) + AttrSize(4) + StringAttr(t.name);
    const size_t pairSize = 2 * AttrSize(16) + 3 * AttrSize(4) + StringAttr(t.iqn);
    // Own portals first: the first message always carries the node and those.
    std::vector<const Portal *> order;
    for (const Portal &p : own) order.push_back(&p);
    for (const Portal &p : all)
        if (own.count(p) == 0) order.push_back(&p);
    size_t next = 0;
    bool first = true;
    while (first || next < order.size()) {
        Objects objs;
        isns_object_t *entity = objs.Keep(isns_create_entity(ISNS_ENTITY_PROTOCOL_ISCSI, s.entity.c_str()));
        isns_object_set_uint32(entity, ISNS_TAG_REGISTRATION_PERIOD, static_cast<uint32_t>(s.period));
        SourceGuard src(t.iqn);
        isns_client_t client = {src.get(), ses.socket()};
        isns_simple_t *msg = isns_create_registration(&client, entity);
        isns_registration_add_object(msg, entity);
        size_t size = fixed;
        if (first) {
            isns_object_t *node = objs.Keep(isns_create_iscsi_target(t.iqn, entity));
            if (t.name[0] != '\0') isns_object_set_string(node, ISNS_TAG_ISCSI_ALIAS, t.name);
            isns_registration_add_object(msg, node);
            size += nodeSize;
        }
        size_t start = next;
        // At least one pair per message (the largest names leave room for several).
        while (next < order.size() && (size + pairSize <= kMessageBudget || next == start)) {
            isns_registration_add_object(msg, objs.Keep(MakePortalObject(*order[next], entity)));
            size += pairSize;
            ++next;
        }
        for (size_t i = start; i < next; ++i)
            isns_registration_add_object(msg,
                                         objs.Keep(MakePortalGroup(t.iqn, *order[i], own.count(*order[i]) != 0)));
        first = false;
        isns_simple_t *reply = nullptr;
        uint32_t ret = ses.Call(msg, &reply, "DevAttrReg", t.iqn);
        if (ret != ORLO_OK) return ret;
        NoteGranted(reply);
        isns_simple_free(reply);
    }
    return ORLO_OK;
}

uint32_t SendDeregistration(Session &ses, const std::string &source, const isns_attr_list_t &key,
                            const char *subject) {
    SourceGuard src(source);
    isns_client_t client = {src.get(), ses.socket()};
    isns_simple_t *msg = isns_create_deregistration(&client, &key);
    isns_simple_t *reply = nullptr;
    uint32_t ret = ses.Call(msg, &reply, "DevDereg", subject, true);
    if (reply != nullptr) isns_simple_free(reply);
    return ret;
}

uint32_t DeregisterNode(Session &ses, const char *iqn) {
    isns_attr_list_t key = {0, nullptr};
    isns_attr_list_append_string(&key, ISNS_TAG_ISCSI_NAME, iqn);
    uint32_t ret = SendDeregistration(ses, iqn, key, iqn);
    isns_attr_list_destroy(&key);
    return ret;
}

uint32_t DeregisterEntity(Session &ses, const Settings &s) {
    isns_attr_list_t key = {0, nullptr};
    isns_attr_list_append_string(&key, ISNS_TAG_ENTITY_IDENTIFIER, s.entity.c_str());
    uint32_t ret = SendDeregistration(ses, EntitySource(s), key, s.entity.c_str());
    isns_attr_list_destroy(&key);
    return ret;
}

std::string PortalText(const Portal &p) {
    char buf[INET6_ADDRSTRLEN];
    if (IN6_IS_ADDR_V4MAPPED(&p.addr)) {
        inet_ntop(AF_INET, &p.addr.s6_addr[12], buf, sizeof(buf));
        return std::string(buf) + ":" + std::to_string(p.port);
    }
    inet_ntop(AF_INET6, &p.addr, buf, sizeof(buf));
    return "[" + std::string(buf) + "]:" + std::to_string(p.port);
}

uint32_t DeregisterPortal(Session &ses, const Settings &s, const Portal &p) {
    isns_attr_list_t key = {0, nullptr};
    isns_attr_list_append_ipaddr(&key, ISNS_TAG_PORTAL_IP_ADDRESS, &p.addr);
    isns_attr_list_append_uint32(&key, ISNS_TAG_PORTAL_TCP_UDP_PORT, p.port);
    uint32_t ret = SendDeregistration(ses, EntitySource(s), key, PortalText(p).c_str());
    isns_attr_list_destroy(&key);
    return ret;
}

// One query: objects of the answer are handed to each (the answer is freed after).
template <typename F>
uint32_t SendQuery(Session &ses, const std::string &source, const isns_attr_list_t &key,
                   std::initializer_list<uint32_t> wanted, const char *subject, F each) {
    SourceGuard src(source);
    isns_client_t client = {src.get(), ses.socket()};
    isns_simple_t *msg = isns_create_query(&client, &key);
    for (uint32_t tag : wanted) isns_query_request_attr_tag(msg, tag);
    isns_simple_t *reply = nullptr;
    uint32_t ret = ses.Call(msg, &reply, "DevAttrQry", subject, true);
    if (ret != ORLO_OK || reply == nullptr) return ret;
    isns_object_list_t list = {0, nullptr};
    isns_query_response_get_objects(reply, &list);
    for (unsigned i = 0; i < list.iol_count; ++i) each(list.iol_data[i]);
    isns_object_list_destroy(&list);
    isns_simple_free(reply);
    return ORLO_OK;
}

// The portals the server holds in the entity.  The server shows a node only what shares
// a discovery domain with it, so the question is asked as a node of the entity.
uint32_t HeldPortals(Session &ses, const Settings &s, const char *asNode, std::set<Portal> *out) {
    isns_attr_list_t key = {0, nullptr};
    isns_attr_list_append_string(&key, ISNS_TAG_ENTITY_IDENTIFIER, s.entity.c_str());
    uint32_t ret = SendQuery(ses, asNode, key, {ISNS_TAG_PORTAL_IP_ADDRESS, ISNS_TAG_PORTAL_TCP_UDP_PORT},
                             s.entity.c_str(), [out](isns_object_t *o) {
                                 Portal p;
                                 if (isns_object_get_ipaddr(o, ISNS_TAG_PORTAL_IP_ADDRESS, &p.addr) &&
                                     isns_object_get_uint32(o, ISNS_TAG_PORTAL_TCP_UDP_PORT, &p.port)) {
                                     p.port &= 0xffff;
                                     out->insert(p);
                                 }
                             });
    isns_attr_list_destroy(&key);
    return ret;
}

// Whether the server holds a node in the entity.
uint32_t HoldsNode(Session &ses, const Settings &s, const char *iqn, bool *held) {
    *held = false;
    isns_attr_list_t key = {0, nullptr};
    isns_attr_list_append_string(&key, ISNS_TAG_ISCSI_NAME, iqn);
    uint32_t ret = SendQuery(ses, iqn, key, {ISNS_TAG_ENTITY_IDENTIFIER}, iqn, [&](isns_object_t *o) {
        const char *eid = nullptr;
        if (isns_object_get_string(o, ISNS_TAG_ENTITY_IDENTIFIER, &eid) && eid != nullptr && s.entity == eid)
            *held = true;
    });
    isns_attr_list_destroy(&key);
    return ret;
}

// Withdraws the portals the server holds in the entity that no running target has: a
// node registered later would otherwise be joined to them by default.  Asked as the
// node just registered.
uint32_t DropStalePortals(Session &ses, const Settings &s, const char *asNode, const std::set<Portal> &all) {
    std::set<Portal> held;
    uint32_t ret = HeldPortals(ses, s, asNode, &held);
    for (auto it = held.begin(); ret == ORLO_OK && it != held.end(); ++it)
        if (all.count(*it) == 0) ret = DeregisterPortal(ses, s, *it);
    return ret;
}

// Registers one running target, and again every other running target that does not
// listen on all of its portals, so that each of those pairs is named "not through here".
uint32_t RegisterOne(Session &ses, const Settings &s, const Picture &pic, const ORLOiSCSITarget &target) {
    const std::set<Portal> *own = nullptr;
    for (const auto &r : pic.running)
        if (strcmp(r.first->iqn, target.iqn) == 0) own = &r.second;
    if (own == nullptr) return ORLO_OK;
    uint32_t ret = SendRegistration(ses, s, target, *own, pic.portals);
    if (ret == ORLO_OK) ret = DropStalePortals(ses, s, target.iqn, pic.portals);
    if (ret != ORLO_OK) return ret;
    for (const auto &r : pic.running) {
        if (r.second == *own || strcmp(r.first->iqn, target.iqn) == 0) continue;
        if (!std::includes(r.second.begin(), r.second.end(), own->begin(), own->end()) &&
            (ret = SendRegistration(ses, s, *r.first, r.second, pic.portals)) != ORLO_OK)
            return ret;
    }
    return ORLO_OK;
}

// The connection's server, resolved again (its name may have moved) and tried: a server
// that went away is known at once rather than after libisns's time-out.
uint32_t ResolveOrForget(Server *srv) {
    uint32_t ret = Resolve(gState.settings, srv);
    if (ret == ORLO_OK) ret = Probe(*srv, gState.settings.timeout * 1000);
    if (ret != ORLO_OK) {
        NoteFailure(gState.settings, ret);
        Forget();
    }
    return ret;
}

// After a failed exchange on the connection: the server went away or refused; the next
// attempt is a fresh connection.
uint32_t Lost(uint32_t ret) {
    NoteFailure(gState.settings, ret);
    Forget();
    return ret;
}

// A question that proves the server speaks iSNS without touching anything: whether it
// holds a node by the entity's own source name (it never does).
uint32_t Ping(Session &ses, const Settings &s) {
    isns_attr_list_t key = {0, nullptr};
    std::string source = EntitySource(s);
    isns_attr_list_append_string(&key, ISNS_TAG_ISCSI_NAME, source.c_str());
    uint32_t ret = SendQuery(ses, source, key, {ISNS_TAG_ISCSI_NAME}, source.c_str(), [](isns_object_t *) {});
    isns_attr_list_destroy(&key);
    return ret;
}

uint32_t SyncWith(Session &ses) {
    const Settings &s = gState.settings;
    Picture pic;
    uint32_t ret = TakePicture(&pic);
    if (ret != ORLO_OK) return ret;
    for (const auto &r : pic.running)
        if ((ret = SendRegistration(ses, s, *r.first, r.second, pic.portals)) != ORLO_OK) return ret;
    if (!pic.running.empty() && (ret = DropStalePortals(ses, s, pic.running[0].first->iqn, pic.portals)) != ORLO_OK)
        return ret;
    for (const ORLOiSCSITarget *t : pic.stopped)
        if ((ret = DeregisterNode(ses, t->iqn)) != ORLO_OK) return ret;
    gState.lastSync = Now();
    return ORLO_OK;
}

}  // namespace

// ---- Settings ----

namespace {

// Checks and completes settings read from the file; the first bad value is logged.
uint32_t Validate(Settings *s, bool hasEntity, const std::string &period, bool hasPeriod,
                  const std::string &timeout, bool hasTimeout) {
    uint32_t ret;
    if (s->server.empty()) {
        ret = kErrBadAddress;
        ORLO_LOG_ERR("%s is not set in %s, err=%s", kServerKey, kConfFile, ORLOiSCSIErrStr(ret));
        return ret;
    }
    if ((ret = ParseServer(s->server, &s->host, &s->port)) != ORLO_OK) {
        ORLO_LOG_ERR("Bad %s in %s: \"%s\", err=%s", kServerKey, kConfFile, s->server.c_str(), ORLOiSCSIErrStr(ret));
        return ret;
    }
    if (!hasEntity || s->entity.empty()) {
        char host[HOST_NAME_MAX + 1];
        if (gethostname(host, sizeof(host)) != 0) {
            ORLO_LOG_ERR("gethostname(%p, %zu) failed, err=%m", static_cast<void *>(host), sizeof(host));
            return kErrHostname;
        }
        host[HOST_NAME_MAX] = '\0';
        s->entity = host;
    }
    if (!IsEntityName(s->entity)) {
        ORLO_LOG_ERR("Bad %s in %s: \"%s\", err=%s", kEntityKey, kConfFile, s->entity.c_str(),
                     ORLOiSCSIErrStr(kErrBadValue));
        return kErrBadValue;
    }
    const struct {
        const char *key;
        const std::string &text;
        bool present;
        long lo, hi;
        int *value;
    } numbers[] = {
        {kPeriodKey, period, hasPeriod, kMinPeriodSec, INT_MAX, &s->period},
        {kTimeoutKey, timeout, hasTimeout, 1, kMaxTimeoutSec, &s->timeout},
    };
    for (const auto &n : numbers) {
        if (!n.present) continue;
        if (!ParseNumber(n.text, n.lo, n.hi, n.value)) {
            ORLO_LOG_ERR("Bad %s in %s: \"%s\" (seconds, %ld to %ld), err=%s", n.key, kConfFile, n.text.c_str(),
                         n.lo, n.hi, ORLOiSCSIErrStr(kErrBadValue));
            return kErrBadValue;
        }
    }
    return ORLO_OK;
}

}  // namespace

uint32_t ParseServer(const std::string &text, std::string *host, int *port) {
    *port = kDefaultPort;
    if (text.empty()) return kErrBadAddress;
    if (text[0] == '[') {
        size_t close = text.find(']');
        if (close == std::string::npos) return kErrBadAddress;
        *host = text.substr(1, close - 1);
        if (!IsIpv6(*host)) return kErrBadAddress;
        std::string rest = text.substr(close + 1);
        if (rest.empty()) return ORLO_OK;
        if (rest[0] != ':' || !ParsePort(rest.substr(1), port)) return kErrBadPort;
        return ORLO_OK;
    }
    size_t colons = static_cast<size_t>(std::count(text.begin(), text.end(), ':'));
    if (colons >= 2) {
        *host = text;
        return IsIpv6(text) ? uint32_t{ORLO_OK} : kErrBadAddress;
    }
    *host = text;
    if (colons == 1) {
        size_t colon = text.find(':');
        *host = text.substr(0, colon);
        if (!ParsePort(text.substr(colon + 1), port)) {
            *port = kDefaultPort;
            return kErrBadPort;
        }
    }
    return IsIpv4(*host) || IsHostName(*host) ? uint32_t{ORLO_OK} : kErrBadAddress;
}

uint32_t LoadSettings(Settings *out, bool requireValid) {
    *out = Settings();
    std::string values[5];
    const char *keys[5] = {kEnableKey, kServerKey, kEntityKey, kPeriodKey, kTimeoutKey};
    int found[5];
    for (int i = 0; i < 5; ++i) {
        if ((found[i] = GetValue(keys[i], &values[i])) < 0) return kErrReadFile;
        out->raw += std::to_string(found[i]) + values[i] + '\n';
    }
    out->enabled = found[0] == 1 && strcasecmp(values[0].c_str(), "yes") == 0;
    out->server = values[1];
    out->entity = values[2];
    if (!out->enabled && !requireValid) return ORLO_OK;
    // The same unusable settings are reported once per kRetryAfterSec, not at every call.
    if (!requireValid && gState.badSettings && HoldingOff(*out)) return gState.failure;
    uint32_t ret = Validate(out, found[2] == 1, values[3], found[3] == 1, values[4], found[4] == 1);
    if (ret != ORLO_OK) NoteFailure(*out, ret, true);
    return ret;
}

uint32_t WriteSetting(const char *key, const char *value) {
    if (OLIBCFileSetKeyValue(kConfFile, key, value, "%s=%s\n") < 0) {
        ORLO_LOG_PLATFORM("OLIBCFileSetKeyValue(\"%s\", \"%s\", \"%s\", \"%s\")", kConfFile, key, value,
                          "%s=%s\\n");
        return kErrWriteFile;
    }
    return ORLO_OK;
}

// ---- Connection ----

void Forget() {
    gState.connected = false;
    gState.lastSync = 0;
    gState.granted = 0;
    gConnected.store(false);
}

void Reset() {
    Forget();
    NoteSuccess();
    gState.failedFor.clear();
}

uint32_t Ensure(bool explicitAttempt, bool *on, bool *synced) {
    *on = false;
    *synced = false;
    Settings s;
    uint32_t ret = LoadSettings(&s);
    if (ret != ORLO_OK || !s.enabled) {
        // Turned off, or settings that cannot be used: whatever connection there was is
        // no longer the one isns.conf asks for.
        Forget();
        *on = ret != ORLO_OK;
        return ret;
    }
    *on = true;
    if (gState.connected && Identity(gState.settings) == Identity(s)) {
        gState.settings = s;  // period and time-out take effect at once
        return ORLO_OK;
    }
    Forget();
    if (!explicitAttempt && HoldingOff(s)) return gState.failure;

    Server srv;
    double start = NowPrecise();
    if ((ret = Resolve(s, &srv)) != ORLO_OK || (ret = Probe(srv, s.timeout * 1000)) != ORLO_OK) {
        NoteFailure(s, ret);
        return ret;
    }
    // The answer shares the connection's time: a whole number of seconds, one at least.
    int left = s.timeout - static_cast<int>(NowPrecise() - start);
    Session ses(srv, left > 0 ? left : 1);
    if (!ses.ok()) {
        NoteFailure(s, kErrConnect);
        return kErrConnect;
    }
    gState.settings = s;
    // With nothing to register or withdraw, one question still has to be answered.
    if ((ret = SyncWith(ses)) == ORLO_OK && ses.answered() == 0) ret = Ping(ses, s);
    if (ret != ORLO_OK) {
        NoteFailure(s, ret);
        return ret;
    }
    NoteSuccess();
    gState.connected = true;
    gConnected.store(true);
    *synced = true;
    return ORLO_OK;
}

bool SyncDue() {
    if (!gState.connected) return false;
    time_t period = gState.granted != 0 ? gState.granted : static_cast<time_t>(gState.settings.period);
    return Now() - gState.lastSync >= period / 2;
}

uint32_t Sync() {
    Server srv;
    uint32_t ret = ResolveOrForget(&srv);
    if (ret != ORLO_OK) return ret;
    Session ses(srv, gState.settings.timeout);
    if (!ses.ok()) return Lost(kErrConnect);
    if ((ret = SyncWith(ses)) != ORLO_OK) return Lost(ret);
    return ORLO_OK;
}

uint32_t RegisterTarget(const ORLOiSCSITarget *target) {
    if (!Running(target)) return ORLO_OK;
    Picture pic;
    uint32_t ret = TakePicture(&pic);
    if (ret != ORLO_OK) return ret;
    Server srv;
    if ((ret = ResolveOrForget(&srv)) != ORLO_OK) return ret;
    Session ses(srv, gState.settings.timeout);
    if (!ses.ok()) return Lost(kErrConnect);
    if ((ret = RegisterOne(ses, gState.settings, pic, *target)) != ORLO_OK) return Lost(ret);
    return ORLO_OK;
}

uint32_t DeregisterTarget(const char *iqn) {
    Server srv;
    uint32_t ret = ResolveOrForget(&srv);
    if (ret != ORLO_OK) return ret;
    Session ses(srv, gState.settings.timeout);
    if (!ses.ok()) return Lost(kErrConnect);
    if ((ret = DeregisterNode(ses, iqn)) != ORLO_OK) return Lost(ret);
    return ORLO_OK;
}

namespace {
// Opens a session on a server this process is not connected to.
uint32_t Reach(const Settings &s, Server *srv) {
    uint32_t ret = Resolve(s, srv);
    if (ret == ORLO_OK) ret = Probe(*srv, s.timeout * 1000);
    return ret;
}
}  // namespace

uint32_t WithdrawEntity(const Settings &s) {
    if (HoldingOff(s)) return ORLO_OK;
    Server srv;
    uint32_t ret = Reach(s, &srv);
    if (ret == ORLO_OK) {
        Session ses(srv, s.timeout);
        ret = ses.ok() ? DeregisterEntity(ses, s) : kErrConnect;
    }
    if (ret != ORLO_OK) NoteFailure(s, ret);
    return ret;
}

uint32_t RegisteredTargets(const Settings &s, std::vector<std::string> *iqns) {
    namespace life = orlo::target::life;
    life::ConfScope conf;
    uint32_t ret = life::QueryConf(life::kQueryAllTargets, 0, 0, conf.get());
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIConfGet(0x%X) failed, err=%s", life::kQueryAllTargets, ORLOiSCSIErrStr(ret));
        return ret;
    }
    Server srv;
    if ((ret = Reach(s, &srv)) != ORLO_OK) return ret;
    Session ses(srv, s.timeout);
    if (!ses.ok()) return kErrConnect;
    ORLOiSCSIListLink *link;
    ORLOiSCSITarget *t;
    ORLO_ISCSI_TARGET_LIST_FOREACH(&conf->targets, link, t) {
        bool held = false;
        if ((ret = HoldsNode(ses, s, t->iqn, &held)) != ORLO_OK) return ret;
        if (held) iqns->push_back(t->iqn);
    }
    return ORLO_OK;
}

uint32_t IsRegistered(const Settings &s, const char *iqn, bool *registered) {
    Server srv;
    uint32_t ret = Reach(s, &srv);
    if (ret != ORLO_OK) return ret;
    Session ses(srv, s.timeout);
    if (!ses.ok()) return kErrConnect;
    return HoldsNode(ses, s, iqn, registered);
}

uint32_t GrantedPeriod() { return gState.granted; }

}  // namespace isns
}  // namespace orlo
