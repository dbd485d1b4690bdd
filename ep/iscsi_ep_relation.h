// Shared preparation of the clone and mirror start commands.
#ifndef ORLO_EP_ISCSI_EP_RELATION_H
#define ORLO_EP_ISCSI_EP_RELATION_H

#include <stdint.h>

#include "orloiscsi_ep.h"

namespace orlo {
namespace ep {

struct RelationArgs {
    char control[320];                          // "<child configfs dir>/control"
    char parentName[256];                       // the parent's kernel object name
    char parentUuid[ORLO_EP_UUID_BUF_SIZE];     // the parent map file's UUID
};

// 0 or a code (logged): 18990003/18990004 for bad arguments, 18990050 for a control
// path that does not fit, the UUID read's code.
uint32_t RelationPrepare(const char *parentMapPath, const char *parentConfigfsDir, const char *childConfigfsDir,
                         RelationArgs *args);

}  // namespace ep
}  // namespace orlo

#endif
