// Pieces shared by the functions that build a portal group's access lists in the
// kernel: the configfs paths of node access lists and their LUN entries, the default
// entry, and the rule that turns an initiator's authority into write protection.
#ifndef ORLO_TARGET_LIO_ACL_UTIL_H
#define ORLO_TARGET_LIO_ACL_UTIL_H

#include <stddef.h>
#include <stdint.h>

namespace orlo {
namespace target {
namespace acl {

// Size of the configfs path buffers.
constexpr size_t kPathSize = 320;

constexpr const char kAclDirFmt[] = "/config/target/iscsi/%s/tpgt_%d/acls/%s";
constexpr const char kAclAuthFmt[] = "/config/target/iscsi/%s/tpgt_%d/acls/%s/auth/%s";
constexpr const char kAclLunFmt[] = "/config/target/iscsi/%s/tpgt_%d/acls/%s/lun_%d";
constexpr const char kAclLunLinkFmt[] = "%s/lio_lun";
constexpr const char kAclWriteProtectFmt[] = "/config/target/iscsi/%s/tpgt_%d/acls/%s/lun_%d/write_protect";
constexpr const char kTpgLunFmt[] = "/config/target/iscsi/%s/tpgt_%d/lun/lun_%d";

// Formats a path into buf (kPathSize bytes); a path that does not fit is logged and
// refused with 18990050, never cut.
uint32_t FormatPath(char *buf, const char *fmt, ...) __attribute__((format(printf, 2, 3)));

// Checks the arguments every access-list function takes: iqn and initiator present (else
// 18990003), non-empty names without "/", portal group 1..65535 and, when lun is not
// negative, a LUN number 0..255 (else 18990004).  Logs "Bad parameters" once.
uint32_t CheckArgs(const char *iqn, int tpgt, const char *initiator, int lun);

// True for the default entry's initiator, compared over its full 36 characters.
bool IsDefaultInitiator(const char *initiator);

// True when the default entry has node access lists and LUN entries of its own: the
// older target core (version 2) has no demo mode to stand for it.
bool DefaultEntryIsNodeAcl();

// Write protection of an initiator's LUN entry: only read-write access (3, or 2 from
// older configurations) on a writable volume writes; read-only access, no access, an
// unknown authority and a read-only volume all protect.
bool WriteProtected(int32_t authority, bool volumeReadOnly);

// Whether the volume behind the LUN entry lun_<n> of the portal group is mounted
// read-only.  The entry's link names the backstore ("LUN_<uuid>", "UNSYNC_LUN_<uuid>"
// or "UNMAP_LUN_<uuid>"); the LUN of that uuid gives its volume, which statvfs asks.
// A LUN without a volume (a block device) counts as writable.
uint32_t LunVolumeIsReadOnly(const char *iqn, int tpgt, int n, bool *readOnly);

}  // namespace acl
}  // namespace target
}  // namespace orlo

#endif
