/*
 * Private pieces of LUN creation: the result codes it returns, the web-API debug line,
 * the appliance's LUN count setting, the look-ups that creation makes on one loaded list
 * of every LUN (so that a creation reads the LUN file once, not once per question), the
 * JSON that plug-ins are given, and the space rule.
 */
#ifndef ORLO_LUN_LUN_CREATE_INTERNAL_H
#define ORLO_LUN_LUN_CREATE_INTERNAL_H

#include <stddef.h>
#include <stdint.h>

#include <string>
#include <vector>

#include "orloiscsi_lun.h"

// The debug line that the appliance's web back end greps for: priority 7, prefix
// "[D] iSCSIWebAPI:<file>:<line>:<function> " and the message.
void OrloWebApiDebug(const char *file, int line, const char *func, const char *format, ...)
    __attribute__((format(printf, 4, 5)));
#define ORLO_LOG_WEBAPI_DEBUG(fmt, ...) OrloWebApiDebug(__FILE_NAME__, __LINE__, __func__, fmt, ##__VA_ARGS__)

namespace orlo {
namespace lun {

// Result codes of creation beyond those of orloiscsi_base.h and lun_internal.h.
constexpr uint32_t kErrFsInfo = 18990052;          // Failed to get filesystem info
constexpr uint32_t kErrTruncMode = 18990056;       // Failed to get truncate mode
constexpr uint32_t kErrVolumeInfo = 18990300;      // Failed to get volume info
constexpr uint32_t kErrPluginInit = 18990312;      // Failed to init plugin hook
constexpr uint32_t kErrPluginRun = 18990313;       // Failed to run plugin action
constexpr uint32_t kErrGenerateUuid = 18990426;    // Failed to generate UUID
constexpr uint32_t kErrBadLocation = 18990501;     // Bad LUN location
constexpr uint32_t kErrBadSize = 18990502;         // Bad LUN size
constexpr uint32_t kErrBadName = 18990503;         // Bad LUN name
constexpr uint32_t kErrBadLid = 18990504;          // Bad LUN ID
constexpr uint32_t kErrBadUuid = 18990505;         // Bad LUN UUID
constexpr uint32_t kErrBadExtentSize = 18990507;   // Bad LUN extent_size
constexpr uint32_t kErrDuplicatedName = 18990538;  // Duplicated LUN name
constexpr uint32_t kErrMaxLunCount = 18990541;     // Reach max LUN count
constexpr uint32_t kErrUnusedLid = 18990580;       // Failed to get unused lid
constexpr uint32_t kErrSpaceCheck = 18990584;      // Failed to pass space check

constexpr const char *kCreationLockPath = "/tmp/iscsi/iscsi_lun_creation.lock";
constexpr int kCreationLockTimeoutSec = 180;
constexpr int kDefaultQuantityLimit = 256;
constexpr unsigned int kEventCreateFailed = 0x13000038;  // event log: a LUN could not be created
constexpr const char *kPluginCategory = "lun";
constexpr const char *kPluginAction = "lun_create";

// "max_iscsiluns" of /etc.defaults/orloinfo.conf; 256 when missing, negative or unreadable.
int QuantityLimit();

// What creation needs to know of a LUN that exists: the identities a new LUN must not
// take.
struct LunIdentity {
    int lid = 0;
    std::string name;
    std::string uuid;
};

// The identities of every LUN of the global file (backup objects included), read in one
// pass under the LUN files' shared lock.  Only "lid", "name" and "uuid" of each section
// are looked at, so a creation costs little more with 1024 LUNs than with one.  A missing
// file is no LUN.
uint32_t LoadIdentities(std::vector<LunIdentity> *luns);

// The smallest lid that none of the LUNs uses; -1 when every lid up to 1024 is taken.
int UnusedLidIn(const std::vector<LunIdentity> &luns);
// Whether one of the LUNs has that name / that uuid.
bool NameIn(const std::vector<LunIdentity> &luns, const char *name);
bool UuidIn(const std::vector<LunIdentity> &luns, const char *uuid);
// A new UUID string (37-byte buffer) that none of the LUNs uses.
uint32_t UuidGenerateAvoiding(const std::vector<LunIdentity> &luns, char *uuid);

// The JSON that plug-ins get on their standard input: the LUN ("name", "type" (its type
// name), "uuid", "lid", "size", "block_size", "root_path") and, when withResult is set,
// "result" (0 or the creation's result code).  Empty when it could not be built.
std::string PluginJson(const ORLOiSCSILun *lun, bool withResult, uint32_t result);

// The space rule of creation (see docs/luns.md): the bytes a new LUN of this type and size
// needs free on its volume, and the headroom the volume keeps.
uint64_t SpaceReserve(uint64_t totalBytes);
uint64_t SpaceNeeded(const ORLOiSCSILun *lun, uint64_t totalBytes);
// Metadata bytes counted for a thin file LUN and for an advanced LUN (pool heads, map head).
constexpr uint64_t kThinMetaBytes = 1ULL << 20;
constexpr uint64_t kAdvMetaBytes = 4ULL << 20;

}  // namespace lun
}  // namespace orlo

#endif
