// Pieces shared by the functions that build a target node in the kernel's iSCSI fabric:
// the configfs paths of a node and its portal group, the result codes of loading, the
// checks of an IQN used as a directory name, and writes into the portal group's
// attribute files that log the path and the value they tried.
#ifndef ORLO_TARGET_LIO_TARGET_UTIL_H
#define ORLO_TARGET_LIO_TARGET_UTIL_H

#include <stddef.h>
#include <stdint.h>

#include "orloiscsi_target.h"
#include "target/lio_acl_util.h"

namespace orlo {
namespace target {
namespace lio {

// Size of the configfs path buffers.
using orlo::target::acl::kPathSize;

constexpr const char kNodeFmt[] = "/config/target/iscsi/%s";
constexpr const char kTpgFmt[] = "/config/target/iscsi/%s/tpgt_%d";
// A file (or directory) of the portal group: "enable", "max_session", "attrib/...",
// "param/...", "auth/...".
constexpr const char kTpgFileFmt[] = "/config/target/iscsi/%s/tpgt_%d/%s";
constexpr const char kNpFmt[] = "/config/target/iscsi/%s/tpgt_%d/np/%s:%d";

// The well-known iSCSI port every interface portal listens on.
constexpr int kIscsiPort = 3260;

// The appliance's defaults file and the keys read here.
constexpr const char kOrloInfoDefaults[] = "/etc.defaults/orloinfo.conf";

// Result codes of the target block used here.
constexpr uint32_t kErrBadIqn = 18990701;             // Bad target iqn
constexpr uint32_t kErrBadMaxSessions = 18990703;     // Bad target max_sessions
constexpr uint32_t kErrLoadTarget = 18990722;         // Failed to load target
constexpr uint32_t kErrUpdateTargetConfig = 18990726; // Failed to update target config
constexpr uint32_t kErrBadRecvSeg = 18990738;         // Bad target max_recv_seg_bytes
constexpr uint32_t kErrBadSendSeg = 18990739;         // Bad target max_send_seg_bytes
constexpr uint32_t kErrGetNetIf = 18990319;           // Failed to get network interface
constexpr uint32_t kErrEnumPortals = 18990734;        // Failed to enumerate target network portals

// Formats a path into buf (kPathSize bytes); a path that does not fit is logged and
// refused with 18990050, never cut.  The access-list code's formatter serves both.
using orlo::target::acl::FormatPath;

// An IQN used as one directory name of the fabric: NULL gives 18990003; empty, "." or
// "..", or holding "/" gives 18990004.  Logs "Bad parameters" once.
uint32_t CheckIqn(const char *iqn);

// "/config/target/iscsi/<iqn>/tpgt_1/<leaf>" into buf (kPathSize bytes).
uint32_t TpgFilePath(const char *iqn, const char *leaf, char *buf);

// Writes text into a portal-group file; a failure is logged with path and value as
// "ORLOiSCSIConfigfsWrite(...)" and gives 18990040.
uint32_t TpgWrite(const char *iqn, const char *leaf, const char *text);
// The same for an integer, logged as "ORLOiSCSIConfigfsPutInteger(...)".
uint32_t TpgPutInteger(const char *iqn, const char *leaf, int value);

// Reads key from the appliance's defaults file into buf: its length, or -1 when the
// file or the key is missing or the value does not fit (other failures are logged).
int OrloInfoGet(const char *key, char *buf, size_t size);

// The depth of the command window of new sessions, from the defaults file's
// "iscsitrg_cmdsn_depth": absent, unparsable or below 1 gives 16; above what the kernel
// takes (512) gives 512.
int CmdsnDepth();

}  // namespace lio
}  // namespace target
}  // namespace orlo

#endif
