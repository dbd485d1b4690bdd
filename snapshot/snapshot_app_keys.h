/*
 * Private helper of the application-key functions: the check of a key.
 */
#ifndef ORLO_SNAPSHOT_SNAPSHOT_APP_KEYS_H
#define ORLO_SNAPSHOT_SNAPSHOT_APP_KEYS_H

#include <stdint.h>

#include "orloiscsi_snapshot.h"

namespace orlo {
namespace snap {

// A key of 1 to 127 characters without a line break: 0, or 18990524 with one log line.
uint32_t CheckAppKey(const char *appKey);

}  // namespace snap
}  // namespace orlo

#endif
