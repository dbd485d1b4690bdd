// The most LUNs this appliance takes: its "max_iscsiluns" setting, 256 by default.
#include "base/iscsi_base_internal.h"
#include "lun/lun_create_internal.h"

extern "C" ORLO_EXPORT int ORLOiSCSILunQuantityLimitGet(void) { return orlo::lun::QuantityLimit(); }
