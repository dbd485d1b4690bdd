#include "target/isns_client.h"

namespace orlo {
namespace isns {

std::atomic<bool> gConnected{false};
const char kConfFile[] = "/usr/orlo/etc/isns.conf";
const char kEnableKey[] = "isns_enable";

}  // namespace isns
}  // namespace orlo
