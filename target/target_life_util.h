// Pieces shared by the mapping and target life-cycle functions: their result codes, a
// configuration snapshot that frees itself, the snapshot queries they make by tid and
// lid, and the question whether a target is in the kernel.
#ifndef ORLO_TARGET_TARGET_LIFE_UTIL_H
#define ORLO_TARGET_TARGET_LIFE_UTIL_H

#include <cstdint>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_conf.h"
#include "orloiscsi_target.h"

namespace orlo {
namespace target {
namespace life {

constexpr uint32_t kErrGetConfig = 18990425;          // Failed to get iSCSIConfig
constexpr uint32_t kErrNoSuchLun = 18990531;          // No such LUN
constexpr uint32_t kErrLunMapped = 18990534;          // LUN is mapped
constexpr uint32_t kErrLoadLunConfig = 18990550;      // Failed to load LUN config
constexpr uint32_t kErrGetLunId = 18990555;           // Failed to get LUN ID
constexpr uint32_t kErrNoSuchTarget = 18990713;       // No such target
constexpr uint32_t kErrEnableTarget = 18990718;       // Failed to enable target
constexpr uint32_t kErrLoadTarget = 18990722;         // Failed to load target
constexpr uint32_t kErrUnloadTarget = 18990723;       // Failed to unload target
constexpr uint32_t kErrLoadTargetConfig = 18990724;   // Failed to load target config
constexpr uint32_t kErrAddTargetConfig = 18990725;    // Failed to add target config
constexpr uint32_t kErrRemoveTargetConfig = 18990727; // Failed to remove target config
constexpr uint32_t kErrUnloadMapping = 18990729;      // Failed to unload target mapping
constexpr uint32_t kErrRemoveMapping = 18990730;      // Failed to remove target mapping
constexpr uint32_t kErrLoadMappingConfig = 18990731;  // Failed to load mapping config
constexpr uint32_t kErrMappingStatus = 18990732;      // Failed to get mapping status

// Snapshot queries, as kind bits and criteria of the LUN filter.
constexpr uint32_t kQueryTargetLunPair = 0x7421;   // target by tid and LUN by lid, backup objects too
constexpr uint32_t kQueryTargetMappings = 0x7201;  // a target's mappings with their LUNs
constexpr uint32_t kQueryOneMapping = 0x7221;      // one mapping (tid and lid) with its records
constexpr uint32_t kQueryMappingsOfLids = 0x7281;  // a target's mappings of a set of lids
constexpr uint32_t kQueryTargetsOfLun = 0x7220;    // the targets a LUN is mapped to
constexpr uint32_t kQueryTarget = 0x1001;          // one target by tid
constexpr uint32_t kQueryAllTargets = 0x7000;      // every target but backup objects
constexpr uint32_t kQueryAllLuns = 0x2400;         // every LUN, backup objects too
constexpr uint32_t kQueryTargetNumbers = 0x5001;   // a target and all its stored mappings

// A snapshot owned by the scope: freed on every way out.
class ConfScope {
  public:
    ConfScope() : conf_() {}
    ConfScope(const ConfScope &) = delete;
    ConfScope &operator=(const ConfScope &) = delete;
    ~ConfScope() { ORLOiSCSIConfFree(&conf_); }
    ORLOiSCSIConf *get() { return &conf_; }
    ORLOiSCSIConf &operator*() { return conf_; }
    ORLOiSCSIConf *operator->() { return &conf_; }

  private:
    ORLOiSCSIConf conf_;
};

// ORLOiSCSIConfGet with flags and the tid and lid criteria filled in (the caller picks
// which the flags use).  Returns ORLOiSCSIConfGet's code; the caller logs.
uint32_t QueryConf(uint32_t flags, int32_t tid, int32_t lid, ORLOiSCSIConf *conf);
// The same with a set of lids (criterion 0x80).
uint32_t QueryConfLids(uint32_t flags, int32_t tid, const int32_t *lids, int32_t count, ORLOiSCSIConf *conf);

// The first target, LUN or mapping of a snapshot, or nullptr.
ORLOiSCSITarget *FirstTarget(const ORLOiSCSIConf &conf);
ORLOiSCSILun *FirstLun(const ORLOiSCSIConf &conf);
ORLOiSCSITarget *TargetOfTid(const ORLOiSCSIConf &conf, int32_t tid);

// Whether the target's node is in the kernel (status bit 0 or 1).
bool InKernel(const ORLOiSCSITarget *target);

// Takes the target lock (re-entrant: an operation that calls another holds it once) for
// the rest of the scope; when it cannot be taken, logs why and returns failret.
#define ORLO_TARGET_LOCK_OR_RETURN(guard, failret)                                            \
    orlo::ReentrantLockGuard guard(orlo::kTargetLockPath, orlo::kTargetLockTimeoutSec);      \
    if (!guard.held()) {                                                                       \
        ORLO_LOG_LOCK_FAILED(orlo::kTargetLockPath);                                           \
        return failret;                                                                        \
    }

// Removes the LUN entry n of every node access list of the target's portal group.
uint32_t LunAclInitiatorsRemove(const char *iqn, int tpgt, int n);
// Removes the portal group's LUN entry n: its backstore link, then the entry.
uint32_t LunEntryUnlink(const ORLOiSCSITarget *target, int n);
// Before number n is given to a new mapping of a running target (under the target
// lock): a LUN entry n that the kernel holds although the file names no mapping with
// that number was left by a process killed between the kernel step and the file step of
// a mapping; it is taken out (logged) so that the kernel follows the file.
uint32_t ClearUnnamedLunEntry(const ORLOiSCSITarget *target, int n);

// Valid identifiers.
inline bool TidValid(int32_t tid) { return tid >= ORLO_ISCSI_TID_MIN && tid <= ORLO_ISCSI_TID_MAX; }
inline bool LidValid(int32_t lid) { return lid >= ORLO_ISCSI_LID_MIN && lid <= ORLO_ISCSI_LID_MAX; }

}  // namespace life
}  // namespace target
}  // namespace orlo

#endif
