// The iSNS client of this process, shared by the iSNS functions: the settings of
// /usr/orlo/etc/isns.conf, the connection state, and the exchanges with the server,
// which Debian's libisns encodes and decodes.
//
// The appliance is one network entity on the server; every target that is in the kernel
// (backup objects left out) is a storage node of type target in it, with one portal per
// entry of its portal group's np/ directory and a portal group (tag 1) joining each
// portal to the node.  Nothing here keeps a socket open between calls: each exchange
// opens one TCP connection and closes it, so a caller's process holds no descriptor, no
// thread and no timer of the client, and whatever it registered stays on the server for
// the registration period after the process ends.
//
// "Connected" means that this process reached the server and brought it in line with
// the kernel (Sync): every running target registered, every other node of the entity
// withdrawn.  A failed attempt is logged once; the implicit attempts that register and
// deregister make are then not repeated for kRetryAfterSec, so a server that cannot be
// reached costs a service start one time-out, not one per target.
//
// Everything but the settings reader and gConnected runs under the target lock, which
// also keeps two threads of one process out of libisns (it has global state).
#ifndef ORLO_TARGET_ISNS_CLIENT_H
#define ORLO_TARGET_ISNS_CLIENT_H

#include <stdint.h>

#include <atomic>
#include <string>
#include <vector>

#include "orloiscsi_target.h"

namespace orlo {
namespace isns {

// Whether this process is connected to the iSNS server.
extern std::atomic<bool> gConnected;

// The settings file and its keys.
extern const char kConfFile[];
extern const char kEnableKey[];
extern const char kServerKey[];
extern const char kEntityKey[];
extern const char kPeriodKey[];
extern const char kTimeoutKey[];

constexpr int kDefaultPort = 3205;        // IANA's iSNS port
constexpr int kDefaultTimeoutSec = 5;     // isns_timeout
constexpr int kMaxTimeoutSec = 60;
constexpr int kDefaultPeriodSec = 3600;   // isns_registration_period asked for
constexpr int kMinPeriodSec = 60;
constexpr int kRetryAfterSec = 60;        // no implicit retry sooner after a failure
constexpr int kPortalGroupTag = 1;        // every target has portal group 1

// Result codes of the client.
constexpr uint32_t kErrBadValue = 18990004;    // Bad parameter: a number out of range
constexpr uint32_t kErrTimeout = 18990010;     // Timeout
constexpr uint32_t kErrWriteFile = 18990040;   // Failed to write file (isns.conf)
constexpr uint32_t kErrResolve = 18990051;     // Failed to get hostent
constexpr uint32_t kErrHostname = 18990055;    // Failed to get hostname
constexpr uint32_t kErrBadAddress = 18990203;  // Bad IP: isns_server missing or malformed
constexpr uint32_t kErrBadResponse = 18990204; // Bad response: the server refused or spoke nonsense
constexpr uint32_t kErrConnect = 18990211;     // Failed to send the request
constexpr uint32_t kErrBadPort = 18990428;     // Bad port

struct Settings {
    bool enabled = false;
    std::string raw;     // every key as written, to tell whether the file changed
    std::string server;  // isns_server as written
    std::string host;    // its address or name
    int port = kDefaultPort;
    std::string entity;  // isns_entity, else the host name
    int period = kDefaultPeriodSec;
    int timeout = kDefaultTimeoutSec;
};

// Splits an isns_server value: "name", "a.b.c.d", "v6:addr" (bare IPv6), "[v6]", each
// optionally followed by ":port" (not after a bare IPv6 address).  0, kErrBadAddress or
// kErrBadPort; nothing is logged.
uint32_t ParseServer(const std::string &text, std::string *host, int *port);

// Reads isns.conf.  A missing file or isns_enable other than yes (any case) is iSNS off:
// 0 with enabled false and the other values unchecked.  With iSNS on (or requireValid),
// every value is checked and the first bad one is logged once and returned.
uint32_t LoadSettings(Settings *out, bool requireValid = false);

// Writes one key of isns.conf (atomically); 0 or kErrWriteFile, logged.
uint32_t WriteSetting(const char *key, const char *value);

// Makes sure this process is connected.  iSNS off: the connection is forgotten and 0
// returned with *on false.  Settings that changed since the connection (another server
// or entity) drop it first.  An explicit attempt always tries; an implicit one returns
// the last failure's code without trying (and without a log line) within kRetryAfterSec
// of it.  *synced tells that this call connected, and so registered every running target.
uint32_t Ensure(bool explicitAttempt, bool *on, bool *synced);
// Forgets the connection (nothing is sent).
void Forget();
// Forgets the connection and the last failure too: the state of a fresh process.
void Reset();
// Whether the registrations are due for renewal (half the granted period has passed).
bool SyncDue();
// Registers every running target, withdraws every stored target that does not run and
// every portal of the entity that no running target has.
uint32_t Sync();
// Registers one target with the portals its portal group has in the kernel (and the
// other running targets again when they do not listen where it does).  A target that is
// not in the kernel, or a backup object, is not announced (0).
uint32_t RegisterTarget(const ORLOiSCSITarget *target);
// Withdraws one storage node; one the server does not hold counts as withdrawn.
uint32_t DeregisterTarget(const char *iqn);
// Withdraws the whole entity with every node and portal in it, connected or not, using
// the settings given.  Within kRetryAfterSec of a failed attempt it does nothing.
uint32_t WithdrawEntity(const Settings &settings);
// The stored targets the server holds in the entity, asked now (connected or not), one
// query per target.
uint32_t RegisteredTargets(const Settings &settings, std::vector<std::string> *iqns);
// Whether the server holds the node in the entity, asked now (connected or not).
uint32_t IsRegistered(const Settings &settings, const char *iqn, bool *registered);
// The registration period the server granted last (0 when not known).
uint32_t GrantedPeriod();

}  // namespace isns
}  // namespace orlo

#endif
