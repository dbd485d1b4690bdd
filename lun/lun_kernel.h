/*
 * Private helpers of the code that puts LUNs into the kernel target and takes them out
 * again: result codes, the data path a control string names, the backstore paths of a
 * record, and the search for fabric LUN entries that link to a backstore.
 */
#ifndef ORLO_LUN_LUN_KERNEL_H
#define ORLO_LUN_LUN_KERNEL_H

#include <stddef.h>
#include <stdint.h>

#include "orloiscsi_lun.h"

namespace orlo {
namespace lun {

constexpr uint32_t kErrParseVolumeId = 18990311;  // Failed to parse volume ID
constexpr uint32_t kErrEnablePool = 18990418;     // Failed to enable extent pool
constexpr uint32_t kErrLunMapped = 18990534;      // LUN is mapped
constexpr uint32_t kErrFork = 18990014;           // Failed to fork

// Sizes of the buffers the kernel-facing code builds into.
constexpr size_t kConfigfsPathSize = 320;  // backstore directories and attributes
constexpr size_t kDataPathSize = 320;      // the data path inside a control string
constexpr size_t kControlSize = 640;       // a control string

// Operation code a deletion holds the LUN lock with.  Like creation it publishes no
// byte total, so a LUN whose map file is damaged or gone can still be deleted.
constexpr int kLunStepDelete = ORLO_ISCSI_LUN_STEP_6;

// The file the kernel reads the LUN's data from (file and extent-pool kinds):
// "<volume>/@iSCSI/EP_unmap/<uuid>" with state flag 0x1, "<volume>/@iSCSI/tmp/<uuid>/
// <uuid>_00000" with 0x20, else "<volume>/@iSCSI/LUN/<type name>/<uuid>/<uuid>_00000".
// 18990050 (logged) when it does not fit.
uint32_t KernelDataPath(const ORLOiSCSILun *lun, char *buf, size_t size);

// "<backstore directory>/<leaf>" (leaf such as "wwn/vpd_unit_serial"); 18990050 (logged)
// when it does not fit.
uint32_t BackstoreAttrPath(const char *dir, const char *leaf, char *buf, size_t size);

// Looks through every fabric under /config/target (all but "core") for a LUN entry
// "<fabric>/<node>/tpgt_<n>/lun/lun_<m>" holding a link that leads to the backstore
// directory dir.  1 with the link's path in linkOut when one does, 0 when none does,
// -1 (logged) when the tree cannot be read.
int FindBackstoreLink(const char *dir, char *linkOut, size_t size);

}  // namespace lun
}  // namespace orlo

#endif
