// Pieces shared by the functions that stop the service: dismantling a fabric from what
// configfs holds, and taking the backstores out of the target-core hosts.  Callers hold
// the service lock.
#ifndef ORLO_SERVICE_STOP_UTIL_H
#define ORLO_SERVICE_STOP_UTIL_H

#include <stdint.h>

namespace orlo {
namespace service {

constexpr const char kVhostFabricDir[] = "/config/target/vhost";
constexpr const char kLoopbackFabricDir[] = "/config/target/loopback";
constexpr const char kTargetCoreDir[] = "/config/target/core";

// Takes every node of a vhost-style fabric out: for each portal group "tpgt_N" the
// nexus is dropped (when there is one), each LUN entry loses its links and goes, then
// the group; then the node.  A failing node is logged and left, the walk goes on, and
// the first failure is returned.  A missing fabric directory is success.
uint32_t DismantleFabric(const char *fabricDir);

// Takes every backstore under every host of /config/target/core out of the kernel, in
// name order.  A backstore a fabric LUN entry links to, or that the kernel holds
// (EBUSY), is left and counted as 18990534; the others still go.  First failure.
uint32_t RemoveAllBackstores();

}  // namespace service
}  // namespace orlo

#endif
