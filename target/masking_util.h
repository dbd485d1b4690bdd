// Pieces shared by the masking operations (create, update, remove and the default entry):
// checking a request, remembering what the request's initiators had stored before, and
// bringing a running target's node into line with the stored access list.
//
// A masking change stores the request first and then changes the kernel, because the
// per-initiator CHAP is written from the stored list.  When the kernel cannot follow, the
// initiators of the request get their former entries back in the file and the kernel is
// brought into line with that again, so a failed call leaves file and kernel as they were.
#ifndef ORLO_TARGET_MASKING_UTIL_H
#define ORLO_TARGET_MASKING_UTIL_H

#include <stdint.h>

#include <map>
#include <string>
#include <vector>

#include "orloiscsi_target.h"

namespace orlo {
namespace target {
namespace masking {

// Stored entries of one target: initiator -> authority.
using StoredMap = std::map<std::string, int32_t>;

// What one initiator of a request had stored before the request changed it.
struct Prior {
    std::string initiator;
    bool stored;
    int32_t authority;
};

// Checks a request and looks up its target.  Refused, with one log line: an empty
// request; records of different tids ("NOT All tid the same in ACL array"); an initiator
// that is not NUL-terminated or not an iSCSI name, or named twice; an authority outside
// 0..3 when checkAuthority is set; a tid without target ("Failed to get target config of
// tid:%d").  True when the request may go on, with *target filled.
bool CheckRequest(const std::vector<ORLOiSCSIAcl> &records, bool checkAuthority, ORLOiSCSITarget *target);

// The stored entries of tid.
uint32_t LoadStored(int32_t tid, StoredMap *stored);

// The stored state of each initiator of the request.
std::vector<Prior> PriorOf(const std::vector<ORLOiSCSIAcl> &records, const StoredMap &stored);

// Puts the former entries of the given initiators back into the file: re-stored with
// their authority, or removed when they had none.  Failures are logged; the first is
// returned.
uint32_t RestorePrior(int32_t tid, const std::vector<Prior> &prior);

// Brings the target's node, when it is in the kernel (status bit 0), into line with the
// stored list for the named initiators: a stored initiator gets its node access list, an
// entry for every LUN the portal group holds with write protection from its authority
// and, with CHAP, the target's credentials; an initiator no longer stored loses its node
// access list with its LUN entries.  The default entry switches the portal group's demo
// mode (authority 0 when it is not stored) and, under the older target core, is an
// initiator like the others as well.  A target not in the kernel is left alone.
uint32_t ApplyToKernel(const ORLOiSCSITarget &target, const std::vector<std::string> &initiators);

// The initiators of a request, in request order.
std::vector<std::string> InitiatorsOf(const std::vector<ORLOiSCSIAcl> &records);

}  // namespace masking
}  // namespace target
}  // namespace orlo

#endif
