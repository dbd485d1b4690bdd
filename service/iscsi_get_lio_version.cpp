// The target-core generation in use.
#include "orloiscsi_configfs.h"
#include "service/lio_version.h"

extern "C" ORLO_EXPORT unsigned int ORLOiSCSIGetLioVersion(void) { return orlo::Lio()->version; }
