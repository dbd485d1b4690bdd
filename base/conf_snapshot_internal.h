// Private pieces of the configuration snapshot and the mapping file: paths, codes, and
// moving a snapshot's list into a caller's list.
#ifndef ORLO_BASE_CONF_SNAPSHOT_INTERNAL_H
#define ORLO_BASE_CONF_SNAPSHOT_INTERNAL_H

#include <cstdint>
#include <vector>

#include "orloiscsi_conf.h"
#include "orloiscsi_list.h"

namespace orlo {
namespace conf {

constexpr const char *kMappingConfPath = "/usr/orlo/etc/iscsi_mapping.conf";
constexpr const char *kMappingLockPath = "/tmp/iscsi/iscsi_mapping.conf.lock";
constexpr const char *kMappingSectionFmt = "iSCSI_MAP_T%d_L%d";
constexpr const char *kLineFmt = "\t%s=%s\n";
constexpr int kLockTimeoutSec = 60;
constexpr int kHashSize = 128;
constexpr int kSectionNameSize = 320;

constexpr uint32_t kErrGetHashValue = 18990033;    // Failed to get hash value
constexpr uint32_t kErrGetConfig = 18990425;       // Failed to get iSCSIConfig
constexpr uint32_t kErrLoadLunConfig = 18990550;   // Failed to load LUN config
constexpr uint32_t kErrLoadTargetConfig = 18990724; // Failed to load target config
constexpr uint32_t kErrLoadMappingConfig = 18990731; // Failed to load mapping config

// The lids named by the mapping sections that the filter's mapping criteria accept,
// sorted and without repeats, read without waiting for the mapping file's lock and
// without a word in the log or the platform error.  false when they cannot be told (the
// file busy, unreadable or malformed, a section without a lid): the caller then reads
// every LUN.  (target/iscsi_target_conf_mapping_load.cpp)
bool MappedLids(const ORLOiSCSILunFilter *filter, std::vector<int32_t> *lids);

// ORLOiSCSILunConfLoad for a snapshot that keeps only mapped LUNs: the LUNs of the global
// file that the filter accepts, where those whose lid is not in lids (sorted) may be left
// out; they are read all the same whenever leaving them out could change the result or
// the log (lun/iscsi_lun_conf_load_by_path.cpp).
uint32_t LunConfLoadOfLids(const ORLOiSCSILunFilter *filter, ORLOiSCSILunList *list, const std::vector<int32_t> &lids);

// Moves every element of src to the tail of dst (initialising dst when zero-filled) and
// leaves src empty.  Nothing is allocated or freed.
inline void ListSplice(ORLOiSCSIList *dst, ORLOiSCSIList *src) {
    if (!ORLOiSCSIListIsInit(dst)) ORLOiSCSIListInit(dst);
    if (ORLOiSCSIListIsInit(src) && src->head.next != &src->head) {
        ORLOiSCSIListLink *first = src->head.next;
        ORLOiSCSIListLink *last = src->head.prev;
        ORLOiSCSIListLink *tail = dst->head.prev;
        tail->next = first;
        first->prev = tail;
        last->next = &dst->head;
        dst->head.prev = last;
        dst->count += src->count;
    }
    ORLOiSCSIListInit(src);
}

}  // namespace conf
}  // namespace orlo

#endif
