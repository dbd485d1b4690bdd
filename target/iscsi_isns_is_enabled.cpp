// Whether the administrator turned iSNS on in /usr/orlo/etc/isns.conf.
#include <strings.h>

#include "base/iscsi_base_internal.h"
#include "orloiscsi_target.h"
#include "target/isns_client.h"

extern "C" ORLO_EXPORT bool ORLOiSCSIiSNSIsEnabled(void) {
    char value[16] = "";
    // A missing file or key leaves iSNS off, as a new appliance has it.
    if (OLIBCFileGetKeyValue(orlo::isns::kConfFile, orlo::isns::kEnableKey, value, sizeof(value)) < 0) return false;
    return strcasecmp(value, "yes") == 0;
}
