// The directory of one network portal of a target's portal group.
#ifndef ORLO_TARGET_LIO_PORTAL_UTIL_H
#define ORLO_TARGET_LIO_PORTAL_UTIL_H

#include <stdint.h>

#include "orloiscsi_target.h"

namespace orlo {
namespace target {
namespace lio {

// "/config/target/iscsi/<iqn>/tpgt_1/np/<addr>:<port>" into buf (kPathSize bytes).  An
// IPv6 address (one holding ':') is put in brackets, its scope with it:
// "[fe80::1%2]:3260", which the kernel hands whole to its address parser, so a
// link-local portal keeps its interface.  NULL arguments give 18990003; an address that
// is neither IPv4 nor IPv6 (with an optional "%<scope>"), or a port outside 1..65535,
// gives 18990004; both logged.
uint32_t PortalPath(const ORLOiSCSITarget *target, const char *addr, int port, char *buf);

}  // namespace lio
}  // namespace target
}  // namespace orlo

#endif
