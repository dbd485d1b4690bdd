// The iSNS client's state, shared by the iSNS functions of this process.
#ifndef ORLO_TARGET_ISNS_CLIENT_H
#define ORLO_TARGET_ISNS_CLIENT_H

#include <atomic>

namespace orlo {
namespace isns {

// Whether this process holds a connection to the iSNS server.
extern std::atomic<bool> gConnected;
// The settings file and its keys.
extern const char kConfFile[];
extern const char kEnableKey[];

}  // namespace isns
}  // namespace orlo

#endif
