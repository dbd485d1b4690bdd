// Shared pieces of the target and access-list record code: file and lock paths, the
// filter, the value checks, and the upsert worker behind the target writers.
#ifndef ORLO_TARGET_TARGET_INTERNAL_H
#define ORLO_TARGET_TARGET_INTERNAL_H

#include <cstdint>
#include <string>

#include "olibc.h"
#include "orloiscsi_target.h"

namespace orlo {
namespace target {

constexpr const char *kConfPath = "/usr/orlo/etc/iscsi_target.conf";
constexpr const char *kLockPath = "/tmp/iscsi/iscsi_target.conf.lock";
constexpr const char *kAclConfPath = "/usr/orlo/etc/iscsi_acl.conf";
constexpr const char *kAclLockPath = "/tmp/iscsi/iscsi_acl.conf.lock";
constexpr int kLockTimeoutSec = 60;
constexpr int kHashSize = 128;
constexpr const char *kLineFmt = "\t%s=%s\n";
constexpr const char *kSectionFmt = "iSCSI_T%d";
constexpr const char *kAclSectionFmt = "iSCSI_ACL_T%d_%s";
constexpr int kSectionNameSize = 320;

// Result codes of the target block.
constexpr uint32_t kErrGetHashValue = 18990033;
constexpr uint32_t kErrGetConfig = 18990425;
constexpr uint32_t kErrBadName = 18990700;
constexpr uint32_t kErrBadIqn = 18990701;
constexpr uint32_t kErrBadAuthType = 18990702;
constexpr uint32_t kErrBadMaxSessions = 18990703;
constexpr uint32_t kErrBadUser = 18990704;
constexpr uint32_t kErrBadPassword = 18990705;
constexpr uint32_t kErrBadMutualUser = 18990706;
constexpr uint32_t kErrBadMutualPassword = 18990707;
constexpr uint32_t kErrBadTid = 18990710;
constexpr uint32_t kErrBadAcl = 18990711;
constexpr uint32_t kErrBadAclAuthority = 18990712;
constexpr uint32_t kErrNoSuchTarget = 18990713;
constexpr uint32_t kErrLoadTargetConfig = 18990724;
constexpr uint32_t kErrBadRecvSeg = 18990738;
constexpr uint32_t kErrBadSendSeg = 18990739;

// The filter's verdict on one section: 1 accepted, 0 rejected.
int FilterAccepts(const ORLOiSCSITargetFilter *filter, const OLIBC_SZHASH *section);

// Why a string could not be stored as one key line and read back exactly, or nullptr.
// size is the array it lives in (an unterminated array is a fault).
const char *ValueFault(const char *value, size_t size);

// The record checks shared by the writers and ORLOiSCSITargetStructCheck; checkAuthType
// says whether an auth_type outside 0..2 is refused.
uint32_t CheckRecord(const ORLOiSCSITarget *target, bool checkAuthType);

// 18990700 when another tid has the record's name, 18990701 when another has its IQN
// (logged); 0 when both are free.  The caller holds the target lock.
uint32_t CheckIdentityFree(const ORLOiSCSITarget *target);

// The upsert of one target section (Add with update false, Update with update true).
uint32_t WriteTargetSection(const ORLOiSCSITarget *target, bool update);

// Copies the first record of a lookup's list (freed here in every case) into out; which
// names what was looked up ("name: web", "tid: 3") in the log line of a failure.
uint32_t CopyFirst(uint32_t loadRet, ORLOiSCSITargetList *list, ORLOiSCSITarget *out, const std::string &which);

// Splits an access-list section name: true with tid and the initiator's offset.
bool ScanAclSection(const char *section, int32_t *tid, const char **initiator);

// The access-list entry writer behind Add and Update.
uint32_t WriteAclSection(int32_t tid, const char *initiator, int32_t authority, bool update);

}  // namespace target
}  // namespace orlo

#endif
