// Private pieces of the configuration snapshot and the mapping file: paths, codes, and
// moving a snapshot's list into a caller's list.
#ifndef ORLO_BASE_CONF_SNAPSHOT_INTERNAL_H
#define ORLO_BASE_CONF_SNAPSHOT_INTERNAL_H

#include <cstdint>

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
